#include "faults/cell.h"

#include <android/log.h>
#include <binder/IServiceManager.h>
#include <execinfo.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <list>
#include <thread>

#include "faults/driver.h"
#include "faults/platform_calls.h"
#include "ipc/ITavoBinder.h"
#include "ipc/server.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/init.h"
#include "tavo_osal/log.h"

namespace tavo::test::faults {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using std::chrono::steady_clock;

// Many times what the slowest takes, which waits for a service that cannot be found.
constexpr auto kPatience = seconds(20);

// -- The log, kept without allocating anything

std::atomic<bool> g_captures{false};

void keep(int priority, const char* tag, const char* format, va_list values) {
    if (!g_captures) return;
    const int number = plan().lines++;
    if (number >= kMostLines) return;
    LogLine& line = plan().line[number];
    line.priority = priority;
    snprintf(line.tag, sizeof line.tag, "%s", tag != nullptr ? tag : "(null)");
    char text[sizeof line.text];
    vsnprintf(text, sizeof text, format, values);
    const char* separator = strstr(text, "::");
    snprintf(line.text, sizeof line.text, "%s", separator != nullptr ? separator + 2 : text);
}

int kept_vprint(int priority, const char* tag, const char* format, va_list values) {
    keep(priority, tag, format, values);
    return 1;
}

int kept_print(int priority, const char* tag, const char* format, ...) {
    va_list values;
    va_start(values, format);
    keep(priority, tag, format, values);
    va_end(values);
    return 1;
}

void set_up_once() {
    static const bool done = [] {
        plan();
        hook_platform_calls();
        use_failing_driver();
        static std::list<PlatformHook>& hooks = *new std::list<PlatformHook>;
        hooks.emplace_back(object_named("libtavoosal.so"), "__android_log_vprint",
                           reinterpret_cast<void*>(&kept_vprint));
        hooks.emplace_back(object_named("libtavoosal.so"), "__android_log_print", reinterpret_cast<void*>(&kept_print));
        return true;
    }();
    static_cast<void>(done);
}

// -- What is in the storage and the runtime directory

void empty(const char* directory) {
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator(directory, ignored)) {
        std::filesystem::remove_all(entry.path(), ignored);
    }
}

void empty_directories() {
    // Elsewhere than in the tests' sandbox these would be somebody's.
    const char* services = getenv("BINDER_RUNTIME_DIR");
    if (services == nullptr || strcmp(services, "/run/binder") != 0) {
        fprintf(stderr, "to be run with tests/support/sandbox.sh\n");
        abort();
    }
    empty("/sdcard");
    empty(services);
}

// -- Processes

// Where a process ends that should not, for the message.
void tell_where(int signal) {
    void* frames[64];
    backtrace_symbols_fd(frames, backtrace(frames, 64), STDERR_FILENO);
    ::signal(signal, SIG_DFL);
    raise(signal);
}

void quieten(int standard_error) {
    signal(SIGABRT, tell_where);
    signal(SIGSEGV, tell_where);

    const int nowhere = open("/dev/null", O_RDWR | O_CLOEXEC);
    dup2(nowhere, STDIN_FILENO);
    dup2(nowhere, STDOUT_FILENO);
    close(nowhere);
    dup2(standard_error, STDERR_FILENO);
}

template <typename Condition>
bool eventually_holds(Condition condition) {
    for (const auto deadline = steady_clock::now() + kPatience; !condition();) {
        if (steady_clock::now() >= deadline) return false;
        std::this_thread::sleep_for(milliseconds(1));
    }
    return true;
}

// The process has ended: its status, as waitpid tells it. -1 when it had to be killed.
int await_end(pid_t pid) {
    int status = -1;
    const bool ended = eventually_holds([&] { return waitpid(pid, &status, WNOHANG) == pid; });
    if (ended) return status;
    kill(pid, SIGKILL);
    waitpid(pid, &status, 0);
    return -1;
}

// What the service tells of itself, without the number of its process.
void store_figures() {
    const int file = memfd_create("figures", MFD_CLOEXEC);
    const auto service = android::defaultServiceManager()->checkService(android::String16("android.tavo.osal"));
    if (service != nullptr) service->dump(file, {});
    plan().figures[0] = '\0';
    char text[sizeof plan().figures] = "";
    const ssize_t length = pread(file, text, sizeof text - 1, 0);
    close(file);
    const char* line = length > 0 ? strchr(text, '\n') : nullptr;
    if (line != nullptr) snprintf(plan().figures, sizeof plan().figures, "%s", line + 1);
}

[[noreturn]] void be_the_service() {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    g_blocks = g_mappings = 0;
    tavo_osal_init(4, 4);
    for (;;) {
        plan().service_held = held();
        store_figures();
        plan().answered = plan().question.load();
        while (plan().answered == plan().question) std::this_thread::sleep_for(milliseconds(1));
    }
}

class Service {
public:
    explicit Service(int standard_error) {
        plan().question = 1;
        plan().answered = 0;
        pid_ = fork();
        if (pid_ == 0) {
            quieten(standard_error);
            be_the_service();
        }
        answers();
    }
    ~Service() {
        if (!ended_) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
    }
    Service(const Service&) = delete;
    Service& operator=(const Service&) = delete;

    pid_t pid() const { return pid_; }
    // Has it tell how it stands.
    bool ask() {
        ++plan().question;
        return answers();
    }

private:
    bool answers() {
        return eventually_holds([this] {
                   ended_ = ended_ || waitpid(pid_, nullptr, WNOHANG) == pid_;
                   return ended_ || plan().answered == plan().question;
               }) &&
               !ended_;
    }

    pid_t pid_ = 0;
    bool ended_ = false;
};

// -- The run

long go_through(const Scenario& scenario) {
    if (scenario.prepare != nullptr) scenario.prepare();
    const long result = scenario.call();
    if (scenario.undo != nullptr) scenario.undo(result);
    return result;
}

[[noreturn]] void be_the_client(const Scenario& scenario, pid_t cell) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    g_blocks = g_mappings = 0;
    g_uiMxEnabledLogLevel = TAVO_LOG_INFO;
    if (scenario.prepare != nullptr) scenario.prepare();
    plan().thread = pthread_self();
    if (scenario.side == Side::kClient && !scenario.children) plan().target = getpid();
    g_captures = true;
    plan().active = true;
    const long result = scenario.call();
    plan().active = false;
    g_captures = false;
    // A copy of the process, which a failed fork leaves behind, has come to its end here.
    if (getppid() != cell) _exit(0);
    plan().result = result;
    plan().returned = true;
    if (scenario.undo != nullptr) scenario.undo(result);

    // Where nothing failed there is nothing to look at.
    if (plan().call >= 0 && !plan().reached) _exit(0);
    const long again = go_through(scenario), once_more = go_through(scenario);
    plan().again = again == once_more ? again : once_more;
    // Connections that were cut go on another thread, what they hold a little later.
    const auto settle = [](auto is_usual, milliseconds patience) {
        for (const auto end = steady_clock::now() + patience; !is_usual() && steady_clock::now() < end;) {
            std::this_thread::sleep_for(milliseconds(1));
        }
    };
    const Held& usual = plan().usual;
    settle([&] { return (plan().held = held()).descriptors <= usual.descriptors; }, seconds(5));
    settle([&] { return (plan().held = held()).blocks <= usual.blocks; }, milliseconds(50));
    _exit(0);
}

void reset_plan(const Scenario& scenario, const Fault* fault) {
    Plan& now = plan();
    now.active = false;
    now.target = 0;
    now.every_thread = scenario.every_thread || scenario.side == Side::kService;
    now.call = fault != nullptr ? fault->call : -1;
    now.error = fault != nullptr ? fault->error : 0;
    now.left = fault != nullptr ? fault->nth : 0;
    now.reached = now.returned = false;
    for (auto& each : now.seen) each = 0;
    now.lines = 0;
    now.complaint[0] = '\0';
    now.held = now.service_held = {};
    if (fault == nullptr) now.usual = {INT_MAX, INT_MAX, LONG_MAX, LONG_MAX};
}

// The service's threads may not have noticed yet that a client has gone. Uses have nothing to do with that.
bool settles(Service& service, const Held& before, const std::string& figures_before) {
    for (const auto deadline = steady_clock::now() + seconds(5);;) {
        if (!service.ask()) return false;
        const Held& now = plan().service_held;
        if (figures_before != plan().figures) return true;
        if (now.descriptors <= before.descriptors && now.mappings <= before.mappings) return true;
        if (steady_clock::now() >= deadline) return true;
        std::this_thread::sleep_for(milliseconds(1));
    }
}

// Without a fault there is nothing to compare with: until what it holds stays as it is for a while.
bool comes_to_rest(Service& service) {
    constexpr int kWhile = 20;
    Held latest = {};
    for (int same = 0; same < kWhile; ++same) {
        if (!service.ask()) return false;
        const Held& now = plan().service_held;
        if (now.descriptors != latest.descriptors || now.mappings != latest.mappings) same = 0;
        latest = now;
        std::this_thread::sleep_for(milliseconds(1));
    }
    return true;
}

}  // namespace

Trial tried(const Scenario& scenario, const Fault* fault) {
    set_up_once();
    empty_directories();
    reset_plan(scenario, fault);
    const int output = memfd_create("output", MFD_CLOEXEC);
    std::unique_ptr<Service> service;
    static Held service_before = {};  // as the fault-free run leaves it
    static std::string& figures_before = *new std::string;
    if (scenario.service) service = std::make_unique<Service>(output);
    if (service != nullptr && scenario.side == Side::kService) plan().target = service->pid();

    Trial result;
    const pid_t cell = getpid();
    const pid_t client = fork();
    if (client == 0) {
        quieten(output);
        be_the_client(scenario, cell);
    }
    const int status = await_end(client);
    const Plan& now = plan();
    result.end = status == -1 ? Trial::kHung : now.returned && status == 0 ? Trial::kReturned : Trial::kEnded;
    result.signal = status != -1 && WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    result.reached = now.reached;
    result.result = now.result;
    result.again = now.again;
    result.lines.assign(now.line, now.line + std::min<int>(now.lines, kMostLines));
    result.complaint = now.complaint;
    result.held = now.held;
    if (fault == nullptr) plan().usual = now.held;
    result.seen.assign(now.seen, now.seen + kMostCalls);
    if (service != nullptr) {
        if (fault != nullptr && !result.reached) {
            close(output);
            return result;
        }
        result.service_lives =
            fault != nullptr ? settles(*service, service_before, figures_before) : comes_to_rest(*service);
        result.service_held = now.service_held;
        result.figures = now.figures;
        if (fault == nullptr) service_before = result.service_held;
        if (fault == nullptr) figures_before = result.figures;
    }
    char text[16384] = "";
    if (pread(output, text, sizeof text - 1, 0) > 0) result.output = text;
    close(output);
    return result;
}

}  // namespace tavo::test::faults

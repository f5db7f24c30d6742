// tavo log: runs a command with a log preference, and colours its log.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "tools/command.h"
#include "tools/files.h"
#include "tools/log_colours.h"

namespace tavo::tool {
namespace {

constexpr int kNotExecutable = 126;
constexpr int kNotFound = 127;

struct Options {
    std::string preference;
    std::vector<std::string> command;
};

std::atomic<pid_t> g_child{0};
int g_ended[2] = {-1, -1};

// A terminal sends its signals to the command as well; what somebody sent to this process alone is passed on.
void pass_on(int signal, siginfo_t* info, void*) {
    if (info->si_code <= 0 && g_child > 0) kill(g_child, signal);
}

void note_end(int) {
    const int error = errno;
    [[maybe_unused]] const ssize_t count = write(g_ended[1], "", 1);
    errno = error;
}

constexpr int kPassedOn[] = {SIGINT, SIGQUIT, SIGTERM, SIGHUP, SIGUSR1, SIGUSR2};

// Holds those signals back until it is known whom to pass them on to.
class HeldSignals {
public:
    HeldSignals() {
        sigset_t held;
        sigemptyset(&held);
        for (const int signal : kPassedOn) sigaddset(&held, signal);
        sigprocmask(SIG_BLOCK, &held, &usual);
    }
    ~HeldSignals() { sigprocmask(SIG_SETMASK, &usual, nullptr); }
    HeldSignals(const HeldSignals&) = delete;
    HeldSignals& operator=(const HeldSignals&) = delete;
    sigset_t usual;
};

void set_up_signals() {
    if (pipe2(g_ended, O_CLOEXEC | O_NONBLOCK) != 0) throw Failure("no descriptors are left: see 'ulimit -n'");
    struct sigaction action = {};
    action.sa_flags = SA_SIGINFO | SA_RESTART;
    action.sa_sigaction = pass_on;
    for (const int signal : kPassedOn) sigaction(signal, &action, nullptr);
    action = {};
    action.sa_handler = note_end;
    action.sa_flags = SA_RESTART | SA_NOCLDSTOP;
    sigaction(SIGCHLD, &action, nullptr);
}

// Starts the command with its standard error going into the descriptor; 0, or the errno of the failure.
int start(const std::vector<std::string>& command, int log, pid_t& pid) {
    std::vector<char*> arguments;
    arguments.reserve(command.size() + 1);
    for (const std::string& word : command) arguments.push_back(const_cast<char*>(word.c_str()));
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, log, STDERR_FILENO);
    // Handlers go by themselves, but what is ignored stays so.
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    sigset_t ignored_here;
    sigemptyset(&ignored_here);
    sigaddset(&ignored_here, SIGPIPE);
    posix_spawnattr_setsigdefault(&attributes, &ignored_here);
    const HeldSignals held;
    posix_spawnattr_setsigmask(&attributes, &held.usual);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
    const int error = posix_spawnp(&pid, arguments[0], &actions, &attributes, arguments.data(), environ);
    if (error == 0) g_child = pid;
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
    return error;
}

// Passes the log on until the command has ended and all that it wrote has come. What processes that it left behind
// write later is not waited for.
void copy_log(int log) {
    LogColours colours{Style(STDERR_FILENO)};
    bool ended = false;
    for (;;) {
        pollfd slots[] = {{log, POLLIN, 0}, {ended ? -1 : g_ended[0], POLLIN, 0}};
        if (poll(slots, 2, ended ? 0 : -1) < 0 && errno == EINTR) continue;
        if (slots[0].revents != 0) {
            char piece[4096];
            const ssize_t count = read(log, piece, sizeof piece);
            if (count <= 0) break;
            const std::string output = colours.take(std::string(piece, static_cast<size_t>(count)));
            write_all(STDERR_FILENO, output.data(), output.size());
        } else if (ended) {
            break;
        }
        ended = ended || slots[1].revents != 0;
    }
    const std::string rest = colours.rest();
    write_all(STDERR_FILENO, rest.data(), rest.size());
}

// Ends as the command did: with its status, or of the same signal.
int end_like(int status) {
    if (WIFEXITED(status)) return WEXITSTATUS(status);
    const int number = WTERMSIG(status);
    const rlimit no_second_dump = {0, 0};
    setrlimit(RLIMIT_CORE, &no_second_dump);
    fflush(nullptr);
    signal(number, SIG_DFL);
    raise(number);
    return 128 + number;
}

int log(const Options& options) {
    if (!options.preference.empty()) {
        setenv("LOG_PREF", options.preference.c_str(), 1);
    } else {
        setenv("LOG_PREF", "-s -a -l3", 0);
    }
    set_up_signals();
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) throw Failure("no descriptors are left: see 'ulimit -n'");
    pid_t pid = 0;
    const int error = start(options.command, ends[1], pid);
    close(ends[1]);
    if (error != 0) {
        close(ends[0]);
        say("cannot run " + options.command[0] + ": " + strerror(error));
        return error == ENOENT ? kNotFound : kNotExecutable;
    }
    copy_log(ends[0]);
    close(ends[0]);
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    g_child = 0;
    return end_like(status);
}

}  // namespace

void add_log(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options =
        add_command<Options>(app, run, "log", "Runs a command with a log preference and colours its log", log, command);
    command->add_option("-p,--pref", options->preference,
                        "The preference, such as \"-a -l6\"; LOG_PREF's value without, or \"-s -a -l3\"");
    command->add_option("COMMAND", options->command, "The command and its arguments, behind --")->required();
    command->footer(
        "Exits as the command does. Only programs that set a log preference, as tavo_osal_init() does, "
        "look at LOG_PREF.");
}

}  // namespace tavo::tool

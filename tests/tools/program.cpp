#include "tools/program.h"

#include <fcntl.h>
#include <linux/capability.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>

namespace tavo::test {
namespace {

constexpr auto kPatience = std::chrono::seconds(30);

class Environment {
public:
    explicit Environment(const Variables& variables) {
        Variables all = {{"LOG_PREF", ""}, {"NO_COLOR", ""}, {"NOTIFY_SOCKET", ""}, {"TERM", "xterm"}};
        for (const auto& [name, value] : variables) all[name] = value;
        for (char** variable = environ; *variable != nullptr; ++variable) {
            const std::string text = *variable;
            if (all.count(text.substr(0, text.find('='))) == 0) texts_.push_back(text);
        }
        for (const auto& [name, value] : all) {
            if (!value.empty()) texts_.push_back(name + "=" + value);
        }
        for (std::string& text : texts_) pointers_.push_back(text.data());
        pointers_.push_back(nullptr);
    }
    char** get() { return pointers_.data(); }

private:
    std::vector<std::string> texts_;
    std::vector<char*> pointers_;
};

pid_t spawn(const Words& arguments, const Variables& variables, posix_spawn_file_actions_t& actions, short flags = 0) {
    Words words = arguments;
    words.insert(words.begin(), TAVO_PROGRAM);
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(word.data());
    argv.push_back(nullptr);
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setflags(&attributes, flags);
    pid_t pid = -1;
    const int error = posix_spawn(&pid, TAVO_PROGRAM, &actions, &attributes, argv.data(), Environment(variables).get());
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
    if (error != 0) ADD_FAILURE() << "posix_spawn: " << strerror(error);
    return pid;
}

int wait_for(pid_t pid) {
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    return WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status);
}

// Gives the input, and collects both outputs, as far as each goes.
void talk(int in, const std::string& input, int out, int err, Result& result) {
    fcntl(in, F_SETFL, O_NONBLOCK);
    size_t given = 0;
    const auto close_input = [&] {
        if (in >= 0) close(in);
        in = -1;
    };
    if (input.empty()) close_input();
    while (out >= 0 || err >= 0) {
        pollfd slots[] = {{in, POLLOUT, 0}, {out, POLLIN, 0}, {err, POLLIN, 0}};
        poll(slots, 3, -1);
        if (slots[0].revents != 0) {
            const ssize_t count = ::write(in, input.data() + given, input.size() - given);
            if (count > 0) given += static_cast<size_t>(count);
            if (given == input.size() || (count < 0 && errno != EAGAIN)) close_input();
        }
        const auto collect = [](pollfd& slot, int& fd, std::string& text) {
            if (slot.revents == 0) return;
            char piece[4096];
            const ssize_t count = read(fd, piece, sizeof piece);
            if (count > 0) {
                text.append(piece, static_cast<size_t>(count));
            } else {
                close(fd);
                fd = -1;
            }
        };
        collect(slots[1], out, result.out);
        collect(slots[2], err, result.err);
    }
    close_input();
}

Result run(const Words& arguments, const std::string& input, const Variables& variables, const char* output) {
    signal(SIGPIPE, SIG_IGN);
    int in[2], out[2], err[2];
    EXPECT_TRUE(pipe2(in, O_CLOEXEC) == 0 && pipe2(out, O_CLOEXEC) == 0 && pipe2(err, O_CLOEXEC) == 0);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in[0], STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, out[1], STDOUT_FILENO);
    if (output != nullptr) {
        posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output, O_WRONLY | O_CREAT | O_TRUNC, 0600);
    }
    posix_spawn_file_actions_adddup2(&actions, err[1], STDERR_FILENO);
    const pid_t pid = spawn(arguments, variables, actions);
    close(in[0]);
    close(out[1]);
    close(err[1]);
    Result result = {};
    talk(in[1], input, out[0], err[0], result);
    result.status = wait_for(pid);
    return result;
}

}  // namespace

std::ostream& operator<<(std::ostream& out, const Result& result) {
    return out << "status " << result.status << ", output " << testing::PrintToString(result.out) << ", errors "
               << testing::PrintToString(result.err);
}

Result tavo(const Words& arguments, const std::string& input, const Variables& variables) {
    return run(arguments, input, variables, nullptr);
}

Result tavo_with_output_to(const char* path, const Words& arguments) { return run(arguments, "", {}, path); }

nlohmann::json listed() { return nlohmann::json::parse(tavo({"list", "--json"}).out); }

void without_the_rights_of_root() {
    // What cannot be dropped has been dropped already.
    prctl(PR_CAPBSET_DROP, CAP_DAC_OVERRIDE);
    prctl(PR_CAPBSET_DROP, CAP_DAC_READ_SEARCH);
}

Running::Running(const Words& arguments, const Variables& variables, const char* errors) {
    ::signal(SIGPIPE, SIG_IGN);
    int input[2], output[2];
    EXPECT_TRUE(pipe2(input, O_CLOEXEC) == 0 && pipe2(output, O_CLOEXEC) == 0);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, input[0], STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, output[1], STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, output[1], STDERR_FILENO);
    if (errors != nullptr) {
        posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, errors, O_WRONLY | O_CREAT | O_TRUNC, 0600);
    }
    pid_ = spawn(arguments, variables, actions);
    close(input[0]);
    close(output[1]);
    in = input[1];
    out = output[0];
}

Running::~Running() {
    if (pid_ > 0) {
        signal(SIGKILL);
        wait();
    }
    close_input();
    if (out >= 0) close(out);
}

void Running::write(const std::string& text) const {
    EXPECT_EQ(::write(in, text.data(), text.size()), static_cast<ssize_t>(text.size()));
}

void Running::close_input() {
    if (in >= 0) close(in);
    in = -1;
}

std::string Running::read_until(const std::string& text) {
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    for (;;) {
        const size_t found = pending_.find(text);
        if (found != std::string::npos) {
            std::string read_now = pending_.substr(0, found + text.size());
            pending_.erase(0, found + text.size());
            return read_now;
        }
        pollfd slot = {out, POLLIN, 0};
        const bool late = std::chrono::steady_clock::now() >= deadline;
        const int ready = late ? 0 : poll(&slot, 1, 1000);
        char piece[4096];
        const ssize_t count = ready > 0 ? read(out, piece, sizeof piece) : 0;
        if (count > 0) pending_.append(piece, static_cast<size_t>(count));
        if (late || (ready > 0 && count <= 0)) {
            ADD_FAILURE() << "waited for " << testing::PrintToString(text) << ", but only got "
                          << testing::PrintToString(pending_);
            return pending_;
        }
    }
}

std::string Running::read_rest() {
    char piece[4096];
    for (ssize_t count; (count = read(out, piece, sizeof piece)) > 0;) {
        pending_.append(piece, static_cast<size_t>(count));
    }
    return std::move(pending_);
}

void Running::signal(int number) const { kill(pid_, number); }

int Running::wait() {
    const int status = wait_for(pid_);
    pid_ = -1;
    return status;
}

OnTerminal::OnTerminal(const Words& arguments, const Variables& variables, int rows, int columns) {
    ::signal(SIGPIPE, SIG_IGN);
    in = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    EXPECT_TRUE(in >= 0 && grantpt(in) == 0 && unlockpt(in) == 0) << strerror(errno);
    out = fcntl(in, F_DUPFD_CLOEXEC, 0);
    resize(rows, columns);
    const std::string name = ptsname(in);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    // The first terminal that the leader of a session opens becomes its own.
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, name.c_str(), O_RDWR, 0);
    posix_spawn_file_actions_adddup2(&actions, STDIN_FILENO, STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, STDIN_FILENO, STDERR_FILENO);
    pid_ = spawn(arguments, variables, actions, POSIX_SPAWN_SETSID);
}

void OnTerminal::resize(int rows, int columns) const {
    const winsize size = {static_cast<unsigned short>(rows), static_cast<unsigned short>(columns), 0, 0};
    EXPECT_EQ(ioctl(in, TIOCSWINSZ, &size), 0);
}

bool OnTerminal::gets_keys() const {
    termios settings = {};
    EXPECT_EQ(tcgetattr(in, &settings), 0);
    return (settings.c_lflag & (ICANON | ECHO)) == 0;
}

bool OnTerminal::is_suspended() const {
    siginfo_t info = {};
    return waitid(P_PID, static_cast<id_t>(pid_), &info, WSTOPPED | WNOHANG | WNOWAIT) == 0 && info.si_pid == pid_;
}

ToolTest::ToolTest() { ::signal(SIGPIPE, SIG_IGN); }

void ToolTest::serve(const Words& more) {
    Words arguments = {"serve"};
    arguments.insert(arguments.end(), more.begin(), more.end());
    server_ = std::make_unique<Running>(arguments);
    server_->read_until("blocks\n");
}

void ToolTest::stop_serving() {
    server_->signal(SIGTERM);
    EXPECT_EQ(server_->wait(), 0);
    server_ = nullptr;
}

testing::AssertionResult failed(const Result& result, int status, const std::string& message) {
    if (result.status == status && result.err == "tavo: " + message + "\n") return testing::AssertionSuccess();
    return testing::AssertionFailure() << "expected status " << status << " and tavo: " << message << "\ngot "
                                       << result;
}

testing::AssertionResult succeeded(const Result& result, const std::string& out) {
    if (result.status == 0 && result.err.empty() && result.out == out) return testing::AssertionSuccess();
    return testing::AssertionFailure() << "expected status 0 and output " << testing::PrintToString(out) << "\ngot "
                                       << result;
}

}  // namespace tavo::test

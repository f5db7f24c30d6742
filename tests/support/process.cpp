#include "support/process.h"

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <map>
#include <utility>

namespace tavo::test {
namespace {

constexpr char kRoleVariable[] = "TAVO_TEST_ROLE";
constexpr char kSeparator = '\x1f';

std::map<std::string, Role>& roles() {
    static std::map<std::string, Role> registry;
    return registry;
}

std::string proc_path(pid_t pid, const char* leaf) {
    return "/proc/" + (pid == 0 ? std::string("self") : std::to_string(pid)) + "/" + leaf;
}

size_t count_entries(const std::string& path) {
    DIR* directory = opendir(path.c_str());
    if (directory == nullptr) return 0;
    size_t count = 0;
    while (const dirent* entry = readdir(directory)) count += entry->d_name[0] != '.';
    closedir(directory);
    return count;
}

}  // namespace

RoleRegistration::RoleRegistration(const char* name, Role role) { roles()[name] = role; }

void run_role_if_asked() {
    const char* asked = getenv(kRoleVariable);
    if (asked == nullptr) return;
    std::vector<std::string> words;
    std::string word;
    for (const char* c = asked;; ++c) {
        if (*c == kSeparator || *c == '\0')
            words.push_back(std::exchange(word, {}));
        else
            word += *c;
        if (*c == '\0') break;
    }
    unsetenv(kRoleVariable);
    const auto found = roles().find(words.front());
    if (found == roles().end()) {
        fprintf(stderr, "no role called %s\n", words.front().c_str());
        exit(127);
    }
    words.erase(words.begin());
    setvbuf(stdout, nullptr, _IOLBF, 0);
    exit(found->second(words));
}

Process Process::start(const std::string& role, const std::vector<std::string>& arguments) {
    std::string value = std::string(kRoleVariable) + "=" + role;
    for (const std::string& argument : arguments) value += kSeparator + argument;
    std::vector<char*> environment;
    for (char** variable = environ; *variable != nullptr; ++variable) environment.push_back(*variable);
    environment.push_back(value.data());
    environment.push_back(nullptr);

    int in[2], out[2];
    if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0) {
        perror("pipe2");
        abort();
    }
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in[0], STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, out[1], STDOUT_FILENO);
    char path[] = "/proc/self/exe";
    char* argv[] = {path, nullptr};
    pid_t pid = -1;
    const int error = posix_spawn(&pid, path, &actions, nullptr, argv, environment.data());
    posix_spawn_file_actions_destroy(&actions);
    close(in[0]);
    close(out[1]);
    if (error != 0) {
        fprintf(stderr, "posix_spawn: %s\n", strerror(error));
        abort();
    }
    return Process(pid, in[1], out[0]);
}

Process::Process(Process&& other) noexcept
    : pid_(std::exchange(other.pid_, -1)), in_(std::exchange(other.in_, -1)), out_(std::exchange(other.out_, -1)) {}

Process::~Process() {
    if (pid_ > 0) {
        kill(SIGKILL);
        wait();
    }
    if (in_ >= 0) close(in_);
    if (out_ >= 0) close(out_);
}

std::string Process::read_line() {
    std::string line;
    char c = 0;
    for (;;) {
        const ssize_t count = read(out_, &c, 1);
        if (count < 0 && errno == EINTR) continue;
        if (count <= 0 || c == '\n') return line;
        line += c;
    }
}

void Process::write_line(const std::string& line) {
    const std::string text = line + "\n";
    if (write(in_, text.data(), text.size()) != static_cast<ssize_t>(text.size())) perror("write to a test process");
}

void Process::kill(int signal) {
    if (pid_ > 0) ::kill(pid_, signal);
}

void Process::stop() {
    kill(SIGSTOP);
    siginfo_t stopped{};
    while (waitid(P_PID, static_cast<id_t>(pid_), &stopped, WSTOPPED | WEXITED | WNOWAIT) != 0 && errno == EINTR) {
    }
}

int Process::wait() {
    int status = 0;
    pid_t result = -1;
    do {
        result = waitpid(pid_, &status, 0);
    } while (result < 0 && errno == EINTR);
    pid_ = -1;
    if (result < 0) return -1;
    return WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status);
}

size_t count_descriptors(pid_t pid) {
    // Looking into one's own directory takes a descriptor that the count must not include.
    const size_t count = count_entries(proc_path(pid, "fd"));
    return pid == 0 || pid == getpid() ? count - 1 : count;
}

size_t count_threads(pid_t pid) { return count_entries(proc_path(pid, "task")); }

size_t count_mappings(pid_t pid, const std::string& containing) {
    std::ifstream maps(proc_path(pid, "maps"));
    size_t count = 0;
    for (std::string line; std::getline(maps, line);) count += line.find(containing) != std::string::npos;
    return count;
}

}  // namespace tavo::test

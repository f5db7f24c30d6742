#include "support/process.h"

#include <dirent.h>
#include <fcntl.h>
#include <limits.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
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

// How this program was started, or would have to be: through the emulator that runs it, if there is one.
std::vector<std::string> command_of_this_program() {
    constexpr char kSelf[] = "/proc/self/exe";
    if (emulator() == nullptr) return {kSelf};
    std::istringstream words(emulator());
    std::vector<std::string> command{std::istream_iterator<std::string>(words), {}};
    char path[PATH_MAX];
    const ssize_t length = readlink(kSelf, path, sizeof path);  // the program's, emulators see to that
    command.emplace_back(path, length > 0 ? static_cast<size_t>(length) : 0);
    return command;
}

}  // namespace

const char* emulator() { return getenv("TAVO_EMULATOR"); }

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
    std::vector<std::string> words = command_of_this_program();
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(word.data());
    argv.push_back(nullptr);
    pid_t pid = -1;
    const int error = posix_spawnp(&pid, argv[0], &actions, nullptr, argv.data(), environment.data());
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

size_t count_threads(pid_t pid) {
    // QEMU's user emulator has one thread for itself.
    return count_entries(proc_path(pid, "task")) - (emulator() != nullptr ? 1 : 0);
}

size_t count_mappings(pid_t pid, const std::string& containing) {
    std::ifstream maps(proc_path(pid, "maps"));
    size_t count = 0;
    for (std::string line; std::getline(maps, line);) count += line.find(containing) != std::string::npos;
    return count;
}

}  // namespace tavo::test

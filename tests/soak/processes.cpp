#include "soak/processes.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <string.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>

#include "soak/board.h"
#include "soak/failure.h"
#include "support/process.h"

namespace tavo::soak {

ChildProcess::ChildProcess(const std::vector<std::string>& arguments, int board, int failures, const std::string& log) {
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, board, kBoardFd);
    posix_spawn_file_actions_adddup2(&actions, failures, kFailureFd);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, log.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
    std::vector<std::string> words = {"/proc/self/exe"};
    words.insert(words.end(), arguments.begin(), arguments.end());
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(word.data());
    argv.push_back(nullptr);
    const int error = posix_spawn(&pid_, argv[0], &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (error == 0) return;
    pid_ = 0;
    fail(std::string("a process could not be started: ") + strerror(error));
}

void ChildProcess::kill(int signal) const {
    if (pid_ > 0) ::kill(pid_, signal);
}

bool ChildProcess::has_ended(std::string& how) {
    int status = 0;
    if (pid_ <= 0 || waitpid(pid_, &status, WNOHANG) != pid_) return false;
    pid_ = 0;
    how = WIFSIGNALED(status) ? std::string("ended by signal ") + strsignal(WTERMSIG(status))
                              : "exit status " + std::to_string(WEXITSTATUS(status));
    if (WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) how = "killed";
    return true;
}

Holdings ChildProcess::holdings() const {
    Holdings holdings;
    long pages = 0;
    std::ifstream("/proc/" + std::to_string(pid_) + "/statm") >> pages >> pages;
    holdings.resident_kib = pages * (sysconf(_SC_PAGESIZE) / 1024);
    holdings.descriptors = static_cast<long>(test::count_descriptors(pid_));
    holdings.threads = static_cast<long>(test::count_threads(pid_));
    holdings.mappings = static_cast<long>(test::count_mappings(pid_));
    return holdings;
}

void end_with_parent() {
    const pid_t parent = getppid();
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (getppid() != parent) _exit(1);
}

}  // namespace tavo::soak

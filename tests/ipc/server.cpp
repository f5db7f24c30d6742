#include "ipc/server.h"

#include <fcntl.h>
#include <malloc.h>
#include <signal.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cstdlib>
#include <iostream>
#include <vector>

#include "tavo_osal/init.h"

// The sanitizers bring an allocator of their own.
extern "C" [[gnu::weak]] size_t __sanitizer_get_current_allocated_bytes();

namespace tavo::test {
namespace {

constexpr char kAnswer[] = "answer ";

// Setting the log preference writes to standard output, so answers are lines of a kind.
void answer(size_t value) { std::cout << "\n" << kAnswer << value << std::endl; }

std::vector<int> g_taken;

size_t take_descriptors() {
    constexpr rlim_t kLimit = 100;
    rlimit limit = {};
    getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = kLimit;
    setrlimit(RLIMIT_NOFILE, &limit);
    for (int taken = 0; (taken = fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0)) >= 0;) g_taken.push_back(taken);
    return g_taken.size();
}

size_t give_descriptors() {
    for (const int taken : g_taken) close(taken);
    g_taken.clear();
    return 0;
}

}  // namespace

TEST_ROLE(osal_server) {
    answer(static_cast<size_t>(tavo_osal_init(static_cast<unsigned>(std::stoul(arguments.at(0))),
                                              static_cast<unsigned>(std::stoul(arguments.at(1))))));
    for (std::string question; std::getline(std::cin, question);) {
        if (question == "exit") break;
        if (question == "allocated") answer(allocated_bytes());
        if (question == "take") answer(take_descriptors());
        if (question == "give") answer(give_descriptors());
    }
    return 0;
}

Server::Server(unsigned queues, unsigned blocks) : process_(start(queues, blocks)), status_(std::stoi(ask(""))) {}

Process Server::start(unsigned queues, unsigned blocks) {
    // The C library counts what its threads keep in store as allocated, so that their number blurs the count.
    setenv("GLIBC_TUNABLES", "glibc.malloc.tcache_count=0:glibc.malloc.arena_max=1", 1);
    Process process = Process::start("osal_server", {std::to_string(queues), std::to_string(blocks)});
    unsetenv("GLIBC_TUNABLES");
    return process;
}

std::string Server::ask(const std::string& question) {
    if (!question.empty()) process_.write_line(question);
    for (int empty = 0; empty < 10;) {
        const std::string line = process_.read_line();
        if (line.rfind(kAnswer, 0) == 0) return line.substr(sizeof kAnswer - 1);
        empty += line.empty() ? 1 : 0;  // also at the end of the output
    }
    return "-1";
}

size_t Server::allocated_bytes() { return std::stoul(ask("allocated")); }

int Server::exit() {
    process_.write_line("exit");
    return process_.wait();
}

void Server::kill() {
    process_.kill(SIGKILL);
    process_.wait();
}

size_t allocated_bytes() {
    if (__sanitizer_get_current_allocated_bytes != nullptr) return __sanitizer_get_current_allocated_bytes();
    return mallinfo2().uordblks + mallinfo2().hblkhd;
}

}  // namespace tavo::test

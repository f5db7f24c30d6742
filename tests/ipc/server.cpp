#include "ipc/server.h"

#include <malloc.h>
#include <signal.h>

#include <cstdlib>
#include <iostream>

#include "tavo_osal/init.h"

// The sanitizers bring an allocator of their own.
extern "C" [[gnu::weak]] size_t __sanitizer_get_current_allocated_bytes();

namespace tavo::test {
namespace {

constexpr char kAnswer[] = "answer ";

// Setting the log preference writes to standard output, so answers are lines of a kind.
void answer(size_t value) { std::cout << "\n" << kAnswer << value << std::endl; }

}  // namespace

TEST_ROLE(osal_server) {
    answer(static_cast<size_t>(tavo_osal_init(static_cast<unsigned>(std::stoul(arguments.at(0))),
                                              static_cast<unsigned>(std::stoul(arguments.at(1))))));
    for (std::string question; std::getline(std::cin, question);) {
        if (question == "exit") break;
        if (question == "allocated") answer(allocated_bytes());
    }
    return 0;
}

Server::Server(unsigned queues, unsigned blocks)
    : process_(Process::start("osal_server", {std::to_string(queues), std::to_string(blocks)})),
      status_(std::stoi(ask(""))) {}

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

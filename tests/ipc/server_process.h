// The process that publishes the service, and looks at what it holds.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <cstdio>
#include <functional>
#include <string>
#include <thread>

#include "support/process.h"
#include "tavo_osal/init.h"

namespace tavo::test {

class ServerProcess {
public:
    explicit ServerProcess(unsigned max_queues = 10, unsigned max_blocks = 10)
        : process_(Process::start("server", {std::to_string(max_queues), std::to_string(max_blocks)})) {
        // The log preference tells about itself on the standard output, too.
        std::string line;
        do line = process_.read_line();
        while (!line.empty() && line.find("initialised: ") != 0);
        EXPECT_EQ(line, "initialised: 0");
    }
    pid_t pid() const { return process_.pid(); }
    // Ends it as if it had crashed.
    void kill() {
        process_.kill(9);
        process_.wait();
    }

private:
    Process process_;
};

// What other processes give back arrives a little later.
inline bool comes_true(const std::function<bool()>& condition) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (!condition()) {
        if (std::chrono::steady_clock::now() >= deadline) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

}  // namespace tavo::test

TEST_ROLE(server) {
    const TAVO_Status status = tavo_osal_init(static_cast<unsigned>(std::stoul(arguments[0])),
                                              static_cast<unsigned>(std::stoul(arguments[1])));
    printf("initialised: %d\n", status);
    while (getchar() != EOF) continue;
    return 0;
}

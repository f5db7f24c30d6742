// A process that does, line by line, what a test tells it: server, sender, receiver, user of blocks and semaphores.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "support/process.h"

namespace tavo::test {

constexpr char kUnavailable[] = "1";  // attach: no service
constexpr char kNoQueue[] = "37638";  // TAVO_MQ_NOT_AVAILABLE
constexpr char kFailure[] = "36865";  // TAVO_FAILURE
constexpr char kDone[] = "0";         // TAVO_SUCCESS
constexpr char kEnded[] = "ended";    // the process is gone

// Commands; each is answered with one line.
//     arm POINT                 see crash_point.h                                         0
//     serve                     tavo_osal_init()                                          its status
//     attach KEY, destroy KEY   one handle a key                                          the status
//     put KEY SIZE              a message of this size, whose bytes follow from it        the status
//     get KEY                                                                             SIZE whole|short, or the
//     status acquire KEY SIZE, release KEY, delete KEY SIZE                                      the status set KEY
//     BYTE, see KEY     the block's first byte                                    0, the byte semaphore KEY, lock,
//     unlock                                                         the status hammer KEY                attaches,
//     acquires and gives back until a status is not 0 all those statuses limit COUNT               of descriptors from
//     now on                                0
class Peer {
public:
    Peer() : process_(Process::start("peer")) {}
    explicit Peer(const std::string& command) : Peer() { EXPECT_EQ(ask(command), kDone) << command; }

    void tell(const std::string& command) { process_.write_line(command); }
    // The answer; kEnded when the process is gone.
    std::string answer();
    std::string ask(const std::string& command) {
        tell(command);
        return answer();
    }
    // Makes the process end at a point of a command.
    void crash(const std::string& point, const std::string& command);
    // Makes it stop there.
    void stop(const std::string& point, const std::string& command);
    // Arms, tells and says whether the process reached the point; if not, it has answered and is ended.
    bool is_killed_by(const std::string& point, const std::string& command);

    pid_t pid() const { return process_.pid(); }
    void kill();
    void go_on() { process_.kill(SIGCONT); }

private:
    Process process_;
};

// What a process holds that can leak; 0 for this one.
struct Holdings {
    static constexpr size_t kMostThreads = 17;  // the first, the housekeeper, and 15 of the pool
    size_t descriptors, threads, blocks;
    explicit Holdings(pid_t pid = 0)
        : descriptors(count_descriptors(pid)),
          threads(count_threads(pid)),
          blocks(count_mappings(pid, "SharedMemory_")) {}
    // No more than before. Threads that the pool has grown by stay, up to its maximum.
    bool within(const Holdings& before) const {
        return descriptors <= before.descriptors && blocks <= before.blocks &&
               threads <= std::max(before.threads, kMostThreads);
    }
};

// Whether the process's first thread is kept by this system call; and waits until it is.
bool is_in(pid_t pid, long call);
testing::AssertionResult waits_in(pid_t pid, long call);

// The process comes back to holding no more than before.
testing::AssertionResult comes_back_to(const Holdings& before, pid_t pid);

}  // namespace tavo::test

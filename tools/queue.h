// One queue, attached to for as long as a subcommand needs it.
#pragma once

#include <chrono>
#include <string>
#include <vector>

#include "tavo_osal/msg_queue.h"

namespace tavo::tool {

constexpr std::chrono::milliseconds kForEver(-1);

// How a wait ended.
enum class Wait { kReady, kTimedOut, kStopped, kNoOutput };

class Queue {
public:
    // Attaches, which makes the queue if there is none. Throws Failure.
    explicit Queue(int key);
    // Gives the use back, unless that would take waiting messages away: the last use of a queue ends it. Then the use
    // is left counted, for whoever attaches next.
    ~Queue();
    Queue(const Queue&) = delete;
    Queue& operator=(const Queue&) = delete;

    // Waits until there is room for a message of ordinary size, or a signal (StopSignals) comes.
    Wait wait_for_room(std::chrono::milliseconds timeout) const;
    bool has_room() const;
    // Waits until there is a message, or a signal comes, or the output cannot be written to any more.
    Wait wait_for_message(std::chrono::milliseconds timeout, int output) const;

    // Throw Failure. Putting waits for room for the whole message.
    void put(const std::string& message);
    std::string get();

private:
    bool is_last_with_messages() const;

    const int key_;
    TAVO_INT64 handle_ = 0;
    std::vector<unsigned char> buffer_;
};

}  // namespace tavo::tool

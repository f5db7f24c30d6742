// What a queue has to offer, for round trips and streams between two processes.
#pragma once

#include "message.h"

namespace tavo::peers {

// One process's end of a connection in both directions.
class Link {
public:
    Link() = default;
    virtual ~Link() = default;
    Link(const Link&) = delete;
    Link& operator=(const Link&) = delete;

    // Where the next message is to be written; some have a place that saves a copy.
    virtual unsigned char* blank(size_t size) = 0;
    virtual void send(size_t size) = 0;
    // Valid until the next call.
    virtual View receive() = 0;
};

enum class End { driver, partner };

// What the two ends of a connection stand on.
class Wire {
public:
    Wire() = default;
    virtual ~Wire() = default;
    Wire(const Wire&) = delete;
    Wire& operator=(const Wire&) = delete;

    // Called in the process that the end is for.
    virtual std::unique_ptr<Link> open(End end) = 0;
};

struct QueuePeer {
    std::string name;
    Role role;
    std::function<std::unique_ptr<Wire>(size_t largest)> make;
    size_t most = SIZE_MAX;  // bytes that a message may have
    std::string limit = {};  // what says so
};

std::vector<QueuePeer> kernel_queues();
std::vector<QueuePeer> library_queues();
QueuePeer our_queue();

}  // namespace tavo::peers

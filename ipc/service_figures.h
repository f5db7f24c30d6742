// What the service tells about itself when it is asked to dump, as a text for people or as JSON for programs.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <vector>

namespace tavo {

struct QueueFigures {
    int key;
    uint32_t uses;
    int read_end;  // descriptor numbers in the service's process
    int write_end;
    int capacity;  // bytes; -1 where the pipe could not be asked, for want of descriptors
    int pending;   // bytes, lengths and messages together; -1 likewise
};

struct BlockFigures {
    int key;
    uint32_t uses;
    int size;            // bytes, as asked for
    int32_t references;  // strong ones to the heap: the service's own two, and those of other processes
};

struct ServiceFigures {
    pid_t process;
    bool has_queue_table;
    uint32_t queue_room;
    std::vector<QueueFigures> queues;
    bool has_block_list;
    uint32_t block_limit;
    std::vector<BlockFigures> blocks;
};

std::string to_text(const ServiceFigures& figures);

// One line. Members may be added, but keep their names and meanings: scripts read them.
std::string to_json(const ServiceFigures& figures);

}  // namespace tavo

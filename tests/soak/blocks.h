// A client's use of the blocks that all clients share.
#pragma once

#include "soak/client.h"
#include "tavo_osal/shared_memory.h"

namespace tavo::soak {

// In front of a block's contents, which follow from it.
struct BlockHeader {
    uint64_t generation;
    uint32_t slot, incarnation;
    uint64_t seed;
};

// Whether a block is what the board says was written last.
bool block_is_right(const Guard& guard, const unsigned char* bytes, std::string& wrong);

class Blocks {
public:
    void use(Client& client);
    void leave_one(Client& client);
    void leave_where_told(Client& client);
    void leave_all(Client& client);

private:
    struct Held {
        uint32_t serial = 0;
        TavoShmHandle* handle = nullptr;
        unsigned char* bytes = nullptr;
        TAVO_INT64 semaphore = 0;
    };
    bool come(Client& client, unsigned which);
    void leave(Client& client, unsigned which);
    void take_a_turn(Client& client, Guard& guard, unsigned char* bytes);

    Held held_[kGuards];
};

}  // namespace tavo::soak

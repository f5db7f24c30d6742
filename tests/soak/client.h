// One of the eight: does random operations of every family until it is told to leave, or is killed.
#pragma once

#include <cstdint>
#include <string>

#include "soak/board.h"
#include "soak/random.h"

namespace tavo::soak {

struct ClientArguments {
    uint64_t seed = 0;
    unsigned slot = 0;
    uint32_t incarnation = 0;
    std::string fault;  // what this one does wrong, to show that it is noticed
};

class Post;
class Blocks;

struct Client {
    Board& board;
    Slot& slot;
    const unsigned number;  // the slot's
    const uint32_t incarnation;
    const std::string fault;
    Random random;
    Post& post;
    Blocks& blocks;

    bool breaks(const char* name) const { return fault == name; }
    bool is_leaving() const { return board.phase.load() != Phase::kRun; }
    // A file, socket or other name that no other client uses.
    std::string own_path(const std::string& leaf) const;
};

int run_client(const ClientArguments& arguments);

}  // namespace tavo::soak

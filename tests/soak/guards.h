// The coordinator's side of the shared blocks: makes them, has everybody leave those that a client was killed at, and
// checks their contents.
#pragma once

#include "soak/board.h"
#include "soak/random.h"
#include "tavo_osal/shared_memory.h"

namespace tavo::soak {

class Guards {
public:
    Guards(Board& board, uint64_t seed);

    void open_all();
    void account_for_death(unsigned slot);
    void go_on();
    // Gives a block up and makes another, now and then.
    void change_one();
    void close_all();
    bool knows_key(uint32_t key) const;
    unsigned given_up() const { return given_up_; }
    unsigned half_written() const { return half_written_; }

private:
    struct Local {
        TavoShmHandle* handle = nullptr;
        unsigned char* bytes = nullptr;
        TAVO_INT64 semaphore = 0;
        bool a_client_died = false;
    };
    bool open(unsigned which);
    bool have_all_left(unsigned which) const;
    void close(unsigned which);

    Board& board_;
    Random random_;
    Local local_[kGuards];
    uint32_t serial_ = 0;
    unsigned given_up_ = 0, half_written_ = 0;  // because of kills
};

}  // namespace tavo::soak

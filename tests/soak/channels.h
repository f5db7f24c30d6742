// The coordinator's side of the queues: opens them, has everybody leave those that a killed client had to do with, and
// accounts for every message of theirs.
#pragma once

#include <chrono>
#include <string>

#include "soak/drain.h"
#include "tavo_osal/status.h"

namespace tavo::soak {

using Clock = std::chrono::steady_clock;

// What became of the messages that somebody was killed in.
struct KillCosts {
    unsigned in_doubt_and_came = 0, in_doubt_and_missing = 0, torn = 0, in_hand = 0;
};

class Channels {
public:
    Channels(Board& board, const std::string& fault);
    const KillCosts& costs() const { return costs_; }

    // Opens what is closed and whose clients are there.
    void open_for(const bool (&is_there)[kClients]);
    // What the client, which has been reaped, had to do with.
    void account_for_death(unsigned slot);
    // Whether a new incarnation may come: its queues are accounted for.
    bool are_closed_for(unsigned slot) const;
    bool are_some_retired() const;
    // Some steps further, without waiting for anybody.
    void go_on();
    // Everybody has left in good order.
    void close_all();
    bool knows_key(int32_t key) const;

private:
    struct Local {
        TAVO_INT64 handle = 0;
        int pipe = -1;
        Drain drain;
        bool receiver_is_dead = false, is_woken = false;
        bool had_nothing_in_hand = false;  // the receiver that died
        bool is_drained_here = false;      // nobody else receives any more
        Clock::time_point retired;
        int most_uses_left = 0;  // by those who were killed
    };
    bool open(unsigned channel);
    void retire(unsigned channel);
    void empty(unsigned channel);
    void wake_receiver(unsigned channel);
    bool have_all_left(unsigned channel) const;
    void close(unsigned channel);
    void close_link(unsigned channel, unsigned slot, Link& link);
    void close_links_of_the_dead(unsigned channel);

    Board& board_;
    const std::string fault_;
    Local local_[kChannels];
    uint32_t serial_ = 0;
    KillCosts costs_;
};

}  // namespace tavo::soak

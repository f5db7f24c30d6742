// The clients' processes: started, killed at random, restarted, and watched.
#pragma once

#include <array>
#include <functional>
#include <string>

#include "soak/channels.h"
#include "soak/guards.h"
#include "soak/options.h"
#include "soak/processes.h"
#include "soak/random.h"

namespace tavo::soak {

class Clients {
public:
    using Report = std::function<void(const std::string& failure)>;
    Clients(Board& board, const Options& options, int board_fd, int failure_fd, Report report);

    // Those that are not there, once all is accounted for that their predecessors had to do with.
    void start_missing(Channels& channels);
    void reap(Channels& channels, Guards& guards);
    void kill_one();
    void watch_progress();
    bool are_all_quiet() const;
    bool are_all_gone() const;
    void end_stragglers();

    unsigned kills() const { return kills_; }
    const ChildProcess& process(unsigned slot) const { return clients_[slot].process; }
    // Whether a key is one that a client has now. That one who ended in good order left it is a failure.
    bool have_own_key(uint32_t key, const char* what) const;

private:
    struct Client {
        ChildProcess process;
        bool was_killed = false;      // by this process, on purpose
        bool ended_in_order = false;  // the latest incarnation
        Clock::time_point restart;
        uint64_t operations = 0;
        Clock::time_point progressed;
    };
    void start(unsigned slot);
    void remove_files_of(unsigned slot) const;
    void await_step(unsigned slot);
    void end_for(unsigned slot, const std::string& reason);
    std::string name_of(unsigned slot) const;

    Board& board_;
    const Options& options_;
    const int board_fd_, failure_fd_;
    const Report report_;
    Random random_;
    std::array<Client, kClients> clients_;
    Clock::time_point next_kill_;
    unsigned kills_ = 0;
};

}  // namespace tavo::soak

// Starts the server and the clients, kills and restarts clients at random, accounts for what that costs, watches, and
// reports.
#pragma once

#include <array>
#include <chrono>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "soak/channels.h"
#include "soak/guards.h"
#include "soak/processes.h"
#include "soak/samples.h"

namespace tavo::soak {

struct Options {
    double minutes = 1;
    uint64_t seed = 0;
    std::string output = "build/soak";
    unsigned patience = 60;  // seconds without progress of a client
    unsigned grace = 12;     // seconds for everybody to leave in the end
    bool stop_at_failure = false;
    std::string fault;
};

class Coordinator {
public:
    explicit Coordinator(const Options& options);
    // The exit status.
    int run();

private:
    struct ClientProcess {
        ChildProcess process;
        bool was_killed = false;      // by this process, on purpose
        bool ended_in_order = false;  // the latest incarnation
        Clock::time_point restart;
        uint64_t operations = 0;
        Clock::time_point progressed;
    };
    struct Totals {
        uint64_t messages = 0, bytes = 0, operations = 0;
    };

    bool start_server();
    void start_client(unsigned slot);
    void restart_the_dead();
    void reap();
    void clean_up_after(unsigned slot);
    void await_step(unsigned slot);
    void kill_one();
    void watch_progress();
    void take_back_unknown_uses(bool is_the_end);
    void sample();
    void read_failures();
    void report_failure(const std::string& line);
    void show_progress(bool is_due);
    void step();
    bool run_until(const std::function<bool()>& is_done, Clock::time_point deadline);
    void end_in_order();
    void judge();
    Totals totals() const;
    double seconds() const;

    friend class Report;

    Options options_;
    Random random_;
    int board_fd_ = -1;
    Board* board_;
    int failures_in_ = -1, failures_out_ = -1;
    ChildProcess server_;
    std::array<ClientProcess, kClients> clients_;
    std::unique_ptr<Channels> channels_;
    std::unique_ptr<Guards> guards_;
    std::vector<Series> series_;  // the server's, then the steady clients'
    std::vector<Verdict> verdicts_;
    std::ofstream samples_file_, rates_file_;
    std::string unread_failures_;
    std::vector<std::string> failures_;
    size_t failure_count_ = 0;
    unsigned kills_ = 0;
    bool server_is_wanted_ = true, kills_are_wanted_ = true;
    Clock::time_point start_, next_sample_, next_kill_, next_change_, next_sweep_, next_progress_;
    Totals at_last_sample_;
    double seconds_at_last_sample_ = 0;
    double messages_per_second_ = 0;
};

}  // namespace tavo::soak

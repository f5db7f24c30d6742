// Starts the server and the clients, accounts for what kills cost, and reports.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "soak/channels.h"
#include "soak/clients.h"
#include "soak/guards.h"
#include "soak/options.h"
#include "soak/processes.h"
#include "soak/recorder.h"

namespace tavo::soak {

class Coordinator {
public:
    explicit Coordinator(const Options& options);
    // The exit status.
    int run();

private:
    bool start_server();
    void watch_server();
    void take_back_unknown_uses(bool is_the_end);
    void read_failures();
    void report_failure(const std::string& line);
    void show_progress(bool is_the_end);
    void step();
    bool run_until(const std::function<bool()>& is_done, Clock::time_point deadline);
    void end_in_order();
    void judge();

    friend class Report;

    const Options options_;
    Random random_;
    int board_fd_ = -1;
    Board* board_;
    int failures_in_ = -1, failures_out_ = -1;
    ChildProcess server_;
    std::unique_ptr<Clients> clients_;
    std::unique_ptr<Channels> channels_;
    std::unique_ptr<Guards> guards_;
    std::unique_ptr<Recorder> recorder_;
    std::vector<Verdict> verdicts_;
    std::string unread_failures_;
    std::vector<std::string> failures_;
    size_t failure_count_ = 0;
    bool server_is_there_ = false, is_running_ = true;
    Clock::time_point next_sample_, next_change_, next_sweep_, next_progress_;
};

}  // namespace tavo::soak

// What is recorded of a soak while it runs: samples of every process, and the speed.
#pragma once

#include <chrono>
#include <fstream>
#include <string>
#include <vector>

#include "soak/clients.h"
#include "soak/samples.h"

namespace tavo::soak {

struct Totals {
    uint64_t messages = 0, bytes = 0, operations = 0;
};

class Recorder {
public:
    Recorder(const Board& board, const std::string& directory);
    bool is_good() const { return samples_file_.good() && rates_file_.good(); }

    double seconds() const;
    Totals totals() const;
    double messages_per_second() const { return messages_per_second_; }
    void sample(const ChildProcess& server, const Clients& clients);
    // Of the server and the clients that are never killed.
    std::vector<Verdict> judge() const;

private:
    void add(const std::string& name, uint32_t incarnation, const ChildProcess& process, Series* series);

    const Board& board_;
    const Clock::time_point start_ = Clock::now();
    std::ofstream samples_file_, rates_file_;
    std::vector<Series> series_;
    Totals latest_;
    double latest_seconds_ = 0, messages_per_second_ = 0;
};

}  // namespace tavo::soak

// tavo ping: how long the service takes to answer.
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <nlohmann/json.hpp>

#include "tools/command.h"
#include "tools/numbers.h"
#include "tools/service.h"
#include "tools/stop_signals.h"

namespace tavo::tool {
namespace {

using std::chrono::duration;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

struct Options {
    unsigned long count = 0;
    double interval = 1;
    double timeout = 5;
    bool json = false;
};

struct Statistics {
    unsigned long sent = 0;
    unsigned long answered = 0;
    double least = 0, most = 0, sum = 0;  // milliseconds

    void add(double time) {
        least = answered == 0 ? time : std::min(least, time);
        most = std::max(most, time);
        sum += time;
        ++answered;
    }
    double average() const { return answered > 0 ? sum / static_cast<double>(answered) : 0; }
};

// One round trip in milliseconds; negative when the service did not answer. Throws Failure after the timeout.
double round_trip(const Binder& service, milliseconds timeout) {
    const auto time = std::make_shared<double>(-1);
    within(timeout, "the service", [service, time] {
        const auto start = steady_clock::now();
        if (service->pingBinder() == android::NO_ERROR) {
            *time = duration<double, std::milli>(steady_clock::now() - start).count();
        }
    });
    return *time;
}

void pause_for(milliseconds interval) {
    const auto deadline = steady_clock::now() + interval;
    pollfd slot = {StopSignals::descriptor(), POLLIN, 0};
    for (;;) {
        const auto left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now());
        const int ready = poll(&slot, 1, static_cast<int>(std::max(left, milliseconds(0)).count()));
        if (ready >= 0 || errno != EINTR) return;
    }
}

void report(const Statistics& statistics, const Options& options) {
    if (options.json) {
        nlohmann::json json = {{"sent", statistics.sent}, {"answered", statistics.answered}};
        if (statistics.answered > 0) {
            json["min_ms"] = statistics.least;
            json["avg_ms"] = statistics.average();
            json["max_ms"] = statistics.most;
        }
        puts(json.dump().c_str());
        return;
    }
    printf("%lu sent, %lu answered", statistics.sent, statistics.answered);
    if (statistics.answered > 0) {
        printf(", min/avg/max %.3f/%.3f/%.3f ms", statistics.least, statistics.average(), statistics.most);
    }
    puts("");
}

int ping(const Options& options) {
    const Binder service = find_service();
    const StopSignals signals;
    Statistics statistics;
    while (StopSignals::received() == 0 && (options.count == 0 || statistics.sent < options.count)) {
        if (statistics.sent > 0) pause_for(milliseconds_of(std::max(options.interval, 0.0)));
        if (StopSignals::received() != 0) break;
        ++statistics.sent;
        const double time = round_trip(service, milliseconds_of(std::max(options.timeout, 0.001)));
        if (time < 0) {
            report(statistics, options);
            throw Failure("the service has gone: 'tavo serve' starts one");
        }
        statistics.add(time);
        if (options.json) continue;
        printf("answer %lu after %.3f ms\n", statistics.sent, time);
        fflush(stdout);
    }
    report(statistics, options);
    return kDone;
}

}  // namespace

void add_ping(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options =
        add_command<Options>(app, run, "ping", "Measures how long the service takes to answer", ping, command);
    command->add_option("-c,--count", options->count, "Round trips; until a signal ends it without");
    command->add_option("-i,--interval", options->interval, "Seconds between them; 1 without");
    command->add_option("-t,--timeout", options->timeout, "Seconds after which no answer is a failure; 5 without");
    command->add_flag("--json", options->json, "Only the result, as JSON");
}

}  // namespace tavo::tool

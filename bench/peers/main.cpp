// This library beside others that do the same. Wants an empty storage root and runtime directory:
// tests/support/sandbox.sh runs it in such.
//
//   peers [--quick] [--smoke] [FAMILY ...]
//
// The result is JSON on standard output, which report.py makes pages of; progress is told on standard error. --quick
// measures less often, --smoke hardly at all: it only shows that everything works.
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <ctime>
#include <iostream>

#include "runner.h"
#include "tavo_osal/log.h"

namespace {

using nlohmann::json;
using tavo::peers::Contest;
using tavo::peers::Plan;

std::vector<Contest> contests_of(const std::vector<std::string>& families) {
    std::vector<Contest> contests;
    for (const auto& family : {tavo::peers::queue_contests, tavo::peers::call_contests, tavo::peers::log_contests,
                               tavo::peers::lock_contests}) {
        for (Contest& contest : family()) {
            const bool wanted =
                families.empty() || std::find(families.begin(), families.end(), contest.family) != families.end();
            const bool possible = contest.cpus == 1 || tavo::peers::places(2).first != tavo::peers::places(2).second;
            if (wanted && possible) contests.push_back(std::move(contest));
        }
    }
    return contests;
}

std::string today() {
    const time_t now = time(nullptr);
    tm parts = {};
    gmtime_r(&now, &parts);
    char text[16];
    strftime(text, sizeof text, "%Y-%m-%d", &parts);
    return text;
}

std::string title(const Contest& contest) {
    std::string text = contest.family + ": " + contest.operation;
    if (contest.size) text += ", " + std::to_string(*contest.size) + " B";
    return text + (contest.cpus == 1 ? ", one CPU" : ", two CPUs");
}

}  // namespace

int main(int argc, char** argv) {
    Plan plan;
    std::vector<std::string> families;
    bool quick = false;
    for (int i = 1; i < argc; ++i) {
        if (strcmp(argv[i], "--quick") == 0) {
            plan = {2, 10, 2};
            quick = true;
        } else if (strcmp(argv[i], "--smoke") == 0) {
            plan = {1, 2, 0.1};
            quick = true;
        } else {
            families.emplace_back(argv[i]);
        }
    }
    g_uiMxEnabledLogLevel = 0;
    // In front of what else the machine does, where that is allowed.
    setpriority(PRIO_PROCESS, 0, -15);
    const int progress = tavo::peers::console();

    json result = {{"date", today()},
                   {"quick", quick},
                   {"rounds", plan.starts * plan.rounds},
                   {"round_milliseconds", plan.round_milliseconds},
                   {"machine", tavo::peers::machine()},
                   {"versions", tavo::peers::versions()},
                   {"contests", json::array()}};
    const std::vector<Contest> contests = contests_of(families);
    if (contests.empty()) {
        dprintf(progress, "no such family: there are queues, calls, logging and locks\n");
        return 2;
    }
    for (size_t i = 0; i < contests.size(); ++i) {
        dprintf(progress, "[%zu/%zu] %s ... ", i + 1, contests.size(), title(contests[i]).c_str());
        const auto start = std::chrono::steady_clock::now();
        result["contests"].push_back(tavo::peers::run(contests[i], plan));
        const std::chrono::duration<double> spent = std::chrono::steady_clock::now() - start;
        dprintf(progress, "%.1f s\n", spent.count());
    }
    std::cout << result.dump(1) << '\n';
    return std::cout.flush() ? 0 : 1;
}

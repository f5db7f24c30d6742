// One cell of the matrix at a time: a scenario in fresh processes, with one fault or none.
#pragma once

#include <string>
#include <vector>

#include "faults/plan.h"
#include "faults/row.h"

namespace tavo::test::faults {

struct Fault {
    int call;  // in platform_calls()
    int error;
    int nth;
};

// What a cell's run came to.
struct Trial {
    enum End { kReturned, kEnded, kHung };
    End end = kEnded;
    int signal = 0;  // that ended the process
    bool reached = false;
    long result = 0;
    long again = 0;
    std::vector<LogLine> lines;
    std::string complaint;
    Held held = {};
    bool service_lives = true;
    Held service_held = {};
    std::string figures;  // of the service, behind the run
    std::string output;   // on standard error
    std::vector<int> seen;
};

// Without a fault where there is none.
Trial tried(const Scenario& scenario, const Fault* fault);

}  // namespace tavo::test::faults

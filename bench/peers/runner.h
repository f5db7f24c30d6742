// Runs a contest: all its peers side by side, in rounds.
#pragma once

#include <nlohmann/json.hpp>

#include "peer.h"

namespace tavo::peers {

struct Plan {
    size_t starts = 4;
    size_t rounds = 26;  // after each start
    double round_milliseconds = 5;
};

// What came out, as a record of the report.
nlohmann::json run(const Contest& contest, const Plan& plan);

// What the figures were measured on and with.
nlohmann::json machine();
nlohmann::json versions();

}  // namespace tavo::peers

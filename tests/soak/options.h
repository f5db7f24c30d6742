// What a soak is told.
#pragma once

#include <cstdint>
#include <string>

namespace tavo::soak {

struct Options {
    double minutes = 1;
    uint64_t seed = 0;
    std::string output = "build/soak";
    unsigned patience = 60;  // seconds without progress of a client
    unsigned grace = 12;     // seconds for everybody to leave in the end
    bool stop_at_failure = false;
    std::string fault;  // what is done wrong on purpose, to show that it is noticed
};

}  // namespace tavo::soak

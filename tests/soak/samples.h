// What the processes hold over time, and whether that stays flat.
#pragma once

#include <string>
#include <vector>

#include "soak/processes.h"

namespace tavo::soak {

struct Verdict {
    std::string process, what;
    long second_quarter = 0, last_quarter = 0, most = 0;
    bool is_judged = false, is_flat = true;
};

// One process that stays.
class Series {
public:
    explicit Series(std::string process) : process_(std::move(process)) {}
    void add(const Holdings& sample) { samples_.push_back(sample); }
    // The quarters of a short run differ by what happens in them, and it is not told by its memory. Nor is one with a
    // sanitizer, which keeps what was freed.
    std::vector<Verdict> judge(bool is_long, bool judge_memory) const;

private:
    std::string process_;
    std::vector<Holdings> samples_;
};

}  // namespace tavo::soak

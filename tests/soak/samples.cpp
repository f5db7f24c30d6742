#include "soak/samples.h"

#include <algorithm>

namespace tavo::soak {
namespace {

constexpr size_t kLeastSamples = 16;

// What is held changes all the time; medians of quarters only change when something is not given back. What may come
// later once: a thread of binder's pool, a page of the allocator's.
struct Measure {
    const char* name;
    long Holdings::*value;
    long slack;
};
constexpr Measure kMeasures[] = {
    {"descriptors", &Holdings::descriptors, 6},
    {"resident KiB", &Holdings::resident_kib, 3072},
    {"threads", &Holdings::threads, 8},
    {"mappings", &Holdings::mappings, 24},
};
constexpr long kSlackDivisor = 10;
constexpr long kSlackOfShortRuns = 6;

long median(const std::vector<Holdings>& samples, size_t from, size_t to, long Holdings::*value) {
    std::vector<long> values;
    for (size_t i = from; i < to; ++i) values.push_back(samples[i].*value);
    std::sort(values.begin(), values.end());
    return values[values.size() / 2];
}

}  // namespace

std::vector<Verdict> Series::judge(bool is_long, bool judge_memory) const {
    std::vector<Verdict> verdicts;
    const size_t count = samples_.size();
    for (const Measure& measure : kMeasures) {
        Verdict verdict;
        verdict.process = process_;
        verdict.what = measure.name;
        for (const Holdings& sample : samples_) verdict.most = std::max(verdict.most, sample.*measure.value);
        if (count >= kLeastSamples) {
            verdict.second_quarter = median(samples_, count / 4, count / 2, measure.value);
            verdict.last_quarter = median(samples_, count - count / 4, count, measure.value);
            const long limit = verdict.second_quarter + verdict.second_quarter / kSlackDivisor +
                               measure.slack * (is_long ? 1 : kSlackOfShortRuns);
            verdict.is_judged = judge_memory || measure.value != &Holdings::resident_kib;
            verdict.is_flat = !verdict.is_judged || verdict.last_quarter <= limit;
        }
        verdicts.push_back(verdict);
    }
    return verdicts;
}

}  // namespace tavo::soak

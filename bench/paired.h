// A small harness for pairs: the platform call alone against the same thing through the library.
//
// What is wanted is a ratio of a few per cent, on a machine whose speed drifts by more than that within a run. So the
// two sides take turns in rounds of some milliseconds, the side that begins changes with every round, and the
// result is the median of the rounds' ratios. Google Benchmark measures one side to its end before the other (its
// random interleaving mixes repetitions, but it still reports each side alone), and it has no notion of an operation
// that a second, pinned process takes part in; here a side is any callable that does n operations.
//
//     const std::vector<Pair> pairs = {{"put and get, 16 B", bare, tavo, 1.06}};
//     int main(int argc, char** argv) { return tavo::bench::run_pairs(argc, argv, pairs); }
//
// Arguments: any number of texts; only pairs whose name contains one of them are run.
#pragma once

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

namespace tavo::bench {

using Side = std::function<void(size_t operations)>;

struct Pair {
    std::string name;
    Side bare;
    Side tavo;
    double goal;  // the highest good ratio of the library's time to the bare time
};

// Keeps the compiler from dropping the computation of a value that nobody uses.
template <typename T>
inline void keep(const T& value) {
    asm volatile("" : : "r,m"(value) : "memory");
}

namespace detail {

constexpr size_t kRounds = 101;
constexpr double kRoundNanoseconds = 4e6;

inline double nanoseconds(const Side& side, size_t operations) {
    const auto start = std::chrono::steady_clock::now();
    side(operations);
    const std::chrono::duration<double, std::nano> spent = std::chrono::steady_clock::now() - start;
    return spent.count() / static_cast<double>(operations);
}

// As many operations as fill one round; also warms both sides up. The best of a few tries counts, because a single
// one that another program held up would make every round too short.
inline size_t calibrate(const Pair& pair) {
    for (size_t operations = 1;; operations *= 2) {
        double best = nanoseconds(pair.bare, operations);
        for (int i = 0; i < 3; ++i) {
            best = std::min({best, nanoseconds(pair.bare, operations), nanoseconds(pair.tavo, operations)});
        }
        if (best * static_cast<double>(operations) >= kRoundNanoseconds) return operations;
    }
}

inline double median(std::vector<double> values) {
    const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
    std::nth_element(values.begin(), middle, values.end());
    return *middle;
}

inline void run(const Pair& pair) {
    const size_t operations = calibrate(pair);
    std::vector<double> bare, tavo, ratios;
    for (size_t round = 0; round < kRounds; ++round) {
        const bool bare_first = round % 2 == 0;
        if (bare_first) bare.push_back(nanoseconds(pair.bare, operations));
        tavo.push_back(nanoseconds(pair.tavo, operations));
        if (!bare_first) bare.push_back(nanoseconds(pair.bare, operations));
        ratios.push_back(tavo.back() / bare.back());
    }
    const double ratio = median(ratios);
    printf("%-40s %12.1f %12.1f %8.3f %8.2f  %s\n", pair.name.c_str(), median(bare), median(tavo), ratio, pair.goal,
           ratio <= pair.goal ? "ok" : "MISSED");
    fflush(stdout);
}

}  // namespace detail

// A missed goal is printed, never an exit status: timings fail nothing.
inline int run_pairs(int argc, char** argv, const std::vector<Pair>& pairs) {
    printf("%-40s %12s %12s %8s %8s\n", "operation", "bare ns", "tavo ns", "ratio", "goal");
    for (const Pair& pair : pairs) {
        bool wanted = argc < 2;
        for (int i = 1; i < argc; ++i) wanted = wanted || pair.name.find(argv[i]) != std::string::npos;
        if (wanted) detail::run(pair);
    }
    return 0;
}

}  // namespace tavo::bench

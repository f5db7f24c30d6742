// A message through the library beside the same message given to the platform directly. The log goes to
// standard error, which is turned to /dev/null for the time of the benchmarks.
#include <android/log.h>
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstdio>

#include "log/module_log.h"

namespace {

constexpr char kTag[] = "BENCH";

// Standard error at /dev/null for as long as it lives.
class SilencedLog {
public:
    SilencedLog() : saved_(dup(STDERR_FILENO)) { turn_to(open("/dev/null", O_WRONLY | O_CLOEXEC)); }
    ~SilencedLog() { turn_to(saved_); }
    SilencedLog(const SilencedLog&) = delete;
    SilencedLog& operator=(const SilencedLog&) = delete;

private:
    static void turn_to(int descriptor) {
        fflush(stderr);
        dup2(descriptor, STDERR_FILENO);
        close(descriptor);
    }

    int saved_;
};

// A loop that does nothing but hide its counter from the compiler: what the loop itself costs below.
void filtered_bare(benchmark::State& state) {
    int value = 0;
    for (auto _ : state) {
        ++value;
        benchmark::DoNotOptimize(value);
    }
}
BENCHMARK(filtered_bare)->Name("log_filtered/bare");

void filtered_tavo(benchmark::State& state) {
    g_uiMxEnabledLogLevel = TAVO_LOG_WARNING;
    int value = 0;
    for (auto _ : state) {
        ++value;
        benchmark::DoNotOptimize(value);
        TAVO_LOG(kTag, TAVO_LOG_INFO, "value %d\n", value);
    }
}
BENCHMARK(filtered_tavo)->Name("log_filtered/tavo");

// A filtered message of a caller outside the library, who has the function only.
void filtered_call(benchmark::State& state) {
    g_uiMxEnabledLogLevel = TAVO_LOG_WARNING;
    int value = 0;
    for (auto _ : state) {
        ++value;
        benchmark::DoNotOptimize(value);
        tavo_print_log(TAVO_LOG_INFO, 0, __LINE__, kTag, "value %d\n", value);
    }
}
BENCHMARK(filtered_call)->Name("log_filtered/tavo_call");

void written_bare(benchmark::State& state) {
    const SilencedLog silenced;
    int value = 0;
    for (auto _ : state) __android_log_print(ANDROID_LOG_ERROR, kTag, "%d::value %d\n", __LINE__, ++value);
}
BENCHMARK(written_bare)->Name("log_written/bare");

void written_tavo(benchmark::State& state) {
    const SilencedLog silenced;
    int value = 0;
    for (auto _ : state) {
        ++value;
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "value %d\n", value);
    }
}
BENCHMARK(written_tavo)->Name("log_written/tavo");

}  // namespace

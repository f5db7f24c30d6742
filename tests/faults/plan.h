// Which platform call is to fail, where, and what came of it: in memory that the test shares with the processes it
// forks.
#pragma once

#include <pthread.h>
#include <sys/types.h>

#include <atomic>

namespace tavo::test::faults {

constexpr int kMostCalls = 256;  // that the table of platform calls may have
constexpr int kMostLines = 96;

struct LogLine {
    int priority;
    char tag[32];
    char text[256];  // without the source line's number
};

// What a process holds that can leak, as far as the libraries' own calls tell: what the C library keeps for itself,
// such as the stacks of threads that have ended, is none of it.
struct Held {
    int descriptors;
    int threads;
    long blocks;    // of the allocator's
    long mappings;  // made by mmap
};

struct Plan {
    // The fault. Calls count from the moment that active is set, in the target process; of the client only those on
    // the thread that makes the call, unless every thread is meant.
    std::atomic<bool> active;
    std::atomic<pid_t> target;  // 0: whichever process has this memory
    std::atomic<bool> every_thread;
    pthread_t thread;
    std::atomic<int> call;  // in platform_calls(), or -1
    std::atomic<int> error;
    std::atomic<long> left;
    std::atomic<bool> reached;
    std::atomic<int> seen[kMostCalls];

    // The outcome.
    std::atomic<bool> returned;
    long result;
    long again;  // of the first of the later passes that differs from the fault-free one, else that one's
    std::atomic<int> lines;
    LogLine line[kMostLines];
    char complaint[256];  // what a row's own checks found
    Held held;
    Held usual;  // what the fault-free run holds in the end, which connections that go take a moment to come to

    // The service's process.
    std::atomic<int> question;
    std::atomic<int> answered;
    Held service_held;
    char figures[2048];
};

Plan& plan();

// Counts the calling of a platform call; the error it is to fail with, or 0.
int arrive(int call);

// What the libraries' allocations and mappings come to in this process.
extern std::atomic<long> g_blocks;
extern std::atomic<long> g_mappings;

Held held();

// From a row's own checks.
void expect(bool holds, const char* text);

}  // namespace tavo::test::faults

// Pinning the processes of a benchmark.
#pragma once

#include <sched.h>

#include <cstdio>
#include <cstdlib>

namespace tavo::bench {

inline void check_pinning(int result, const char* call) {
    if (result == 0) return;
    perror(call);
    exit(1);
}

inline void run_on(int cpu) {
    cpu_set_t set;
    CPU_ZERO(&set);
    CPU_SET(cpu, &set);
    check_pinning(sched_setaffinity(0, sizeof set, &set), "sched_setaffinity");
}

// The first and the last CPU that this program may use.
struct Cpus {
    int first = -1;
    int last = -1;
    Cpus() {
        cpu_set_t set;
        check_pinning(sched_getaffinity(0, sizeof set, &set), "sched_getaffinity");
        for (int cpu = 0; cpu < CPU_SETSIZE; ++cpu) {
            if (!CPU_ISSET(cpu, &set)) continue;
            if (first < 0) first = cpu;
            last = cpu;
        }
    }
};

}  // namespace tavo::bench

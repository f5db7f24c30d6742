#include "faults/plan.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#include "support/process.h"

namespace tavo::test::faults {

std::atomic<long> g_blocks{0};
std::atomic<long> g_mappings{0};

Plan& plan() {
    static Plan* const shared = [] {
        void* memory = mmap(nullptr, sizeof(Plan), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        if (memory == MAP_FAILED) {
            perror("mmap of the plan");
            abort();
        }
        return static_cast<Plan*>(memory);
    }();
    return *shared;
}

int arrive(int call) {
    Plan& now = plan();
    if (!now.active) return 0;
    const pid_t target = now.target;
    if (target != 0 && target != getpid()) return 0;
    if (!now.every_thread && pthread_equal(now.thread, pthread_self()) == 0) return 0;
    ++now.seen[call];
    if (now.call != call || now.left.fetch_sub(1) != 1) return 0;
    now.reached = true;
    return now.error;
}

Held held() { return {static_cast<int>(count_descriptors()), static_cast<int>(count_threads()), g_blocks, g_mappings}; }

void expect(bool holds, const char* text) {
    if (!holds && plan().complaint[0] == '\0') snprintf(plan().complaint, sizeof plan().complaint, "%s", text);
}

}  // namespace tavo::test::faults

#include "Forked.h"

#include <pthread.h>

#include <atomic>

namespace android {
namespace {

std::atomic<bool> g_forked{false};

}  // namespace

bool isForked() { return g_forked.load(std::memory_order_relaxed); }

void watchForForks() {
    pthread_atfork(nullptr, nullptr, [] { g_forked = true; });
}

}  // namespace android

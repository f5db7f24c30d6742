#include "faults/waker.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/types.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

namespace tavo::test::faults {
namespace {

pthread_t g_waker;
pid_t g_sleeper;
void (*g_wake)();

// Without allocating anything, since the libraries' blocks are being counted.
bool is_asleep(pid_t thread) {
    char path[64], text[256] = "";
    snprintf(path, sizeof path, "/proc/self/task/%d/stat", thread);
    const int file = open(path, O_RDONLY | O_CLOEXEC);
    const ssize_t length = read(file, text, sizeof text - 1);
    close(file);
    const char* state = length > 0 ? strrchr(text, ')') : nullptr;
    return state != nullptr && strlen(state) > 2 && state[2] == 'S';
}

void* wait_and_wake(void*) {
    while (!is_asleep(g_sleeper)) usleep(200);
    g_wake();
    return nullptr;
}

}  // namespace

void start_waker(void (*wake)()) {
    g_wake = wake;
    g_sleeper = gettid();
    pthread_create(&g_waker, nullptr, wait_and_wake, nullptr);
}

void join_waker() { pthread_join(g_waker, nullptr); }

}  // namespace tavo::test::faults

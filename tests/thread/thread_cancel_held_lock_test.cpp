// Cancellations that arrive inside a C library's function that holds a lock of its own: ended half way, the thread
// would keep the lock from every other one. Stand-ins send the calling thread the signal from there.
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <cstdio>
#include <cstring>
#include <utility>

#include "support/platform_fault.h"
#include "tavo_osal/dl.h"
#include "tavo_osal/log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/process.h"
#include "tavo_osal/string.h"
#include "tavo_osal/thread.h"

namespace {

using tavo::test::PlatformHook;

struct Row {
    const char* function;
    void* stand_in;
    void (*call)();
};

const Row* g_row = nullptr;
thread_local bool g_armed = false;
volatile sig_atomic_t g_finished = 0;
bool g_came_back = false;

// Only the thread under test is cancelled: the test itself may come by the stand-ins, too.
void interrupt() {
    if (!std::exchange(g_armed, false)) return;
    pthread_kill(pthread_self(), SIGUSR2);
    g_finished = 1;
}

// The stand-ins fail, so that nothing is left to be released when the thread ends.
void* no_block(size_t) {
    interrupt();
    return nullptr;
}
void* no_blocks(size_t, size_t) {
    interrupt();
    return nullptr;
}
void* no_other_block(void*, size_t) {
    interrupt();
    return nullptr;
}
void free_nothing(void*) { interrupt(); }
char* no_copy(const char*) {
    interrupt();
    return nullptr;
}
int flush(FILE* stream) {
    interrupt();
    return fflush(stream);
}
void* no_object(const char*, int) {
    interrupt();
    return nullptr;
}
void* no_symbol(void*, const char*) {
    interrupt();
    return nullptr;
}
int not_closed(void*) {
    interrupt();
    return -1;
}

template <typename Result, typename... Arguments>
void* address_of(Result (*function)(Arguments...)) {
    return reinterpret_cast<void*>(function);
}

char g_text[] = "text";
void* g_any = nullptr;

const Row kRows[] = {
    {"malloc", address_of(no_block), [] { g_any = tavo_osal_mem_malloc(1); }},
    {"calloc", address_of(no_blocks), [] { g_any = tavo_osal_mem_calloc(1, 1); }},
    {"realloc", address_of(no_other_block), [] { g_any = tavo_osal_mem_realloc(nullptr, 1); }},
    {"free", address_of(free_nothing), [] { tavo_osal_mem_free(nullptr); }},
    {"strdup", address_of(no_copy), [] { g_any = tavo_osal_string_duplicate_string(g_text); }},
    {"strdup", address_of(no_copy), [] { g_any = tavo_osal_convert_string_to_upper(g_text); }},
    {"strdup", address_of(no_copy), [] { tavo_set_log_preference("-s", nullptr, nullptr); }},
    {"fflush", address_of(flush), [] { tavo_osal_exec(nullptr, nullptr); }},
    {"calloc", address_of(no_blocks), [] { tavo_osal_exec("/bin/true", "true", nullptr); }},
    {"dlopen", address_of(no_object), [] { tavo_osal_dlopen("any", RTLD_NOW, &g_any); }},
    {"dlsym", address_of(no_symbol), [] { tavo_osal_dlsym(g_text, "any", &g_any); }},
    {"dlclose", address_of(not_closed), [] { tavo_osal_dlclose(g_text); }},
};

void* call_interrupted(void*) {
    g_armed = true;
    g_row->call();
    g_came_back = true;
    return nullptr;
}

void run_to_its_end(void* (*code)(void*)) {
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, code, nullptr), TAVO_SUCCESS);
    ASSERT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
}

TEST(HeldLock, IsReleasedBeforeTheThreadEnds) {
    // The signal is not sent by the library here, so its handler must be there before.
    run_to_its_end(+[](void*) -> void* { return nullptr; });
    for (const Row& row : kRows) {
        const auto number = &row - kRows;
        g_row = &row;
        g_finished = 0;
        g_came_back = false;
        {
            const PlatformHook hook("libtavoosal.so", row.function, row.stand_in);
            run_to_its_end(call_interrupted);
        }
        EXPECT_EQ(g_finished, 1) << number << ", " << row.function;
        EXPECT_FALSE(g_came_back) << number << ", " << row.function;
    }
}

}  // namespace

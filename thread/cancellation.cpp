// This file and its neighbours are built without exceptions. A thread is cancelled by unwinding its stack from any
// instruction, and a C++ function with something to destroy must only be unwound from its calls: elsewhere the
// language's runtime ends the whole process. Without exceptions no function here has anything to destroy on that
// way, and pthread_cleanup_push() is a plain record that needs no help of the unwinder's.
#include "thread/cancellation.h"

#include <pthread.h>
#include <signal.h>

#include <cstdio>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "thread/platform_threads.h"

#ifdef __EXCEPTIONS
#error "build this file with -fno-exceptions"
#endif

namespace tavo {
namespace {

constexpr char kTag[] = "OSAL_THREAD";

void announce_once() {
    if (cancel_state.announced != 0) return;
    cancel_state.announced = 1;
    TAVO_LOG(kTag, TAVO_LOG_INFO, " Processing for pthread cancel \n");
    TAVO_LOG(kTag, TAVO_LOG_INFO, " This signal is %d \n", kCancelSignal);
}

[[noreturn]] void end_this_thread() {
    cancel_state.shields = cancel_state.shields + 1;  // once is enough
    announce_once();
    pthread_exit(nullptr);
}

extern "C" void on_cancel_signal(int signal) {
    if (signal != kCancelSignal) {
        TAVO_LOG(kTag, TAVO_LOG_INFO, "\n>> Halt Signal: %d\n\n", signal);
        return;
    }
    if (cancel_state.shields == 0) end_this_thread();
    cancel_state.pending = 1;
    // On a platform without the function the signal alone makes the wait return.
    if (cancel_state.waiting != 0 && may_end_interrupted_wait != nullptr && may_end_interrupted_wait()) {
        end_this_thread();
    }
}

struct Cleanup {
    void (*release)(void*);
    void* context;
};

void clean_up(void* opaque) {
    if (cancel_state.pending != 0) announce_once();  // and not for the platform's own pthread_cancel()
    const auto* cleanup = static_cast<const Cleanup*>(opaque);
    cleanup->release(cleanup->context);
}

}  // namespace

void install_cancel_handler() {
    struct sigaction action = {};
    action.sa_handler = on_cancel_signal;
    sigemptyset(&action.sa_mask);
    if (sigaction(kCancelSignal, &action, nullptr) == 0) return;
    perror(" sigaction \n");
    printf("Rigistered signal handler failed");
}

int wait_cancellably(int (*wait)(void*), void (*release)(void*), void* context) {
    Cleanup cleanup = {release, context};
    int error = 0;
    pthread_cleanup_push(clean_up, &cleanup);
    cancel_state.waiting = 1;
    std::atomic_signal_fence(std::memory_order_seq_cst);
    // A request that came before the mark above interrupts no wait.
    if (cancel_state.pending != 0) end_this_thread();
    error = wait(context);
    std::atomic_signal_fence(std::memory_order_seq_cst);
    cancel_state.waiting = 0;
    pthread_cleanup_pop(0);
    return error;
}

}  // namespace tavo

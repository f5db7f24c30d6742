// Keeps a cancellation away from the pieces of the library that must not be left half way.
//
// Threads are cancelled with a signal whose handler ends the thread it interrupts, wherever that is. While a
// CancelShield lives on a thread, the handler only notes the request, and the last shield to go delivers it.
// A shield costs a handful of instructions and no system call. Hold one only over code that ends soon; a wait
// goes through wait_cancellably() (thread/cancellation.h).
#pragma once

#include <pthread.h>
#include <signal.h>

#include <atomic>

namespace tavo {

// The signal reserved for cancelling threads.
constexpr int kCancelSignal = SIGUSR2;

// Shared between a thread and its own signal handler only.
struct CancelState {
    volatile sig_atomic_t shields;    // how many shields the thread holds
    volatile sig_atomic_t pending;    // a cancellation arrived behind a shield
    volatile sig_atomic_t waiting;    // behind the shields, the thread is in a wait that may be cancelled
    volatile sig_atomic_t announced;  // the messages about the cancellation have been written
};
inline thread_local CancelState cancel_state = {};

class CancelShield {
public:
    CancelShield() {
        cancel_state.shields = cancel_state.shields + 1;
        std::atomic_signal_fence(std::memory_order_seq_cst);
    }
    ~CancelShield() {
        std::atomic_signal_fence(std::memory_order_seq_cst);
        cancel_state.shields = cancel_state.shields - 1;
        if (__builtin_expect(cancel_state.pending != 0, 0) && cancel_state.shields == 0) {
            pthread_kill(pthread_self(), kCancelSignal);
        }
    }
    CancelShield(const CancelShield&) = delete;
    CancelShield& operator=(const CancelShield&) = delete;
};

}  // namespace tavo

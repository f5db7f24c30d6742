// Ending a thread in the middle of one of the C library's waits.
//
// pthread_cond_wait() and pthread_join() keep accounts of who waits. glibc has them cleared up when a waiter is
// unwound, but only from the points where POSIX lets it be cancelled; a waiter that vanished anywhere else would
// leave a condition that can never be destroyed, or a mutex of the library's locked for good.
#include <execinfo.h>
#include <pthread.h>

#include "thread/platform_threads.h"

#if defined(__SANITIZE_THREAD__)
#define TAVO_THREAD_SANITIZER 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define TAVO_THREAD_SANITIZER 1
#endif
#endif

namespace {

// Ending the first thread loads the unwinder, with allocations and locks that a signal handler must not meet.
[[gnu::constructor]] void load_unwinder() {
    void* frame = nullptr;
    static_cast<void>(backtrace(&frame, 1));
}

}  // namespace

namespace tavo {

bool may_end_interrupted_wait() {
    int type = PTHREAD_CANCEL_DEFERRED;
    int state = PTHREAD_CANCEL_ENABLE;
    pthread_setcanceltype(PTHREAD_CANCEL_DEFERRED, &type);
#ifndef TAVO_THREAD_SANITIZER
    // glibc makes a thread's cancellation asynchronous for as long as it sleeps in the kernel, and only then.
    if (type == PTHREAD_CANCEL_ASYNCHRONOUS) return true;
#endif
    // The signal came before the sleep or after it, or the C library marks its sleeps in another way (glibc from
    // 2.41), or the sanitizer keeps an account of its own that a handler must not jump out of. In the latter two cases
    // a signal between the wait's last look and its sleep is noticed at the next wake-up only.
    pthread_setcancelstate(PTHREAD_CANCEL_ENABLE, &state);
    pthread_cancel(pthread_self());
    return false;
}

}  // namespace tavo

// Tells when a thread has gone to sleep in the kernel, so that a test can act on a wait without guessing at times.
#pragma once

#include <pthread.h>
#include <semaphore.h>
#include <sys/types.h>

#include <atomic>

namespace tavo::test {

pid_t thread_id();

// Returns once the thread sleeps; fails the test when that takes longer than 20 seconds.
void wait_until_asleep(pid_t thread);

// A thread's first step towards a wait: it gives its id here, and the test waits for the id and then for the sleep.
class Bedside {
public:
    Bedside();
    ~Bedside();
    Bedside(const Bedside&) = delete;
    Bedside& operator=(const Bedside&) = delete;

    // On the thread, right before it waits.
    void going_to_sleep();
    // In the test. May be used again for the thread's next wait.
    void wait_until_asleep();
    // In the test: until the thread has ended.
    void wait_until_gone();

private:
    sem_t arrived_;
    std::atomic<pid_t> thread_ = 0;
};

// Whether this is a build for ThreadSanitizer.
#if defined(__SANITIZE_THREAD__)
inline constexpr bool kThreadSanitizer = true;
#elif defined(__has_feature)
inline constexpr bool kThreadSanitizer = __has_feature(thread_sanitizer);
#else
inline constexpr bool kThreadSanitizer = false;
#endif

}  // namespace tavo::test

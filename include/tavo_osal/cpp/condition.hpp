/**
 * @file
 * tavo::Condition: a condition variable of tavo_osal/condition.h that owns itself, used with std::unique_lock over a
 * tavo::Mutex.
 */
#ifndef TAVO_OSAL_CPP_CONDITION_HPP
#define TAVO_OSAL_CPP_CONDITION_HPP

#include <mutex>

#include "tavo_osal/condition.h"
#include "tavo_osal/cpp/duration.hpp"
#include "tavo_osal/cpp/mutex.hpp"

namespace tavo {

/**
 * A condition variable. Waits go with a lock that holds its mutex (else: Errc::invalid_param), return with it held, and
 * may return without a notification, unless they are given a predicate. Every member but the constructors and close()
 * may be called from any thread.
 *
 * Time-outs are rounded up to whole seconds: the C function fails on most others, as its documentation explains.
 * More than a year is no limit. They are measured against the realtime clock.
 */
class Condition : public Handle<TAVO_Condition, tavo_osal_thread_condition_create, tavo_osal_thread_condition_destroy,
                                FailedDestroy::keeps> {
public:
    using Handle::Handle;
#ifdef TAVO_HAS_EXCEPTIONS
    Condition() = default;
#endif
    /** Takes over a handle from tavo_osal_thread_condition_create(). */
    static Condition adopt(TAVO_Condition* handle) noexcept { return Condition(Handle::adopt(handle)); }

    /** Waits for a notification. @param lock holds the mutex @param error the failure, or cleared */
    void wait(std::unique_lock<Mutex>& lock, std::error_code& error) {
        error = to_error_code(tavo_osal_thread_condition_wait(native_handle(), mutex_of(lock)));
    }

    /** Waits for a notification, at most for a time.
     *  @param lock holds the mutex @param duration see above @param error the failure, or cleared
     *  @return false when the time is up */
    template <typename Rep, typename Period>
    bool wait_for(std::unique_lock<Mutex>& lock, std::chrono::duration<Rep, Period> duration, std::error_code& error) {
        if (duration > detail::kLongestWait) {
            wait(lock, error);
            return !error;
        }
        const auto timeout = detail::whole_seconds_in_ms<uint64_t>(duration);
        return detail::unless_timeout(tavo_osal_thread_condition_timedwait(native_handle(), mutex_of(lock), timeout),
                                      TAVO_CONDITION_TIMEOUT, error);
    }

    /** Waits until a predicate holds, which is asked with the mutex held.
     *  @param lock holds the mutex @param predicate of no arguments @param error the failure, or cleared */
    template <typename Predicate>
    void wait(std::unique_lock<Mutex>& lock, Predicate predicate, std::error_code& error) {
        error.clear();
        while (!error && !predicate()) wait(lock, error);
    }

    /** Waits until a predicate holds, at most for a time, however often it is notified meanwhile.
     *  @param lock holds the mutex @param duration see above @param predicate of no arguments
     *  @param error the failure, or cleared @return what the predicate said last */
    template <typename Rep, typename Period, typename Predicate>
    bool wait_for(std::unique_lock<Mutex>& lock, std::chrono::duration<Rep, Period> duration, Predicate predicate,
                  std::error_code& error) {
        using Clock = std::chrono::steady_clock;
        const Clock::time_point deadline = detail::from_now<Clock>(duration);
        error.clear();
        while (!predicate()) {
            const Clock::duration left = deadline - Clock::now();
            if (left <= Clock::duration::zero()) return false;
            wait_for(lock, left, error);
            if (error) return false;
        }
        return true;
    }

    /** Wakes one waiter, if there is any. @param error the failure, or cleared */
    void notify_one(std::error_code& error) {
        error = to_error_code(tavo_osal_thread_condition_signal(native_handle()));
    }
    /** Wakes every waiter. @param error the failure, or cleared */
    void notify_all(std::error_code& error) {
        error = to_error_code(tavo_osal_thread_condition_broadcast(native_handle()));
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    void wait(std::unique_lock<Mutex>& lock) {
        detail::or_throw("tavo::Condition::wait", [&](std::error_code& error) { wait(lock, error); });
    }
    template <typename Predicate, std::enable_if_t<std::is_invocable_v<Predicate>, int> = 0>
    void wait(std::unique_lock<Mutex>& lock, Predicate predicate) {
        detail::or_throw("tavo::Condition::wait", [&](std::error_code& error) { wait(lock, predicate, error); });
    }
    template <typename Rep, typename Period>
    bool wait_for(std::unique_lock<Mutex>& lock, std::chrono::duration<Rep, Period> duration) {
        return detail::or_throw("tavo::Condition::wait_for",
                                [&](std::error_code& error) { return wait_for(lock, duration, error); });
    }
    template <typename Rep, typename Period, typename Predicate,
              std::enable_if_t<std::is_invocable_v<Predicate>, int> = 0>
    bool wait_for(std::unique_lock<Mutex>& lock, std::chrono::duration<Rep, Period> duration, Predicate predicate) {
        return detail::or_throw("tavo::Condition::wait_for",
                                [&](std::error_code& error) { return wait_for(lock, duration, predicate, error); });
    }
    void notify_one() {
        detail::or_throw("tavo::Condition::notify_one", [this](std::error_code& error) { notify_one(error); });
    }
    void notify_all() {
        detail::or_throw("tavo::Condition::notify_all", [this](std::error_code& error) { notify_all(error); });
    }
    /** @} */
#endif

private:
    explicit Condition(Handle&& handle) noexcept : Handle(std::move(handle)) {}

    static TAVO_Mutex* mutex_of(const std::unique_lock<Mutex>& lock) {
        return lock.owns_lock() ? lock.mutex()->native_handle() : nullptr;
    }
};

}  // namespace tavo

#endif

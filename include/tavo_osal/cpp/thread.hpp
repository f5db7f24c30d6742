/**
 * @file
 * tavo::Thread: a thread of tavo_osal/thread.h that is joined when its owner goes, and sleeping by std::chrono.
 */
#ifndef TAVO_OSAL_CPP_THREAD_HPP
#define TAVO_OSAL_CPP_THREAD_HPP

#include <atomic>
#include <functional>
#include <new>
#include <tuple>

#include "tavo_osal/cpp/duration.hpp"
#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/thread.h"

namespace tavo {

/**
 * A running thread. Movable, not copyable. The destructor, and assignment to a running one, wait until the thread has
 * ended. Operations on an empty object (moved from, joined, detached) fail with Errc::invalid_param.
 *
 * What the thread runs is destroyed when it is joined; when detached, with the thread.
 *
 * An exception that leaves the thread's function ends the program. Cancellation is the C library's affair, see
 * tavo_osal/thread.h: a thread that is cancelled should be waiting, since C++ code that is interrupted outside of
 * a call ends the program, and a destructor it is in may be one that must not be left early.
 */
class Thread {
public:
    /** No thread. */
    Thread() noexcept = default;

    /** Starts a thread; empty when that failed.
     *  @param error the failure, or cleared @param function what it runs, copied or moved; its result is ignored
     *  @param arguments what it runs it with, copied or moved, as std::thread does */
    template <typename Function, typename... Arguments>
    explicit Thread(std::error_code& error, Function&& function, Arguments&&... arguments) {
        start(error, std::forward<Function>(function), std::forward<Arguments>(arguments)...);
    }
#ifdef TAVO_HAS_EXCEPTIONS
    /** Starts a thread. @param function as above @param arguments as above @throws std::system_error */
    template <typename Function, typename... Arguments,
              std::enable_if_t<std::is_invocable_v<std::decay_t<Function>, std::decay_t<Arguments>...>, int> = 0>
    explicit Thread(Function&& function, Arguments&&... arguments) {
        detail::or_throw("tavo::Thread", [&](std::error_code& error) {
            start(error, std::forward<Function>(function), std::forward<Arguments>(arguments)...);
        });
    }
#endif
    /** Takes over what the other one owns, which is empty then. */
    Thread(Thread&& other) noexcept
        : start_(std::exchange(other.start_, nullptr)),
          thread_(other.thread_),
          joinable_(std::exchange(other.joinable_, false)) {}
    /** Gives up its own, and takes over what the other one owns. */
    Thread& operator=(Thread&& other) noexcept {
        Thread old(std::move(*this));
        start_ = std::exchange(other.start_, nullptr);
        thread_ = other.thread_;
        joinable_ = std::exchange(other.joinable_, false);
        return *this;
    }
    Thread(const Thread&) = delete;
    Thread& operator=(const Thread&) = delete;
    ~Thread() {
        std::error_code ignored;
        if (joinable_) join(ignored);
    }

    /** Waits until the thread has ended. @param error the failure, or cleared; after a failure it is still joinable */
    void join(std::error_code& error) {
        error = to_error_code(joinable_ ? tavo_osal_thread_join(thread_) : kEmpty);
        if (!error) gone();
    }
    /** Lets the thread run on by itself. @param error the failure, or cleared */
    void detach(std::error_code& error) {
        error = to_error_code(joinable_ ? tavo_osal_thread_detach(thread_) : kEmpty);
        if (error) return;
        joinable_ = false;
        std::exchange(start_, nullptr)->leave();
    }
    /** Asks the thread to end where it is, see above; join it to know that it has. @param error the failure */
    void cancel(std::error_code& error) {
        error = to_error_code(joinable_ ? tavo_osal_thread_cancel(thread_) : kEmpty);
    }
    /** Gives the thread a real-time policy. @param policy #TAVO_THREAD_POLICY_RR or #TAVO_THREAD_POLICY_FIFO
     *  @param priority 1 or more @param error the failure, or cleared */
    void set_real_time_priority(int policy, int priority, std::error_code& error) {
        error = to_error_code(joinable_ ? tavo_osal_thread_set_real_time_priority(thread_, priority, policy) : kEmpty);
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    void join() {
        detail::or_throw("tavo::Thread::join", [this](std::error_code& error) { join(error); });
    }
    void detach() {
        detail::or_throw("tavo::Thread::detach", [this](std::error_code& error) { detach(error); });
    }
    void cancel() {
        detail::or_throw("tavo::Thread::cancel", [this](std::error_code& error) { cancel(error); });
    }
    void set_real_time_priority(int policy, int priority) {
        detail::or_throw("tavo::Thread::set_real_time_priority",
                         [&](std::error_code& error) { set_real_time_priority(policy, priority, error); });
    }
    /** @} */
#endif

    /** Whether there is a thread to join. */
    bool joinable() const noexcept { return joinable_; }
    /** The handle, for C functions; still to be joined here. Only meaningful while joinable() */
    pthread_t native_handle() const noexcept { return thread_; }

private:
    static constexpr TAVO_Status kEmpty = TAVO_INVALID_PARAM;

    /* What the thread runs. Belongs to the thread object, for a thread that is cancelled ends in a signal handler,
     * where nothing can be freed; when detached, to whoever is the second of thread and object to be done with it. */
    struct Start {
        virtual ~Start() = default;
        virtual void run() = 0;
        std::atomic<bool> left{false};

        void leave() {
            if (left.exchange(true)) delete this;
        }
    };
    template <typename Call>
    struct StartOf final : Start {
        explicit StartOf(Call&& made) : call(std::move(made)) {}
        void run() override {
            std::apply(
                [](auto&& function, auto&&... values) {
                    std::invoke(std::forward<decltype(function)>(function), std::forward<decltype(values)>(values)...);
                },
                std::move(call));
        }
        Call call;
    };

    static void* run(void* argument) {
        auto* start = static_cast<Start*>(argument);
        start->run();
        start->leave();
        return nullptr;
    }

    /* The thread is, and what it ran may go. */
    void gone() {
        joinable_ = false;
        delete std::exchange(start_, nullptr);
    }

    template <typename Function, typename... Arguments>
    void start(std::error_code& error, Function&& function, Arguments&&... arguments) {
        using Call = std::tuple<std::decay_t<Function>, std::decay_t<Arguments>...>;
        start_ = new (std::nothrow)
            StartOf<Call>(Call(std::forward<Function>(function), std::forward<Arguments>(arguments)...));
        TAVO_Status status = TAVO_NO_MEMORY;
        if (start_ != nullptr) status = tavo_osal_thread_create(&thread_, run, start_);
        joinable_ = status == TAVO_SUCCESS;
        if (!joinable_) delete std::exchange(start_, nullptr);
        error = to_error_code(status);
    }

    Start* start_ = nullptr; /* while joinable */
    pthread_t thread_ = {};
    bool joinable_ = false;
};

namespace this_thread {

/** Sleeps for at least a duration, rounded up to microseconds below a second and to milliseconds from there; at most
 *  2147483647 seconds. Zero and negative durations return at once. A signal ends the sleep early: Errc::failure.
 *  @param duration how long @param error the failure, or cleared */
template <typename Rep, typename Period>
void sleep_for(std::chrono::duration<Rep, Period> duration, std::error_code& error) {
    constexpr uint64_t kSecondsOf32Bits = 2147483647U;
    const auto micros = detail::rounded_up<uint64_t, std::chrono::microseconds>(duration);
    if (micros < 1000000U) {
        error = micros == 0 ? std::error_code() : to_error_code(tavo_osal_thread_usleep(static_cast<uint32_t>(micros)));
    } else {
        const auto millis = detail::rounded_up<uint64_t, std::chrono::milliseconds>(duration, kSecondsOf32Bits * 1000U);
        error = to_error_code(tavo_osal_thread_msleep(millis));
    }
}

/** Lets another thread run. @param error the failure, or cleared */
inline void yield(std::error_code& error) { error = to_error_code(tavo_osal_thread_yield()); }

#ifdef TAVO_HAS_EXCEPTIONS
/** The same. @throws std::system_error */
template <typename Rep, typename Period>
void sleep_for(std::chrono::duration<Rep, Period> duration) {
    detail::or_throw("tavo::this_thread::sleep_for", [&](std::error_code& error) { sleep_for(duration, error); });
}
/** The same. @throws std::system_error */
inline void yield() {
    detail::or_throw("tavo::this_thread::yield", [](std::error_code& error) { yield(error); });
}
#endif

}  // namespace this_thread
}  // namespace tavo

#endif

/**
 * @file
 * tavo::Timers, a timer framework of tavo_osal/timer.h with its worker thread, and tavo::Timer, one of its five timers.
 */
#ifndef TAVO_OSAL_CPP_TIMER_HPP
#define TAVO_OSAL_CPP_TIMER_HPP

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <new>

#include "tavo_osal/cpp/duration.hpp"
#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/timer.h"

namespace tavo {

namespace detail {

/* The framework, shared by a Timers and its timers so that a timer which outlives it notices. */
struct Framework {
    TAVO_TimerFramework* handle = nullptr; /* null once it has ended */
    uint32_t tick_ms = 0;
    std::atomic<int> timers{0};
};

/*
 * The callbacks of all timers, by number. What the C library keeps of a callback is its number: the worker may be
 * about to call one that is just being freed, and looks it up in vain then.
 */
class Callbacks {
public:
    using Callback = std::function<void()>;

    static TAVO_API Callbacks& instance() {
        static Callbacks* const callbacks = new Callbacks;  // workers may still look when the program ends
        return *callbacks;
    }

    uintptr_t add(Callback callback) {
        auto shared = std::make_shared<const Callback>(std::move(callback));
        const std::lock_guard<std::mutex> lock(mutex_);
        while (callbacks_.count(++last_) != 0 || last_ == 0) {
        }
        callbacks_.emplace(last_, std::move(shared));
        return last_;
    }
    void remove(uintptr_t number) {
        std::shared_ptr<const Callback> removed;  // whose destructor is a user's and runs without the lock
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto found = callbacks_.find(number);
        if (found == callbacks_.end()) return;
        removed = std::move(found->second);
        callbacks_.erase(found);
    }
    /* What a timer calls. */
    static void* call(void* number) {
        const std::shared_ptr<const Callback> callback = instance().find(reinterpret_cast<uintptr_t>(number));
        if (callback != nullptr && *callback) (*callback)();
        return nullptr;
    }

private:
    std::shared_ptr<const Callback> find(uintptr_t number) {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto found = callbacks_.find(number);
        return found != callbacks_.end() ? found->second : nullptr;
    }

    std::mutex mutex_;
    std::map<uintptr_t, std::shared_ptr<const Callback>> callbacks_;
    uintptr_t last_ = 0;
};

}  // namespace detail

/**
 * A timer framework: a worker thread, and room for five timers. Movable, not copyable. Ends with the object, which
 * waits for the round the worker is in; must not happen in one of its own callbacks. Timers that are left then do
 * nothing more, and their operations fail with Errc::invalid_param.
 */
class Timers {
public:
    /** Starts a worker; empty when that failed. @param tick rounded up to milliseconds; zero and negative ones are
     *  refused @param error the failure, or cleared */
    template <typename Rep, typename Period>
    Timers(std::chrono::duration<Rep, Period> tick, std::error_code& error)
        : framework_(new (std::nothrow) detail::Framework) {
        if (framework_ == nullptr) {
            error = make_error_code(Errc::no_memory);
            return;
        }
        framework_->tick_ms = detail::rounded_up<uint32_t, std::chrono::milliseconds>(tick, INT32_MAX);
        error = to_error_code(tavo_osal_timer_framework_init(framework_->tick_ms, &framework_->handle));
        if (error) framework_ = nullptr;
    }
    /** Takes over what the other one owns, which is empty then. */
    Timers(Timers&&) noexcept = default;
    /** Gives up its own, and takes over what the other one owns. */
    Timers& operator=(Timers&& other) noexcept {
        const Timers old(std::move(*this));
        framework_ = std::move(other.framework_);
        return *this;
    }
    ~Timers() {
        std::error_code ignored;
        close(ignored);
    }

    /** Ends the worker now. Does nothing when empty. @param error the failure, or cleared; after a failure, as in one
     *  of the framework's own callbacks, it can be tried again */
    void close(std::error_code& error) {
        error.clear();
        if (framework_ == nullptr) return;
        error = to_error_code(tavo_osal_timer_framework_uninit(framework_->handle));
        if (error) return;
        framework_->handle = nullptr;
        framework_ = nullptr;
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** Starts a worker. @param tick as above @throws std::system_error */
    template <typename Rep, typename Period>
    explicit Timers(std::chrono::duration<Rep, Period> tick) {
        detail::or_throw("tavo::Timers", [&](std::error_code& error) { *this = Timers(tick, error); });
    }
    /** Ends the worker now. Does nothing when empty. @throws std::system_error */
    void close() {
        detail::or_throw("tavo::Timers::close", [this](std::error_code& error) { close(error); });
    }
#endif

    /** Whether there is a framework. */
    explicit operator bool() const noexcept { return framework_ != nullptr; }
    /** The handle, for C functions; still owned. Null when empty. */
    TAVO_TimerFramework* native_handle() const noexcept { return framework_ != nullptr ? framework_->handle : nullptr; }

private:
    friend class Timer;
    std::shared_ptr<detail::Framework> framework_;
};

/**
 * One timer of a framework. Movable, not copyable; freed with the object. Operations on an empty one, or after its
 * framework has ended, fail with Errc::invalid_param. start(), stop(), restart() and running() may be called from any
 * thread and from callbacks.
 *
 * Durations are rounded up to whole ticks, at least one: the C library's timers never fire after any other. A timer
 * fires one tick after its duration has passed, as the worker counts it.
 *
 * Freeing a timer does not wait for its callback, which may be running on the worker: what a callback refers to has to
 * stay until the Timers has ended. The callback itself is kept while it runs. Callbacks
 * are not to be cancelled (tavo_osal_thread_cancel()).
 */
class Timer {
public:
    /** Kinds of timers. */
    enum class Kind : unsigned int { one_shot = TAVO_TIMER_ONE_SHOT, periodic = TAVO_TIMER_PERIODIC };

    /** Takes one of the framework's timers, stopped; empty when that failed.
     *  @param timers the framework @param kind fires once, or again and again
     *  @param interval until it fires, from start() or restart(), and between a periodic timer's firings
     *  @param callback called on the framework's worker; an exception that leaves it ends the program
     *  @param error the failure, or cleared; Errc::no_memory when all five are taken */
    template <typename Rep, typename Period>
    Timer(Timers& timers, Kind kind, std::chrono::duration<Rep, Period> interval, std::function<void()> callback,
          std::error_code& error) {
        if (timers.framework_ == nullptr || callback == nullptr) {
            error = make_error_code(Errc::invalid_param);
            return;
        }
        detail::Framework& framework = *timers.framework_;
        // The C function gives out a timer that does nothing when there is no free one.
        if (framework.timers.fetch_add(1) >= TAVO_TIMERS_PER_FRAMEWORK) {
            framework.timers.fetch_sub(1);
            error = make_error_code(Errc::no_memory);
            return;
        }
        framework_ = timers.framework_;
        interval_ms_ = whole_ticks(interval);
        number_ = detail::Callbacks::instance().add(std::move(callback));
        error = to_error_code(tavo_osal_timer_create(
            framework.handle, "", static_cast<unsigned int>(kind), static_cast<int>(interval_ms_),
            static_cast<int>(interval_ms_), detail::Callbacks::call, reinterpret_cast<void*>(number_), &timer_));
        if (error) give_back();
    }
    /** Takes over what the other one owns, which is empty then. */
    Timer(Timer&& other) noexcept { take(other); }
    /** Gives up its own, and takes over what the other one owns. */
    Timer& operator=(Timer&& other) noexcept {
        const Timer old(std::move(*this));
        take(other);
        return *this;
    }
    ~Timer() {
        if (framework_ == nullptr) return;
        if (framework_->handle != nullptr) tavo_osal_timer_free(framework_->handle, timer_);
        give_back();
    }

    /** Gives the timer back now, running or not. Does nothing when empty. */
    void close() { const Timer old(std::move(*this)); }

    /** Starts a stopped timer with its interval; one that runs is left alone. @param error the failure, or cleared */
    void start(std::error_code& error) { start_ms(interval_ms_, error); }
    /** Starts a stopped timer with a first interval of its own; one that runs is left alone.
     *  @param first until it fires first @param error the failure, or cleared */
    template <typename Rep, typename Period>
    void start(std::chrono::duration<Rep, Period> first, std::error_code& error) {
        start_ms(framework_ != nullptr ? whole_ticks(first) : 0, error);
    }
    /** Starts a timer with its interval, running or not; lost in a one-shot timer's own callback.
     *  @param error the failure, or cleared */
    void restart(std::error_code& error) { error = to_error_code(tavo_osal_timer_restart(framework(), timer_)); }
    /** Stops the timer, if it runs. @param error the failure, or cleared */
    void stop(std::error_code& error) { error = to_error_code(tavo_osal_timer_stop(framework(), timer_)); }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    template <typename Rep, typename Period>
    Timer(Timers& timers, Kind kind, std::chrono::duration<Rep, Period> interval, std::function<void()> callback) {
        detail::or_throw("tavo::Timer", [&](std::error_code& error) {
            *this = Timer(timers, kind, interval, std::move(callback), error);
        });
    }
    void start() {
        detail::or_throw("tavo::Timer::start", [this](std::error_code& error) { start(error); });
    }
    template <typename Rep, typename Period>
    void start(std::chrono::duration<Rep, Period> first) {
        detail::or_throw("tavo::Timer::start", [&](std::error_code& error) { start(first, error); });
    }
    void restart() {
        detail::or_throw("tavo::Timer::restart", [this](std::error_code& error) { restart(error); });
    }
    void stop() {
        detail::or_throw("tavo::Timer::stop", [this](std::error_code& error) { stop(error); });
    }
    /** @} */
#endif

    /** Whether the timer runs; old news when it arrives. */
    bool running() const { return framework() != nullptr && tavo_osal_is_timer_running(framework(), timer_) != 0; }
    /** Whether there is a timer. */
    explicit operator bool() const noexcept { return framework_ != nullptr; }
    /** The handle, for C functions; still owned. Null when empty. */
    TAVO_Timer* native_handle() const noexcept { return timer_; }

private:
    TAVO_TimerFramework* framework() const { return framework_ != nullptr ? framework_->handle : nullptr; }

    template <typename Rep, typename Period>
    uint32_t whole_ticks(std::chrono::duration<Rep, Period> duration) const {
        const uint32_t tick = framework_->tick_ms;
        const auto ms = detail::rounded_up<uint32_t, std::chrono::milliseconds>(duration, INT32_MAX);
        const uint32_t ticks = ms / tick + (ms % tick != 0 ? 1 : 0);
        const uint32_t most = INT32_MAX / tick;
        return (ticks == 0 ? 1 : ticks < most ? ticks : most) * tick;
    }
    void start_ms(uint32_t count, std::error_code& error) {
        error = to_error_code(tavo_osal_timer_start(framework(), timer_, count));
    }
    void give_back() {
        detail::Callbacks::instance().remove(number_);
        framework_->timers.fetch_sub(1);
        framework_ = nullptr;
        timer_ = nullptr;
    }
    void take(Timer& other) noexcept {
        framework_ = std::move(other.framework_);
        timer_ = std::exchange(other.timer_, nullptr);
        number_ = other.number_;
        interval_ms_ = other.interval_ms_;
    }

    std::shared_ptr<detail::Framework> framework_;
    TAVO_Timer* timer_ = nullptr;
    uintptr_t number_ = 0;
    uint32_t interval_ms_ = 0;
};

}  // namespace tavo

#endif

/**
 * @file
 * tavo::Event: an event of tavo_osal/event.h that owns itself.
 */
#ifndef TAVO_OSAL_CPP_EVENT_HPP
#define TAVO_OSAL_CPP_EVENT_HPP

#include "tavo_osal/cpp/duration.hpp"
#include "tavo_osal/cpp/handle.hpp"
#include "tavo_osal/event.h"

namespace tavo {

/**
 * A counting event: sets raise the count, a wait takes one count or all of them. Every member but the constructors
 * and close() may be called from any thread. A wait may be woken for nothing, as the C functions' may.
 *
 * Time-outs are rounded up to whole seconds, since the C function drops the rest. It refuses to wait for no time at
 * all, so zero fails with Errc::failure. More than a year is no limit.
 */
class Event : public Handle<TAVO_Event, tavo_osal_event_create, tavo_osal_event_destroy, FailedDestroy::frees> {
public:
    /** What a wait takes. */
    enum class Take { one, all };

    using Handle::Handle;
#ifdef TAVO_HAS_EXCEPTIONS
    Event() = default;
#endif
    /** Takes over a handle from tavo_osal_event_create(). */
    static Event adopt(TAVO_Event* handle) noexcept { return Event(Handle::adopt(handle)); }

    /** Raises the count by one and wakes one waiter. @param error the failure, or cleared */
    void set(std::error_code& error) { set_with(0, error); }
    /** Sets the count to exactly one and wakes one waiter. @param error the failure, or cleared */
    void set_to_one(std::error_code& error) { set_with(1, error); }
    /** Sets the count to zero. @param error the failure, or cleared */
    void clear(std::error_code& error) { error = to_error_code(tavo_osal_event_clear(native_handle())); }

    /** Waits for a count without limit, and takes it. @param error the failure, or cleared @param take how many */
    void wait(std::error_code& error, Take take = Take::one) { wait_ms(TAVO_EVENT_FOREVER, take, error); }

    /** Waits for a count for a time, and takes it.
     *  @param duration see above @param error the failure, or cleared @param take how many
     *  @return false when the time is up */
    template <typename Rep, typename Period>
    bool wait_for(std::chrono::duration<Rep, Period> duration, std::error_code& error, Take take = Take::one) {
        if (duration > detail::kLongestWait) return wait_ms(TAVO_EVENT_FOREVER, take, error);
        // A limit is never the number that stands for none.
        return wait_ms(detail::whole_seconds_in_ms<uint32_t>(duration, TAVO_EVENT_FOREVER - 1), take, error);
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    void set() {
        detail::or_throw("tavo::Event::set", [this](std::error_code& error) { set(error); });
    }
    void set_to_one() {
        detail::or_throw("tavo::Event::set_to_one", [this](std::error_code& error) { set_to_one(error); });
    }
    void clear() {
        detail::or_throw("tavo::Event::clear", [this](std::error_code& error) { clear(error); });
    }
    void wait(Take take = Take::one) {
        detail::or_throw("tavo::Event::wait", [&](std::error_code& error) { wait(error, take); });
    }
    template <typename Rep, typename Period>
    bool wait_for(std::chrono::duration<Rep, Period> duration, Take take = Take::one) {
        return detail::or_throw("tavo::Event::wait_for",
                                [&](std::error_code& error) { return wait_for(duration, error, take); });
    }
    /** @} */
#endif

private:
    explicit Event(Handle&& handle) noexcept : Handle(std::move(handle)) {}

    void set_with(int reset, std::error_code& error) {
        error = to_error_code(tavo_osal_event_set_with_flag(native_handle(), reset));
    }
    bool wait_ms(uint32_t timeout, Take take, std::error_code& error) {
        const int all = take == Take::all ? 1 : 0;
        return detail::unless_timeout(tavo_osal_event_waitset_with_flag(native_handle(), timeout, all), TAVO_TIMEOUT,
                                      error);
    }
};

}  // namespace tavo

#endif

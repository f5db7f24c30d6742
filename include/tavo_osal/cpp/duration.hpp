/**
 * @file
 * From std::chrono to the C functions' counts. Durations are rounded up, so that nothing is shorter than asked for, and
 * what is too long for the C function's type becomes the longest it can hold; negative durations count as zero.
 */
#ifndef TAVO_OSAL_CPP_DURATION_HPP
#define TAVO_OSAL_CPP_DURATION_HPP

#include <chrono>
#include <cstdint>
#include <limits>
#include <ratio>

namespace tavo::detail {

/* The smallest count of Units that is no shorter than the duration, at most `most`. */
template <typename Unit, typename Rep, typename Period>
constexpr uint64_t count_of(std::chrono::duration<Rep, Period> duration, uint64_t most) {
    using Factor = std::ratio_divide<Period, typename Unit::period>;
    constexpr auto kMultiplier = static_cast<uint64_t>(Factor::num);
    constexpr auto kDivisor = static_cast<uint64_t>(Factor::den);
    if (!(duration.count() > Rep(0))) return 0;  // so is what is not a number
    if constexpr (std::chrono::treat_as_floating_point_v<Rep>) {
        const long double exact = static_cast<long double>(duration.count()) * Factor::num / Factor::den;
        if (exact >= static_cast<long double>(most)) return most;
        const auto whole = static_cast<uint64_t>(exact);
        return static_cast<long double>(whole) < exact ? whole + 1 : whole;
    } else {
        static_assert(kMultiplier <= std::numeric_limits<uint64_t>::max() / kDivisor, "a period no clock has");
        const auto count = static_cast<uint64_t>(duration.count());
        const uint64_t whole = count / kDivisor;
        const uint64_t rest = (count % kDivisor * kMultiplier + kDivisor - 1) / kDivisor;
        if (rest >= most || whole > (most - rest) / kMultiplier) return most;
        return whole * kMultiplier + rest;
    }
}

/* The same as a C function's type. */
template <typename Result, typename Unit, typename Rep, typename Period>
constexpr Result rounded_up(std::chrono::duration<Rep, Period> duration,
                            Result most = std::numeric_limits<Result>::max()) {
    return static_cast<Result>(count_of<Unit>(duration, static_cast<uint64_t>(most)));
}

/* Milliseconds in whole seconds: the waits for events and conditions take nothing finer without failing. */
template <typename Result, typename Rep, typename Period>
constexpr Result whole_seconds_in_ms(std::chrono::duration<Rep, Period> duration,
                                     Result most = std::numeric_limits<Result>::max()) {
    return static_cast<Result>(rounded_up<Result, std::chrono::seconds>(duration, most / 1000) * 1000U);
}

/* Waits of more than a year have no limit: their deadlines would not fit where the clock's seconds have 32 bits. */
inline constexpr std::chrono::hours kLongestWait{24 * 365};

/* A point that far from now, or the clock's last one. */
template <typename Clock, typename Rep, typename Period>
typename Clock::time_point from_now(std::chrono::duration<Rep, Period> duration) {
    using Duration = typename Clock::duration;
    const typename Clock::time_point now = Clock::now();
    const auto left = static_cast<uint64_t>((Clock::time_point::max() - now).count());
    return now + Duration(static_cast<typename Duration::rep>(count_of<Duration>(duration, left)));
}

}  // namespace tavo::detail

#endif

// Seconds as the platform counts them.
#pragma once

#include <cstdint>
#include <ctime>
#include <limits>

namespace tavo {

// Where time_t has 32 bits, there are more milliseconds in an argument than the platform can count seconds of. A wait
// that long lasts as long as any can: it must not turn into a short one.
inline time_t seconds_after(time_t start, uint64_t seconds) {
    constexpr time_t kLast = std::numeric_limits<time_t>::max();
    const auto room = static_cast<uint64_t>(start > 0 ? kLast - start : kLast);
    return seconds < room ? static_cast<time_t>(start + static_cast<time_t>(seconds)) : kLast;
}

}  // namespace tavo

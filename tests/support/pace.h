// How fast this build's programs run.
#pragma once

#include <cstdlib>

#include "support/process.h"

namespace tavo::test {

// Sanitizers keep accounts of their own, which cost memory and time.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr bool kSanitized = true;
#else
inline constexpr bool kSanitized = false;
#endif

// Whether everything takes many times as long as on the machine itself: tests that repeat something thousands of times
// repeat it less often then.
inline bool is_slow() { return kSanitized || emulator() != nullptr || getenv("TAVO_TEST_GUEST") != nullptr; }

}  // namespace tavo::test

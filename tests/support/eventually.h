// Waiting for what other processes do a little later.
#pragma once

#include <chrono>
#include <functional>
#include <thread>

namespace tavo::test {

// False when it has not come true after ten seconds, counted in pauses: a machine that stood still meanwhile has not
// waited.
inline bool comes_true(const std::function<bool()>& condition) {
    for (int pauses = 0; !condition(); ++pauses) {
        if (pauses == 5000) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

}  // namespace tavo::test

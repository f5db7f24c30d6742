// Waiting for what other processes do a little later.
#pragma once

#include <chrono>
#include <functional>
#include <thread>

namespace tavo::test {

// False when it has not come true after ten seconds.
inline bool comes_true(const std::function<bool()>& condition) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (!condition()) {
        if (std::chrono::steady_clock::now() >= deadline) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

}  // namespace tavo::test

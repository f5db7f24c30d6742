// A terminal that shows one full screen at a time, and is as it was afterwards.
#pragma once

#include <sys/types.h>
#include <termios.h>

#include <chrono>
#include <string>

namespace tavo::tool {

class Screen {
public:
    Screen();
    ~Screen();
    Screen(const Screen&) = delete;
    Screen& operator=(const Screen&) = delete;

    // Shows as much of the lines as there is room for.
    void draw(const std::string& text);

    enum class Event { kTime, kResized, kQuit };
    // Waits for a key that means something, a change of size, a signal to end (StopSignals), or the time to pass. A
    // request to be suspended is granted, on the screen that was there before.
    Event wait_until(std::chrono::steady_clock::time_point time);

private:
    void enter();
    void leave() const;
    void suspend();

    termios saved_ = {};
    bool has_keys_;
};

}  // namespace tavo::tool

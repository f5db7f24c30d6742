// Ends what waits or goes on, in an orderly way, when somebody asks for it.
#pragma once

namespace tavo::tool {

// While it lives, the first SIGINT, SIGTERM or SIGHUP is only noted, and interrupts the call it meets; the second one
// ends the process as usual.
class StopSignals {
public:
    StopSignals();
    ~StopSignals();
    StopSignals(const StopSignals&) = delete;
    StopSignals& operator=(const StopSignals&) = delete;

    // The signal that came, 0 for none.
    static int received();
    // Readable once a signal has come.
    static int descriptor();
    // What a command that a signal has ended exits with, as shells have it.
    static int exit_status() { return 128 + received(); }
};

}  // namespace tavo::tool

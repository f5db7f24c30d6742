// A process that publishes the service, and what this process holds at the moment.
#pragma once

#include <string>

#include "support/process.h"

namespace tavo::test {

constexpr char kMarkerDirectory[] = "/sdcard/com.zorla.qirserver";
constexpr char kMarker[] = "/sdcard/com.zorla.qirserver/android.tavo.osal";

// Runs until it is told to exit or killed.
class Server {
public:
    explicit Server(unsigned queues = 25, unsigned blocks = 25);

    pid_t pid() const { return process_.pid(); }
    // What tavo_osal_init() answered.
    int status() const { return status_; }
    size_t allocated_bytes();
    // Leaves the server without a free descriptor, or gives it back what it had.
    void take_descriptors() { ask("take"); }
    void give_descriptors() { ask("give"); }
    // Has it exit by itself, so that a sanitizer looks at what it leaves behind; its exit status.
    int exit();
    void kill();

private:
    static Process start(unsigned queues, unsigned blocks);
    std::string ask(const std::string& question);

    Process process_;
    int status_ = -1;
};

// Bytes that this process has from the allocator.
size_t allocated_bytes();

}  // namespace tavo::test

// The kernel's binder driver as a file. Nothing else asks the kernel for anything.
#pragma once

#include <linux/android/binder.h>

#include <cstddef>
#include <cstdint>

#include "../UniqueFd.h"

namespace android::kernel_driver {

// Not one of these throws, yet a thread may be made to leave through any of them: see Device.cpp.
class Device {
public:
    Device() = default;
    ~Device();
    Device(const Device&) = delete;
    Device& operator=(const Device&) = delete;

    // Whether there is a device that speaks this library's version of the protocol. Says why there is none unless
    // there is nothing of that name.
    static bool isThere();

    // Opens the device and maps the memory that the kernel receives into. Says why when it fails.
    bool open();

    // These return 0 or an error number.

    // Says what is written and, if there is anything to read into, waits for an answer. The fields that count what was
    // consumed are right in any case.
    int writeRead(binder_write_read& request);
    int setMaxThreads(uint32_t count);
    int becomeContextManager();
    // The kernel forgets the calling thread: what it has not answered fails, what it waits for is lost.
    int endThread();

private:
    UniqueFd fd_;
    void* memory_ = nullptr;
};

}  // namespace android::kernel_driver

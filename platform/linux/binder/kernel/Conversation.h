// One thread's part in the driver: what it has yet to say, and what it has been told and not yet seen to.
#pragma once

#include <binder/Binder.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "CommandQueue.h"
#include "CommandReader.h"
#include "Device.h"

namespace android::kernel_driver {

class KernelDriver;

// What is to be said waits until the thread next asks the kernel for something, as on the platform: most calls cost
// one system call.
struct Conversation {
    explicit Conversation(KernelDriver& owner) : driver(owner) {}

    // The next thing to see to; waits for it when there is none. 0, or the number of the error that ended the
    // conversation, EPROTO for what makes no sense.
    int next(Device& device, Command& command);
    // Says what there is to say.
    int flush(Device& device);
    // What it was told is lost, and the kernel takes it for a new thread.
    void startAnew() {
        reader = CommandReader();
        isRegistered = false;
        ++generation;
    }

    KernelDriver& driver;
    CommandQueue queue;
    CommandReader reader;
    // As large as the platform's.
    std::array<uint8_t, 256> received{};

    // References that the kernel has given up. What goes away with them may call out, which has to wait until
    // everything else that was told along with it is seen to.
    std::vector<BBinder*> strongReferences;
    std::vector<RefBase::weakref_type*> weakReferences;

    // The kernel keeps objects until it hears that this process does.
    bool owesAnswers = false;

    // Transactions that it runs, one inside the other.
    size_t depth = 0;
    // It belongs to the pool, and comes back to the kernel soon.
    bool isPooled = false;
    // The kernel counts it in.
    bool isRegistered = false;
    // Calls of an earlier generation are never answered.
    size_t generation = 0;

private:
    int talk(Device& device, bool listens);
};

}  // namespace android::kernel_driver

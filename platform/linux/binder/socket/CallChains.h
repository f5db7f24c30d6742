// The threads of this process that wait for a reply, by the chain of calls they are part of.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>
#include <utility>
#include <vector>

#include "ServedChannel.h"

namespace android::socket_driver {

// A call that comes back to this process by way of others finds the thread that waits at the chain's other end, as
// on the platform: it needs no further thread, so a chain ends however long it is and however busy the others are,
// and whatever the thread keeps of its own, recursive locks among it, is as in a call within the process.
class CallChains {
public:
    // While this lives, its thread is to be found. Where the process has no descriptor left, it is not.
    class Waiting {
    public:
        Waiting(CallChains& chains, uint64_t chain);
        ~Waiting();
        Waiting(const Waiting&) = delete;
        Waiting& operator=(const Waiting&) = delete;

        // Waits until the channel is ready or something was handed over, which is returned.
        std::vector<Arrival> wait(int channel);

    private:
        friend class CallChains;
        CallChains& chains_;
        const uint64_t chain_;
        Waiting* const outer_;  // of the same thread: the call that runs one of whose calls this is
        UniqueFd own_;          // of the outermost
        const int bell_;
        std::vector<Arrival> arrivals_;
    };

    // `late` takes what was handed over to a thread that waits no more.
    explicit CallChains(std::function<void(Arrival)> late) : late_(std::move(late)) {}

    // Gives a transaction to the thread that waits in its chain. False, and nothing taken, when there is none.
    bool handOver(Arrival& arrival);

private:
    static constexpr size_t kMaxSpare = 4;
    static thread_local Waiting* innermost_;

    UniqueFd takeBell();

    const std::function<void(Arrival)> late_;
    std::atomic<size_t> count_{0};
    std::mutex mutex_;
    std::vector<Waiting*> waiting_;  // in the order of their calls
    std::vector<UniqueFd> spareBells_;
};

}  // namespace android::socket_driver

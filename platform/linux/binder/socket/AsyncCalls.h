// Oneway transactions that have been accepted and wait for their turn.
#pragma once

#include <binder/Binder.h>
#include <binder/Parcel.h>

#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <unordered_map>

#include "../Driver.h"

namespace android::socket_driver {

struct AsyncCall {
    sp<BBinder> target;
    Driver::Caller caller;
    uint32_t code;
    uint32_t flags;
    std::unique_ptr<Parcel> data;
};

// Calls to one object run one after another, in the order of their arrival; calls to different objects do
// not wait for each other.
class AsyncCalls {
public:
    enum class Admission { kRefused, kQueued, kQueuedFirst };

    // Refused when the object has more waiting than half a parcel's limit. Whoever queued the first one must run()
    // them.
    Admission admit(AsyncCall call);
    // Runs the object's calls until none is left.
    void run(const BBinder* target, const std::function<void(AsyncCall&)>& execute);

private:
    static constexpr size_t kWaitingLimit = Driver::kParcelLimit / 2;
    // Even an empty call takes memory.
    static constexpr size_t kCallOverhead = 256;

    struct Queue {
        std::deque<AsyncCall> calls;
        size_t waiting = 0;
    };
    static size_t costOf(const AsyncCall& call) { return call.data->dataSize() + kCallOverhead; }

    std::mutex mutex_;
    std::unordered_map<const BBinder*, Queue> queues_;
};

}  // namespace android::socket_driver

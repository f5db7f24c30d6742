// Oneway transactions that have been accepted and wait for their turn.
#pragma once

#include <binder/Binder.h>
#include <binder/Parcel.h>

#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "../Driver.h"
#include "Link.h"

namespace android::socket_driver {

struct AsyncCall {
    std::shared_ptr<Link> link;
    sp<BBinder> target;
    Driver::Caller caller;
    FrameHeader header;
    std::unique_ptr<Parcel> data;
};

// Calls to one object run one after another, in the order of their arrival; calls to different objects do
// not wait for each other.
class AsyncCalls {
public:
    enum class Admission { kRefused, kQueued, kQueuedFirst };

    // Refused, and nothing taken, when the caller's process has too many waiting. Whoever queued the first one must
    // have them run.
    Admission admit(AsyncCall& call);
    // Runs the object's calls until none is left.
    void run(const BBinder* target, const std::function<void(AsyncCall&)>& execute);
    // The process that made these calls is gone. They are still run, unless too many of such processes' wait already:
    // then they are returned, to be dropped where it does no harm.
    std::vector<AsyncCall> orphan(const Link& link);

private:
    struct Sender {
        size_t waiting = 0;  // what its calls take
        bool isGone = false;
    };
    using Queue = std::deque<AsyncCall>;

    void settle(const AsyncCall& call);

    std::mutex mutex_;
    std::unordered_map<const BBinder*, Queue> queues_;
    std::unordered_map<const Link*, Sender> senders_;
    size_t orphaned_ = 0;
};

}  // namespace android::socket_driver

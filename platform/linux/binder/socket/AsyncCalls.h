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

private:
    static size_t costOf(const AsyncCall& call);

    std::mutex mutex_;
    std::unordered_map<const BBinder*, std::deque<AsyncCall>> queues_;
};

}  // namespace android::socket_driver

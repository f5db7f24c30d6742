#include "AsyncCalls.h"

#include <utility>

namespace android::socket_driver {

AsyncCalls::Admission AsyncCalls::admit(AsyncCall call) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto [found, isFirst] = queues_.try_emplace(call.target.get());
    Queue& queue = found->second;
    const size_t cost = costOf(call);
    // A call that is alone always fits: it is no larger than a parcel.
    if (queue.waiting > 0 && queue.waiting + cost > kWaitingLimit) return Admission::kRefused;
    queue.waiting += cost;
    queue.calls.push_back(std::move(call));
    return isFirst ? Admission::kQueuedFirst : Admission::kQueued;
}

void AsyncCalls::run(const BBinder* target, const std::function<void(AsyncCall&)>& execute) {
    for (;;) {
        AsyncCall call;
        {
            const std::lock_guard<std::mutex> lock(mutex_);
            const auto queue = queues_.find(target);
            if (queue->second.calls.empty()) {
                // The queue stands for its runner as well: gone, the next call makes a new one.
                queues_.erase(queue);
                return;
            }
            call = std::move(queue->second.calls.front());
            queue->second.calls.pop_front();
            queue->second.waiting -= costOf(call);
        }
        execute(call);
    }
}

}  // namespace android::socket_driver

#include "AsyncCalls.h"

#include <utility>

namespace android::socket_driver {
namespace {

// Even an empty call takes memory, and what it brings along takes more than its place in the data.
constexpr size_t kCallCost = 512;
constexpr size_t kObjectCost = 1024;

}  // namespace

AsyncCalls::Admission AsyncCalls::admit(AsyncCall& call) {
    if (!call.link->addWaiting(costOf(call))) return Admission::kRefused;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto [queue, isFirst] = queues_.try_emplace(call.target.get());
    queue->second.push_back(std::move(call));
    return isFirst ? Admission::kQueuedFirst : Admission::kQueued;
}

void AsyncCalls::run(const BBinder* target, const std::function<void(AsyncCall&)>& execute) {
    for (;;) {
        AsyncCall call;
        {
            const std::lock_guard<std::mutex> lock(mutex_);
            const auto queue = queues_.find(target);
            if (queue->second.empty()) {
                // The queue stands for its runner as well: gone, the next call makes a new one.
                queues_.erase(queue);
                return;
            }
            call = std::move(queue->second.front());
            queue->second.pop_front();
        }
        call.link->removeWaiting(costOf(call));
        execute(call);
    }
}

size_t AsyncCalls::costOf(const AsyncCall& call) {
    return kCallCost + call.data->dataSize() + call.data->objectsCount() * kObjectCost;
}

}  // namespace android::socket_driver

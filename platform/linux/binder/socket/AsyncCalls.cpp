#include "AsyncCalls.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace android::socket_driver {
namespace {

// What the calls of one process may take while they wait, and those of all processes that are gone.
constexpr size_t kWaitingLimit = Driver::kParcelLimit / 2;
constexpr size_t kOrphanLimit = 8 * kWaitingLimit;

// Even an empty call takes memory, and what it brings along takes more than its place in the data.
constexpr size_t kCallCost = 512;
constexpr size_t kObjectCost = 1024;

size_t costOf(const AsyncCall& call) {
    return kCallCost + call.data->dataSize() + call.data->objectsCount() * kObjectCost;
}

}  // namespace

AsyncCalls::Admission AsyncCalls::admit(AsyncCall& call) {
    const std::lock_guard<std::mutex> lock(mutex_);
    Sender& sender = senders_[call.link.get()];
    const size_t cost = costOf(call);
    // One that is alone always fits: it is no larger than a parcel.
    if (sender.waiting > 0 && sender.waiting + cost > kWaitingLimit) return Admission::kRefused;
    sender.waiting += cost;
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
            settle(call);
        }
        execute(call);
    }
}

std::vector<AsyncCall> AsyncCalls::orphan(const Link& link) {
    std::vector<AsyncCall> dropped;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto sender = senders_.find(&link);
    if (sender == senders_.end()) return dropped;
    sender->second.isGone = true;
    orphaned_ += sender->second.waiting;
    if (orphaned_ <= kOrphanLimit) return dropped;
    for (auto& [target, queue] : queues_) {
        const auto first = std::stable_partition(queue.begin(), queue.end(),
                                                 [&link](const AsyncCall& call) { return call.link.get() != &link; });
        std::for_each(first, queue.end(), [this](const AsyncCall& call) { settle(call); });
        std::move(first, queue.end(), std::back_inserter(dropped));
        queue.erase(first, queue.end());
    }
    return dropped;
}

// The call takes no more room.
void AsyncCalls::settle(const AsyncCall& call) {
    const auto sender = senders_.find(call.link.get());
    const size_t cost = costOf(call);
    sender->second.waiting -= cost;
    if (sender->second.isGone) orphaned_ -= cost;
    if (sender->second.waiting == 0) senders_.erase(sender);
}

}  // namespace android::socket_driver

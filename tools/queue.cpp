#include "tools/queue.h"

#include <poll.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>

#include "ipc/TAVO_MessageQueue.h"
#include "tools/command.h"
#include "tools/service.h"
#include "tools/stop_signals.h"

namespace tavo::tool {
namespace {

using android::TAVO_MessageQueue;
using std::chrono::milliseconds;
using std::chrono::steady_clock;

// A handle is the address of the queue's object, which has what the C interface leaves out: its descriptors.
TAVO_MessageQueue* object_of(TAVO_INT64 handle) {
    return reinterpret_cast<TAVO_MessageQueue*>(static_cast<intptr_t>(handle));
}

// The look-up alone may take the library five seconds.
constexpr milliseconds kPatience(15000);

// Waits for one of the slots, the last of which are the stop signals.
int poll_until(pollfd* slots, nfds_t count, milliseconds timeout) {
    const auto deadline = steady_clock::now() + timeout;
    for (;;) {
        auto left = milliseconds(-1);
        if (timeout.count() >= 0) {
            left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now());
            left = std::max(left, milliseconds(0));
        }
        const int ready = poll(slots, count, static_cast<int>(left.count()));
        if (ready >= 0 || errno != EINTR) return ready;
    }
}

[[noreturn]] void fail(const std::string& what, TAVO_Status status) {
    throw Failure(what + " failed with " + describe_status(status) + ": " + strerror(errno));
}

}  // namespace

Queue::Queue(int key) : key_(key) {
    find_service();  // tells why there is none, and at once
    const std::string name = std::to_string(key);
    struct Attached {
        TAVO_Status status;
        TAVO_INT64 handle;
    };
    const auto attached = std::make_shared<Attached>();
    within(kPatience, "the service", [attached, text = name]() mutable {
        attached->status = tavo_msg_queue_sender_init(text.data(), &attached->handle);
    });
    const TAVO_Status status = attached->status;
    if (status == TAVO_MQ_NOT_AVAILABLE) {
        throw Failure("the service could not make queue " + name +
                      ": it has run out of descriptors, or was not initialised ('tavo list' shows which)");
    }
    if (status != TAVO_SUCCESS) fail("attaching to queue " + name, status);
    handle_ = attached->handle;
}

Queue::~Queue() {
    if (is_last_with_messages()) {
        delete object_of(handle_);
        return;
    }
    try {
        within(kPatience, "the service", [handle = handle_] {
            // A service that has gone has taken the use along.
            if (tavo_msg_queue_destroy(handle) != TAVO_SUCCESS) delete object_of(handle);
        });
    } catch (const std::exception& failure) {
        say(failure.what());
    }
}

// When the service cannot be asked, the messages are taken to be in need of their queue.
bool Queue::is_last_with_messages() const {
    int pending = 0;
    if (ioctl(object_of(handle_)->iReadFd, FIONREAD, &pending) == 0 && pending == 0) return false;
    try {
        const ServiceFigures figures = figures_of(find_service());
        const QueueFigures* queue = find_queue(figures, key_);
        return queue != nullptr && queue->uses == 1;
    } catch (const std::exception&) {
        return true;
    }
}

Wait Queue::wait_for_room(milliseconds timeout) const {
    pollfd slots[] = {{object_of(handle_)->iWriteFd, POLLOUT, 0}, {StopSignals::descriptor(), POLLIN, 0}};
    const int ready = poll_until(slots, 2, timeout);
    if (slots[1].revents != 0) return Wait::kStopped;
    return ready == 0 ? Wait::kTimedOut : Wait::kReady;
}

bool Queue::has_room() const {
    pollfd slot = {object_of(handle_)->iWriteFd, POLLOUT, 0};
    return poll(&slot, 1, 0) == 1;
}

Wait Queue::wait_for_message(milliseconds timeout, int output) const {
    // An output that takes nothing at the moment must not have a message taken for it, nor one that is closed.
    pollfd outlet[] = {{output, POLLOUT, 0}, {StopSignals::descriptor(), POLLIN, 0}};
    poll_until(outlet, 2, kForEver);
    if (outlet[1].revents != 0) return Wait::kStopped;
    if ((outlet[0].revents & (POLLERR | POLLHUP | POLLNVAL)) != 0) return Wait::kNoOutput;

    pollfd slots[] = {{object_of(handle_)->iReadFd, POLLIN, 0}, {StopSignals::descriptor(), POLLIN, 0}, {output, 0, 0}};
    const int ready = poll_until(slots, 3, timeout);
    if (slots[1].revents != 0) return Wait::kStopped;
    if (slots[2].revents != 0) return Wait::kNoOutput;
    return ready == 0 ? Wait::kTimedOut : Wait::kReady;
}

void Queue::put(const std::string& message) {
    // The library only reads it.
    auto* bytes = reinterpret_cast<unsigned char*>(const_cast<char*>(message.data()));
    const TAVO_Status status = tavo_msg_queue_put(handle_, bytes, static_cast<unsigned>(message.size()));
    if (status != TAVO_SUCCESS) fail("putting into queue " + std::to_string(key_), status);
}

std::string Queue::get() {
    buffer_.resize(TAVO_MSG_QUEUE_MAX_SIZE);
    auto size = static_cast<unsigned>(buffer_.size());
    const TAVO_Status status = tavo_msg_queue_get(handle_, buffer_.data(), &size);
    if (status != TAVO_SUCCESS) fail("getting from queue " + std::to_string(key_), status);
    return {buffer_.begin(), buffer_.begin() + size};
}

}  // namespace tavo::tool

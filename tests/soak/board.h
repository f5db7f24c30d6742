// What the processes know of each other: memory that all of them share, and that stays when one is killed. Every step
// that a kill can fall into is written down before and after, so that what a kill may have cost is known exactly.
//
// Not the library's: what checks must not depend on what is checked.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>

namespace tavo::soak {

constexpr unsigned kClients = 8;
constexpr unsigned kSteadyClients = 2;  // the first ones, which are never killed: what they hold must stay flat
constexpr unsigned kInboxes = kClients;
constexpr unsigned kChannels = 2 * kClients;  // inboxes, then streams
constexpr unsigned kLinksOfASender = 16;
constexpr unsigned kGuards = 6;
constexpr unsigned kMostOperations = 64;

enum class LinkState : uint32_t {
    kFree,
    kUsed,
    kDead,  // its sender was killed
    kOver   // and all that came of it has come, since the sender's next incarnation was heard of
};

// What one incarnation of a client sends to one channel.
struct Link {
    std::atomic<LinkState> state;
    std::atomic<uint32_t> incarnation;
    std::atomic<uint64_t> intent;    // the latest message that is or was about to be put
    std::atomic<uint64_t> done;      // the latest message whose put has returned
    std::atomic<uint64_t> received;  // the latest message that was checked
    std::atomic<bool> torn;          // something came that is no whole message: only from a sender that was killed
};

enum class ChannelState : uint32_t { kClosed, kOpen, kRetired /* everybody leaves */ };

// A queue. An inbox has one receiver, and every client sends to it, in messages that go out in one piece. A stream has
// one sender and one receiver, and messages of any size.
struct Channel {
    std::atomic<ChannelState> state;
    std::atomic<uint32_t> serial;  // every queue has its own, and its own key
    std::atomic<int32_t> key;
    Link links[kClients][kLinksOfASender];
};

// Who has an inbox, sends to and receives from a stream.
constexpr bool is_stream(unsigned channel) { return channel >= kInboxes; }
constexpr unsigned stream_of(unsigned slot) { return kInboxes + slot; }
constexpr unsigned sender_of(unsigned stream) { return stream - kInboxes; }
constexpr unsigned receiver_of(unsigned channel) {
    return is_stream(channel) ? (sender_of(channel) + 1) % kClients : channel;
}

// A block that all share, in turns that a semaphore gives.
struct Guard {
    std::atomic<ChannelState> state;
    std::atomic<uint32_t> serial;
    std::atomic<uint32_t> block_key, semaphore_key, size;
    std::atomic<uint64_t> intent, done;  // generations of the contents: being written, and written
    std::atomic<int32_t> inside;         // how many hold the semaphore
};

enum class Stage : uint32_t { kStarting, kRunning, kQuiet /* sends no more */, kGone };

// One client, whatever its incarnation.
struct Slot {
    std::atomic<uint32_t> incarnation;
    std::atomic<Stage> stage;
    std::atomic<uint32_t> operation;        // what it does, see operations.h
    std::atomic<uint64_t> operations;       // how many it has begun
    std::atomic<uint64_t> messages, bytes;  // received and checked
    std::atomic<uint64_t> done[kMostOperations];
    std::atomic<uint32_t> sends_to[kChannels];       // the queue's serial, from before attaching until it has left
    std::atomic<uint32_t> receives_from[kChannels];  // likewise
    std::atomic<uint32_t> uses_guard[kGuards];       // likewise
    std::atomic<bool> at_guard[kGuards];             // from before acquiring the semaphore until it is released
};

enum class Phase : uint32_t { kRun, kFallQuiet, kLeave };

struct Board {
    std::atomic<Phase> phase;
    Slot slots[kClients];
    Channel channels[kChannels];
    Guard guards[kGuards];
};
static_assert(std::atomic<uint64_t>::is_always_lock_free);

// Clients find these under fixed numbers.
constexpr int kBoardFd = 3;
constexpr int kFailureFd = 4;

// Keys that no two ever share, so that what a killed client's last request does late does it to nobody.
constexpr int32_t channel_key(uint32_t serial) { return static_cast<int32_t>(1000000 + serial); }
constexpr uint32_t block_key(uint32_t serial) { return 2000000 + serial; }
constexpr uint32_t semaphore_key(uint32_t serial) { return 3000000 + serial; }
// Queues, blocks and semaphores that one incarnation has to itself.
constexpr uint32_t kOwnKeys = 4;
constexpr uint32_t own_key(unsigned slot, uint32_t incarnation, uint32_t which) {
    return ((slot + 1U) << 24U) + incarnation * kOwnKeys + which;
}
constexpr unsigned slot_of_key(uint32_t key) { return (key >> 24U) - 1U; }  // not a client's: kClients or more
constexpr uint32_t incarnation_of_key(uint32_t key) { return (key & 0xffffffU) / kOwnKeys; }

}  // namespace tavo::soak

#include "soak/channels.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <string>

#include "soak/failure.h"
#include "soak/service_uses.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"

namespace tavo::soak {
namespace {

// Longer than a receiver waits for the rest of a message.
constexpr auto kTornMessagesEnd = std::chrono::milliseconds(1500);

std::string text_of(unsigned channel) {
    return (is_stream(channel) ? "the stream of client " + std::to_string(sender_of(channel))
                               : "the inbox of client " + std::to_string(channel));
}

bool is_empty(int pipe) {
    int pending = 0;
    return ioctl(pipe, FIONREAD, &pending) == 0 && pending == 0;
}

}  // namespace

Channels::Channels(Board& board, const std::string& fault) : board_(board), fault_(fault) {}

bool Channels::open(unsigned channel) {
    Channel& shared = board_.channels[channel];
    Local local;
    const uint32_t serial = ++serial_;
    if (!succeeds(tavo_msg_queue_init(channel_key(serial), &local.handle), "tavo_msg_queue_init")) return false;
    local.pipe = read_end_of(channel_key(serial));
    if (!expect(local.pipe >= 0, "the service has no descriptor for a new queue")) return false;
    local.drain = Drain(shared, channel, local.pipe, fault_ == "lose-left");
    local_[channel] = local;
    for (auto& links : shared.links) {
        for (Link& link : links) link.state = LinkState::kFree;
    }
    shared.serial = serial;
    shared.key = channel_key(serial);
    shared.state = ChannelState::kOpen;
    return true;
}

void Channels::open_for(const bool (&is_there)[kClients]) {
    for (unsigned channel = 0; channel < kChannels; ++channel) {
        if (board_.channels[channel].state != ChannelState::kClosed || !is_there[receiver_of(channel)]) continue;
        if (is_stream(channel) && !is_there[sender_of(channel)]) continue;
        if (!open(channel)) return;
    }
}

void Channels::retire(unsigned channel) {
    if (board_.channels[channel].state != ChannelState::kOpen) return;
    board_.channels[channel].state = ChannelState::kRetired;
    local_[channel].retired = Clock::now();
}

void Channels::account_for_death(unsigned slot) {
    Slot& dead = board_.slots[slot];
    for (unsigned channel = 0; channel < kChannels; ++channel) {
        Local& local = local_[channel];
        local.most_uses_left += (dead.sends_to[channel] != 0 ? 1 : 0) + (dead.receives_from[channel] != 0 ? 1 : 0);
        const bool had_nothing_in_hand = dead.receives_from[channel] == 0;
        dead.sends_to[channel] = dead.receives_from[channel] = 0;
        for (Link& link : board_.channels[channel].links[slot]) {
            if (link.state == LinkState::kUsed) link.state = LinkState::kDead;
        }
        const bool sends = is_stream(channel) && sender_of(channel) == slot, receives = receiver_of(channel) == slot;
        local.receiver_is_dead |= receives;
        local.had_nothing_in_hand |= receives && had_nothing_in_hand;
        if (local.had_nothing_in_hand) local.drain.take_allowance();
        if (sends || receives) retire(channel);
    }
}

bool Channels::are_closed_for(unsigned slot) const {
    const auto is_closed = [this](unsigned channel) { return board_.channels[channel].state == ChannelState::kClosed; };
    return is_closed(slot) && is_closed(stream_of(slot)) && is_closed(stream_of((slot + kClients - 1) % kClients));
}

bool Channels::are_some_retired() const {
    return std::any_of(board_.channels, board_.channels + kChannels,
                       [](const Channel& channel) { return channel.state == ChannelState::kRetired; });
}

bool Channels::have_all_left(unsigned channel) const {
    return std::all_of(board_.slots, board_.slots + kClients, [channel](const Slot& slot) {
        return slot.sends_to[channel] == 0 && slot.receives_from[channel] == 0;
    });
}

// A receiver whose sender was killed waits for ever. What it is sent must not become the rest of a torn message, so it
// is sent when the receiver has given that up; should it be late, it recognises this.
void Channels::wake_receiver(unsigned channel) {
    Local& local = local_[channel];
    const auto& links = board_.channels[channel].links[sender_of(channel)];
    const bool in_doubt = std::any_of(links, links + kLinksOfASender, [](const Link& link) {
        return link.state == LinkState::kDead && link.received < link.intent;
    });
    if (!is_empty(local.pipe) || (in_doubt && Clock::now() < local.retired + kTornMessagesEnd)) return;
    Bytes message = message_of(retire_header(board_.channels[channel].serial));
    succeeds(tavo_msg_queue_put(local.handle, message.data(), static_cast<unsigned>(message.size())), "waking");
    local.is_woken = true;
}

void Channels::empty(unsigned channel) {
    Local& local = local_[channel];
    if (!local.receiver_is_dead && !local.is_woken && !local.is_drained_here) {
        // Who has not come yet does not come any more. It had nothing in hand.
        if (board_.slots[receiver_of(channel)].receives_from[channel] != 0) return wake_receiver(channel);
        local.is_drained_here = local.had_nothing_in_hand = true;
        local.drain.take_allowance();
    }
    local.is_drained_here |= local.receiver_is_dead;
    // Senders may be waiting for room; until they have left, this is who receives.
    if (local.is_drained_here) local.drain.take();
}

// A message that may not have been sent at all keeps its link until the client's next incarnation is heard of.
void Channels::close_links_of_the_dead(unsigned channel) {
    for (unsigned slot = 0; slot < kClients; ++slot) {
        for (Link& link : board_.channels[channel].links[slot]) {
            const LinkState state = link.state;
            const bool all_came = state == LinkState::kDead && link.received == link.intent;
            if (all_came || state == LinkState::kOver) close_link(channel, slot, link);
        }
    }
}

void Channels::go_on() {
    set_operation("accounting for queues");
    for (unsigned channel = 0; channel < kChannels; ++channel) {
        const ChannelState state = board_.channels[channel].state;
        if (state == ChannelState::kOpen && !is_stream(channel)) close_links_of_the_dead(channel);
        if (state != ChannelState::kRetired) continue;
        empty(channel);
        if (have_all_left(channel)) close(channel);
    }
}

void Channels::close_link(unsigned channel, unsigned slot, Link& link) {
    if (link.state == LinkState::kFree) return;
    const uint64_t received = link.received, done = link.done, intent = link.intent;
    const bool is_dead = link.state != LinkState::kUsed;
    Local& local = local_[channel];
    // The message that a sender was killed in may be missing, or torn. The message that a receiver had in hand is gone.
    const bool is_right = received == intent || (is_dead && received == done) ||
                          (local.receiver_is_dead && received + 1 == done && local.drain.take_allowance()) ||
                          (local.receiver_is_dead && received + 1 == intent && local.drain.take_allowance());
    if (!is_right) {
        fail("of " + std::to_string(done) + " messages that client " + std::to_string(slot) + "." +
             std::to_string(link.incarnation) + " sent to " + text_of(channel) + ", " + std::to_string(received) +
             " came");
    }
    if (link.torn && (!is_dead || intent != done + 1 || received != done)) {
        fail("a message in " + text_of(channel) + " was torn, and nobody was killed in it");
    }
    if (intent != done) {
        ++(received == intent ? costs_.in_doubt_and_came : link.torn ? costs_.torn : costs_.in_doubt_and_missing);
    }
    link.state = LinkState::kFree;
}

void Channels::close(unsigned channel) {
    Channel& shared = board_.channels[channel];
    Local& local = local_[channel];
    if (local.is_drained_here) {
        local.drain.finish();
    } else if (!is_empty(local.pipe)) {
        // Of what woke the receiver, behind a torn message, a part may have been left.
        Bytes rest(1 << 20);
        const ssize_t count = read(local.pipe, rest.data(), rest.size());
        const Bytes retire = frame_of(retire_header(shared.serial));
        const auto size = static_cast<std::ptrdiff_t>(std::max<ssize_t>(count, 0));
        if (!local.is_woken || size > static_cast<std::ptrdiff_t>(retire.size()) ||
            !std::equal(rest.begin(), rest.begin() + size, retire.end() - size)) {
            fail(std::to_string(size) + " bytes were left in " + text_of(channel));
        }
    }
    for (unsigned slot = 0; slot < kClients; ++slot) {
        for (Link& link : shared.links[slot]) close_link(channel, slot, link);
    }
    if (!local.had_nothing_in_hand && local.receiver_is_dead && !local.drain.take_allowance()) ++costs_.in_hand;
    succeeds(tavo_msg_queue_destroy(local.handle), "tavo_msg_queue_destroy");
    ::close(local.pipe);
    int left = 0;
    while (take_queue_use(shared.key)) ++left;
    if (left > local.most_uses_left) {
        fail(text_of(channel) + " had " + std::to_string(left) + " uses left, of which killed clients can have left " +
             std::to_string(local.most_uses_left));
    }
    shared.key = 0;
    shared.state = ChannelState::kClosed;
}

void Channels::close_all() {
    set_operation("closing queues");
    for (unsigned channel = 0; channel < kChannels; ++channel) {
        if (board_.channels[channel].state == ChannelState::kClosed) continue;
        if (!have_all_left(channel)) fail("a client that ended in good order is still attached to " + text_of(channel));
        close(channel);
    }
}

bool Channels::knows_key(int32_t key) const {
    return std::any_of(board_.channels, board_.channels + kChannels,
                       [key](const Channel& channel) { return channel.key == key; });
}

}  // namespace tavo::soak

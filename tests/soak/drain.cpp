#include "soak/drain.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <utility>

#include "soak/failure.h"

namespace tavo::soak {
namespace {

constexpr size_t kLength = sizeof(uint32_t);
constexpr size_t kMostMessage = 409600;

std::string text_of(const Header& header) {
    return "message " + std::to_string(header.number) + " of client " + std::to_string(header.slot) + "." +
           std::to_string(header.incarnation);
}

// A frame begins here, as far as can be told without its body.
bool begins_frame(const Bytes& bytes, size_t at, Header& header) {
    uint32_t length = 0;
    if (bytes.size() < at + kLength + kLeastMessage) return false;
    memcpy(&length, bytes.data() + at, sizeof length);
    return length <= kMostMessage && read_header(bytes.data() + at + kLength, bytes.size() - at - kLength, header) &&
           header.size == length;
}

// What is left of `bytes` is the beginning of this frame.
bool begins_with(const Bytes& bytes, size_t at, const Bytes& frame) {
    return bytes.size() - at <= frame.size() &&
           std::equal(bytes.begin() + static_cast<std::ptrdiff_t>(at), bytes.end(), frame.begin());
}

}  // namespace

void Drain::take() {
    int pending = 0;
    // Counted first: a read of an empty pipe would wait.
    while (ioctl(pipe_, FIONREAD, &pending) == 0 && pending > 0) {
        const size_t before = bytes_.size();
        bytes_.resize(before + static_cast<size_t>(pending));
        const ssize_t count = read(pipe_, bytes_.data() + before, static_cast<size_t>(pending));
        bytes_.resize(before + static_cast<size_t>(std::max<ssize_t>(count, 0)));
        if (count <= 0) return;
    }
    parse();
}

void Drain::parse() {
    if (is_lost_ || (!is_in_step_ && !find_first_frame())) return;
    size_t at = 0, end = 0;
    Header header;
    while (begins_frame(bytes_, at, header) && take_message(at + kLength, end)) at = end;
    bytes_.erase(bytes_.begin(), bytes_.begin() + static_cast<std::ptrdiff_t>(at));
}

// Until then the rest of the message in hand is in front.
bool Drain::find_first_frame() {
    Header header;
    size_t end = 0;
    if (begins_frame(bytes_, 0, header)) return is_in_step_ = true;
    if (is_stream(number_)) {
        for (size_t at = 1; at + kLength + kLeastMessage <= bytes_.size(); ++at) {
            if (begins_frame(bytes_, at, header)) return skip_to_frame(at);
        }
        return false;
    }
    // A message in one piece is read in one piece: only its length can be missing.
    if (!read_header(bytes_.data(), bytes_.size(), header) || !take_message(0, end)) return false;
    take_allowance();
    bytes_.erase(bytes_.begin(), bytes_.begin() + static_cast<std::ptrdiff_t>(end));
    return is_in_step_ = true;
}

Link* Drain::link_of_stream(uint32_t& number) {
    auto& links = channel_->links[sender_of(number_)];
    const auto found =
        std::find_if(links, links + kLinksOfASender, [](const Link& link) { return link.state != LinkState::kFree; });
    number = static_cast<uint32_t>(found - links);
    return found != links + kLinksOfASender ? found : nullptr;
}

// The frame of the message that is to be received next, or so many behind it.
Bytes Drain::next_of_stream(uint64_t behind) {
    uint32_t number = 0;
    const Link* link = link_of_stream(number);
    if (link == nullptr) return {};
    return frame_of(
        stream_header(channel_->serial, sender_of(number_), link->incarnation, number, link->received + 1 + behind));
}

bool Drain::is_part_of_next(size_t size, bool is_end) {
    const Bytes frame = next_of_stream(0);
    const auto end = bytes_.begin() + static_cast<std::ptrdiff_t>(size);
    if (is_end) {
        return size <= frame.size() && std::equal(bytes_.begin(), end, frame.end() - static_cast<std::ptrdiff_t>(size));
    }
    return std::search(frame.begin(), frame.end(), bytes_.begin(), end) != frame.end();
}

bool Drain::skip_to_frame(size_t at) {
    uint32_t number = 0;
    Link* link = link_of_stream(number);
    if (link == nullptr || !is_part_of_next(at, true)) {
        fail("a killed receiver left " + std::to_string(at) + " bytes that are not the rest of the message in hand");
        is_lost_ = true;
        return false;
    }
    take_allowance();
    link->received.fetch_add(1);
    bytes_.erase(bytes_.begin(), bytes_.begin() + static_cast<std::ptrdiff_t>(at));
    return is_in_step_ = true;
}

bool Drain::take_allowance() { return std::exchange(has_allowance_, false); }

bool Drain::take_message(size_t at, size_t& end) {
    Header header;
    read_header(bytes_.data() + at, bytes_.size() - at, header);
    end = at + header.size;
    if (bytes_.size() < end) return false;
    check(header, body_is_right(bytes_.data() + at, header));
    return true;
}

void Drain::check(const Header& header, bool is_whole) {
    if (header.kind == Kind::kRetire || (loses_some_ && header.number % 3 == 0)) return;
    if (header.slot >= kClients || header.link >= kLinksOfASender || header.serial != channel_->serial || !is_whole) {
        fail("a damaged message, by its header " + text_of(header) + ", was left by a killed receiver");
        return;
    }
    Link& link = channel_->links[header.slot][header.link];
    const uint64_t expected = link.received + 1;
    const bool in_hand = header.number == expected + 1 && take_allowance();
    if (link.incarnation != header.incarnation || (header.number != expected && !in_hand)) {
        fail(text_of(header) + " was left by a killed receiver, where the next one was to be " +
             std::to_string(expected));
    }
    link.received = header.number;
}

void Drain::finish() {
    take();
    if (is_lost_ || bytes_.empty() || (is_stream(number_) && is_left_by_kills())) return;
    fail(std::to_string(bytes_.size()) + " bytes were left that no kill explains");
}

// The rest of the message that the receiver had in hand, and behind it the beginning of one that the sender was killed
// in, which may be the same.
bool Drain::is_left_by_kills() {
    // Or of the one that was to wake it.
    const Bytes retire = frame_of(retire_header(channel_->serial));
    if (bytes_.size() < retire.size() &&
        std::equal(bytes_.begin(), bytes_.end(), retire.end() - static_cast<std::ptrdiff_t>(bytes_.size()))) {
        return true;
    }
    uint32_t number = 0;
    const Link* link = link_of_stream(number);
    if (link == nullptr) return false;
    const bool sender_was_in = link->state != LinkState::kUsed && link->intent == link->done + 1;
    const uint64_t torn = sender_was_in ? link->done + 1 : 0;
    const uint64_t next = link->received + 1;
    if (is_in_step_) return torn == next && begins_with(bytes_, 0, next_of_stream(0));
    if (torn == next) return is_part_of_next(bytes_.size(), false);
    const Bytes behind = next_of_stream(1);
    // Of more than this the frame would have been seen.
    const size_t most = torn == next + 1 ? std::min(bytes_.size(), kLength + kLeastMessage) : 0;
    for (size_t size = 0; size <= most; ++size) {
        const size_t at = bytes_.size() - size;
        if (is_part_of_next(at, true) && begins_with(bytes_, at, behind)) return true;
    }
    return false;
}

}  // namespace tavo::soak

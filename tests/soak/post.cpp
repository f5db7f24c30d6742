#include "soak/post.h"

#include <algorithm>
#include <cstring>

#include "soak/failure.h"
#include "soak/operations.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"
#include "tavo_osal/thread.h"

namespace tavo::soak {
namespace {

constexpr uint64_t kLookAgainMs = 5;

TAVO_Status attach_to(int32_t key, unsigned way, TAVO_INT64* handle) {
    std::string text = std::to_string(key);
    if (way % 3 == 0) return tavo_msg_queue_sender_init(text.data(), handle);
    if (way % 3 == 1) return tavo_msg_queue_init(key, handle);
    return tavo_msg_queue_init_with_flags(key, static_cast<int>(way), handle);
}

std::string named(const Header& header) {
    return "message " + std::to_string(header.number) + " of client " + std::to_string(header.slot) + "." +
           std::to_string(header.incarnation);
}

}  // namespace

bool Attachment::attach(unsigned way) {
    if (channel_.state != ChannelState::kOpen) return false;
    serial_ = channel_.serial;
    // In this order on both sides: either the channel is seen to be given up here, or this client is seen there.
    place_ = serial_;
    if (must_leave() || !succeeds(attach_to(channel_key(serial_), way, &handle_), "attaching")) {
        handle_ = 0;
        place_ = 0;
    }
    return is_attached();
}

void Attachment::detach() {
    if (!is_attached()) return;
    succeeds(tavo_msg_queue_destroy(handle_), "tavo_msg_queue_destroy");
    handle_ = 0;
    place_ = 0;
}

Sender::Sender(Client& client, unsigned channel)
    : client_(client),
      number_(channel),
      channel_(client.board.channels[channel]),
      attachment_(channel_, client.slot.sends_to[channel]) {}

bool Sender::find_link() {
    if (link_ != nullptr && link_serial_ == attachment_.serial()) return true;
    auto& links = channel_.links[client_.number];
    const auto free =
        std::find_if(links, links + kLinksOfASender, [](const Link& link) { return link.state == LinkState::kFree; });
    if (free == links + kLinksOfASender) return false;
    free->incarnation = client_.incarnation;
    free->intent = free->done = free->received = 0;
    free->torn = false;
    free->state = LinkState::kUsed;
    link_ = free;
    link_number_ = static_cast<uint32_t>(free - links);
    link_serial_ = attachment_.serial();
    return true;
}

void Sender::leave_if_told() {
    if (attachment_.is_attached() && attachment_.must_leave()) attachment_.detach();
}

bool Sender::is_ready() {
    leave_if_told();
    if (!attachment_.is_attached() && !attachment_.attach(client_.random.below(100))) return false;
    if (find_link()) return true;
    attachment_.detach();
    return false;
}

bool Sender::put(const Header& header, const Bytes& message) {
    Bytes copy = message;
    link_->intent = header.number;
    const auto size = static_cast<unsigned>(copy.size());
    const bool is_chosen = header.kind == Kind::kLetter && header.number % 50 == 7;
    if (is_chosen && client_.breaks("damage-message")) copy.back() ^= 1;
    if (!is_chosen || !client_.breaks("lose-message")) {
        const TAVO_Status status = client_.random.one_in(3)
                                       ? tavo_msg_queue_sendmessage(attachment_.handle(), size, copy.data())
                                       : tavo_msg_queue_put(attachment_.handle(), copy.data(), size);
        if (!succeeds(status, "putting a message")) return false;
    }
    link_->done = header.number;
    return true;
}

Header Sender::next_header() {
    const uint64_t number = link_->intent + 1;
    Header header = stream_header(link_serial_, client_.number, client_.incarnation, link_number_, number);
    if (is_stream(number_)) return header;
    const bool is_small = client_.random.below(4) != 0;
    header.size = client_.random.between(kLeastMessage, is_small ? 256 : kMostInOnePiece);
    return header;
}

void Sender::send_letter() {
    const Header header = next_header();
    const Bytes message = message_of(header);
    if (!put(header, message)) return;
    if (client_.breaks("duplicate-message") && header.number % 50 == 7) put(header, message);
}

bool Sender::send_bye() {
    if (!is_ready()) return false;
    Header header = next_header();
    header.kind = Kind::kBye;
    header.size = kLeastMessage;
    return put(header, message_of(header));
}

Receiver::Receiver(Client& client, unsigned channel)
    : board_(client.board),
      slot_(client.slot),
      number_(channel),
      channel_(client.board.channels[channel]),
      attachment_(channel_, client.slot.receives_from[channel]),
      random_(client.random.next()),
      buffer_(TAVO_MSG_QUEUE_MAX_SIZE) {}

bool Receiver::start() { return succeeds(tavo_osal_thread_create(&thread_, run, this), "starting a receiver"); }

void Receiver::join() { succeeds(tavo_osal_thread_join(thread_), "joining a receiver"); }

void* Receiver::run(void* self) {
    auto& receiver = *static_cast<Receiver*>(self);
    set_operation(is_stream(receiver.number_) ? "receiver of a stream" : "receiver of an inbox");
    receiver.serve();
    return nullptr;
}

void Receiver::serve() {
    for (;;) {
        const bool is_new = channel_.state == ChannelState::kOpen && channel_.serial != served_;
        if (is_new && attachment_.attach(random_.below(100))) {
            served_ = attachment_.serial();
            while (receive()) {
            }
            attachment_.detach();
        } else if (board_.phase == Phase::kLeave && !is_new) {
            return;
        } else {
            tavo_osal_thread_msleep(kLookAgainMs);
        }
    }
}

bool Receiver::receive() {
    // A queue that is always empty shows nobody waiting for room, nor killed while waiting.
    if (random_.one_in(is_stream(number_) ? 100 : 5000)) tavo_osal_thread_msleep(random_.below(100));
    unsigned size = 0;
    const TAVO_Status status = random_.one_in(3)
                                   ? tavo_msg_queue_receivemessage(attachment_.handle(), &size, buffer_.data())
                                   : tavo_msg_queue_get(attachment_.handle(), buffer_.data(), &size);
    if (!succeeds(status, "getting a message")) return false;
    Header header;
    if (!read_header(buffer_.data(), size, header) || header.size != size || header.serial != served_ ||
        !body_is_right(buffer_.data(), header)) {
        return take_torn(size);
    }
    if (header.kind == Kind::kRetire) return false;
    if (header.slot >= kClients || header.link >= kLinksOfASender) {
        fail("a message of nobody");
        return false;
    }
    return take(header);
}

bool Receiver::take(const Header& header) {
    Link& link = channel_.links[header.slot][header.link];
    if (link.state == LinkState::kFree || link.incarnation != header.incarnation) {
        fail(named(header) + " came after that client's next incarnation's");
        return true;
    }
    const uint64_t expected = link.received + 1;
    if (header.number != expected) {
        fail(named(header) + (header.number < expected ? " came twice" : " came, where the next one was to be ") +
             (header.number < expected ? "" : std::to_string(expected)));
    }
    link.received = header.number;
    if (header.number == 1) end_links_before(header.slot, link);
    slot_.messages.fetch_add(1);
    slot_.bytes.fetch_add(header.size);
    return header.kind != Kind::kBye;
}

// A queue keeps the order, so whatever came of a client's earlier incarnations has come.
void Receiver::end_links_before(unsigned slot, const Link& link) {
    for (Link& other : channel_.links[slot]) {
        // The coordinator may have seen to it already, and a next one taken it.
        LinkState dead = LinkState::kDead;
        if (&other != &link) other.state.compare_exchange_strong(dead, LinkState::kOver);
    }
}

// What is left of the message that a stream's sender was killed in: its beginning. What is written within the second
// completes it, and that can only be the message that has this receiver leave.
bool Receiver::take_torn(size_t size) {
    const auto links = channel_.links[is_stream(number_) ? sender_of(number_) : 0];
    const auto link =
        std::find_if(links, links + kLinksOfASender, [](const Link& l) { return l.state != LinkState::kFree; });
    if (!is_stream(number_) || link == links + kLinksOfASender) {
        fail("a damaged message of " + std::to_string(size) + " bytes");
        return true;
    }
    const Bytes expected = message_of(stream_header(served_, sender_of(number_), link->incarnation,
                                                    static_cast<uint32_t>(link - links), link->received + 1));
    const Bytes retire = frame_of(retire_header(served_));
    const size_t most = std::min(size, expected.size());
    const auto begin = buffer_.begin();
    const auto same = static_cast<size_t>(
        std::mismatch(begin, begin + static_cast<std::ptrdiff_t>(most), expected.begin()).first - begin);
    const bool ends_in_retire =
        size - same <= retire.size() && std::equal(begin + static_cast<std::ptrdiff_t>(same),
                                                   begin + static_cast<std::ptrdiff_t>(size), retire.begin());
    if (!ends_in_retire || link->torn.exchange(true)) {
        fail("a damaged message of " + std::to_string(size) + " bytes, right up to byte " + std::to_string(same) +
             ", where message " + std::to_string(link->received + 1) + " of " + std::to_string(expected.size()) +
             " bytes was to come");
        return true;
    }
    return same == size;
}

bool Post::start(Client& client) {
    for (unsigned i = 0; i < kInboxes; ++i) letters_[i] = std::make_unique<Sender>(client, i);
    stream_ = std::make_unique<Sender>(client, stream_of(client.number));
    inbox_ = std::make_unique<Receiver>(client, client.number);
    incoming_ = std::make_unique<Receiver>(client, stream_of((client.number + kClients - 1) % kClients));
    return inbox_->start() && incoming_->start();
}

void Post::leave_where_told() {
    for (const auto& sender : letters_) sender->leave_if_told();
    stream_->leave_if_told();
}

void Post::send_letters(Client& client) {
    Sender& sender = *letters_[client.random.below(kInboxes)];
    for (unsigned count = client.random.between(1, 32); count > 0 && sender.is_ready(); --count) sender.send_letter();
}

void Post::send_stream(Client& client) {
    for (unsigned count = client.random.between(1, 6); count > 0 && stream_->is_ready(); --count) {
        stream_->send_letter();
    }
}

void Post::leave_one(Client& client) {
    const unsigned which = client.random.below(kInboxes + 1);
    (which < kInboxes ? letters_[which] : stream_)->detach();
}

void Post::end(Client& client) {
    set_operation("saying goodbye");
    letters_[client.number]->send_bye();
    stream_->send_bye();
    inbox_->join();
    incoming_->join();
    for (const auto& sender : letters_) sender->detach();
    stream_->detach();
}

void send_letters(Client& client) { client.post.send_letters(client); }
void send_stream(Client& client) { client.post.send_stream(client); }
void leave_a_queue(Client& client) { client.post.leave_one(client); }

}  // namespace tavo::soak

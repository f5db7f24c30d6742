// Transactions of this process's.
#include <binder/Parcel.h>

#include <cerrno>

#include "../Forked.h"
#include "SocketDriver.h"

namespace android::socket_driver {
namespace {

bool isGone(int error) { return error == EPIPE || error == ECONNRESET; }

// A number that no other thread has, and that nobody can guess who does not know the process's own.
uint64_t nextChain(uint64_t instance) {
    static std::atomic<uint64_t> last{0};
    uint64_t number = instance + ++last * 0x9e3779b97f4a7c15;
    number = (number ^ number >> 30) * 0xbf58476d1ce4e5b9;
    number = (number ^ number >> 27) * 0x94d049bb133111eb;
    return number ^ number >> 31;
}

}  // namespace

status_t SocketDriver::transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    References::Route route;
    if (isForked()) return INVALID_OPERATION;
    if (reply != nullptr) reply->freeData();
    if (!references_.route(handle, route)) return BAD_TYPE;
    const status_t status = call(route, Purpose::kCalls, code, data, reply, flags);
    doErrandsWithoutPool();
    return status;
}

status_t SocketDriver::askDirectory(const std::shared_ptr<Link>& link, DirectoryCode code, const Parcel& data,
                                    Parcel& reply) {
    return call({link, kDirectoryNode}, Purpose::kDirectory, code, data, &reply, 0);
}

status_t SocketDriver::call(const References::Route& route, Purpose purpose, uint32_t code, const Parcel& data,
                            Parcel* reply, uint32_t flags) {
    if (route.link->dead()) return DEAD_OBJECT;
    OutgoingParcel out;
    status_t status = translator_.pack(data, *route.link, out);
    if (status != OK) return status;
    FrameHeader& header = out.frame.header;
    header.type = FrameType::kTransaction;
    header.code = code;
    header.flags = flags;
    header.target = route.node;
    header.chain = chain();

    // A oneway call is only accepted by the peer, not run, before it answers: nothing can come back.
    const bool oneway = (flags & IBinder::FLAG_ONEWAY) != 0;
    const Serving* back = oneway || purpose == Purpose::kDirectory ? nullptr : servingFor(*route.link);
    if (back == nullptr) return callOnChannel(route.link, purpose, out, oneway ? nullptr : reply);
    if (back->served != nullptr) back->served->mute();
    const Outcome outcome = exchange(route.link, back->channel, purpose, out, reply, status);
    if (outcome == Outcome::kAnswered) return status;
    route.link->cut();
    return DEAD_OBJECT;
}

status_t SocketDriver::callOnChannel(const std::shared_ptr<Link>& link, Purpose purpose, OutgoingParcel& out,
                                     Parcel* reply) {
    status_t status = OK;
    for (bool mayBeFresh = true;; mayBeFresh = false) {
        bool isRefused = false;
        {
            Link::Channel channel;
            status = link->takeChannel(purpose, mayBeFresh, channel);
            if (status == OK) {
                const Outcome outcome = exchange(link, channel.fd(), purpose, out, reply, status);
                if (outcome == Outcome::kAnswered) {
                    channel.endInOrder();
                    return status;
                }
                isRefused = outcome == Outcome::kUnheard && channel.isFresh();
                status = outcome == Outcome::kSilent ? TIMED_OUT : DEAD_OBJECT;
            }
        }
        if (isRefused) status = link->heedRefusal();
        if (status != NO_MEMORY || !mayBeFresh) break;
    }
    translator_.takeBack(*link, out);
    if (status != DEAD_OBJECT) return FAILED_TRANSACTION;
    link->cut();
    return DEAD_OBJECT;
}

// The transaction that this thread runs for the link's peer, whose own thread waits for it and can serve in turn.
const SocketDriver::Serving* SocketDriver::servingFor(const Link& link) {
    const Serving* serving = serving_;
    while (serving != nullptr && serving->link != &link) serving = serving->outer;
    return serving;
}

uint64_t SocketDriver::chain() const {
    static thread_local uint64_t own = 0;
    if (serving_ != nullptr) return serving_->chain;
    if (own == 0) own = nextChain(instance_);
    return own;
}

SocketDriver::Outcome SocketDriver::exchange(const std::shared_ptr<Link>& link, int channel, Purpose purpose,
                                             OutgoingParcel& out, Parcel* reply, status_t& status) {
    // A process that nobody can call need not listen for calls that come back to it.
    std::optional<CallChains::Waiting> waiting;
    const bool canBeCalled = references_.areGiven() || directory_.hasPublished();
    if (canBeCalled && purpose == Purpose::kCalls) waiting.emplace(chains_, out.frame.header.chain);

    size_t sent = 0;
    const int error = sendFrame(channel, out.frame, sent, 0);
    if (error != 0) {
        if (sent != 0 || isGone(error)) return Outcome::kUnheard;
        // Refused as a whole: a descriptor that is not open, or too many under way.
        translator_.takeBack(*link, out);
        status = FAILED_TRANSACTION;
        return Outcome::kAnswered;
    }

    FrameReader reader;
    UsedHandles answered;  // those of this thread's last reply
    for (bool heard = false;; heard = true) {
        Frame frame;
        const FrameReader::Result result = await(channel, reader, waiting, frame);
        answered.clear();
        if (result == FrameReader::Result::kReceipt) continue;
        if (result == FrameReader::Result::kClosed && !heard) return Outcome::kUnheard;
        if (result == FrameReader::Result::kAgain) return Outcome::kSilent;
        if (result != FrameReader::Result::kFrame) return Outcome::kLost;
        if (frame.header.type == FrameType::kReply) {
            status = takeReply(link, channel, frame, reply);
            return Outcome::kAnswered;
        }
        if (purpose != Purpose::kCalls || !serveBack(link, channel, frame, answered)) return Outcome::kLost;
    }
}

FrameReader::Result SocketDriver::await(int channel, FrameReader& reader, std::optional<CallChains::Waiting>& waiting,
                                        Frame& frame) {
    if (!waiting) return reader.read(channel, 0, frame);
    for (;;) {
        for (Arrival& arrival : waiting->wait(channel)) {
            serveArrival(arrival);
            arrival.channel->resume();
        }
        const FrameReader::Result result = reader.read(channel, MSG_DONTWAIT, frame);
        if (result != FrameReader::Result::kAgain) return result;
    }
}

status_t SocketDriver::takeReply(const std::shared_ptr<Link>& link, int channel, Frame& frame, Parcel* reply) {
    const auto status = static_cast<status_t>(frame.header.code);
    // What comes with an answer that nobody asked for is unpacked all the same, to be given back.
    Parcel unwanted;
    Parcel& target = reply != nullptr && status == OK ? *reply : unwanted;
    bool speaksOfOwn = false;
    const status_t unpacked = translator_.unpack(frame, link, target, &speaksOfOwn);
    if (unpacked == BAD_VALUE) {
        link->cut();
        return DEAD_OBJECT;
    }
    if (speaksOfOwn) {
        OutgoingFrame receipt;
        receipt.header.magic = kMagic;
        receipt.header.type = FrameType::kReceipt;
        size_t sent = 0;
        sendFrame(channel, receipt, sent, 0);
    }
    return status != OK ? status : unpacked;
}

}  // namespace android::socket_driver

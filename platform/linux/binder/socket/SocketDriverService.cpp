// Transactions of others'.
#include <binder/Parcel.h>
#include <sys/socket.h>
#include <utils/String8.h>

#include <cerrno>
#include <new>
#include <utility>

#include "SocketDriver.h"

namespace android::socket_driver {
namespace {

// How deep calls may be nested on one thread. A peer decides how often it calls back before it answers, so something
// must keep it from using up the stack.
constexpr size_t kMaxDepth = 256;

}  // namespace

bool SocketDriver::transactionArrived(Arrival arrival) {
    const FrameHeader& header = arrival.frame.header;
    if (arrival.channel->purpose() == Purpose::kDirectory) return serveDirectory(arrival);
    if ((header.flags & IBinder::FLAG_ONEWAY) != 0) return acceptOneway(arrival);
    if (chains_.handOver(arrival)) return false;
    if (keepsHouse_) {
        leaveToPool(std::move(arrival));
        return false;
    }
    serveArrival(arrival);
    return true;
}

void SocketDriver::channelClosed(ServedChannel& channel) {
    channel.link()->removeServed(channel.id);
    if (pool_.remove(channel.id) == nullptr) house_.remove(channel.id);
}

void SocketDriver::leaveToPool(Arrival arrival) {
    const Link* link = arrival.channel->link().get();
    const auto shared = std::make_shared<Arrival>(std::move(arrival));
    errands_->push({[this, shared] {
                        if (shared->channel->link()->dead()) return;
                        serveArrival(*shared);
                        shared->channel->resume();
                    },
                    false, link});
}

void SocketDriver::serveArrival(Arrival& arrival) {
    // A program may end its thread in the middle of a call; the caller is not to wait for ever.
    struct Unanswered {
        SocketDriver& driver;
        ServedChannel* channel;
        ~Unanswered() {
            if (channel == nullptr) return;
            driver.answer(*channel, FAILED_TRANSACTION, Parcel());
            channel->resume();
        }
    };
    ServedChannel& channel = *arrival.channel;
    const RunningCalls::Call running(running_);
    Unanswered unanswered{*this, &channel};
    const Serving serving{channel.link().get(), channel.fd(), &channel, arrival.frame.header.chain, serving_};
    Parcel data, reply;
    status_t status = OK;
    const bool served = serve(channel.link(), channel.caller(), arrival.frame, serving, data, reply, status);
    unanswered.channel = nullptr;
    if (served) {
        answer(channel, status, reply);
    } else {
        channel.link()->cut();
    }
}

// A call that comes back along the channel on which this thread waits. False when the link is of no more use.
bool SocketDriver::serveBack(const std::shared_ptr<Link>& link, int channel, Frame& frame, UsedHandles& handles) {
    // Nobody would run a oneway call once this thread has its reply.
    if ((frame.header.flags & IBinder::FLAG_ONEWAY) != 0) return false;
    const RunningCalls::Call running(running_);
    const Serving serving{link.get(), channel, nullptr, frame.header.chain, serving_};
    Parcel data, reply;
    status_t status = OK;
    if (!serve(link, link->peer(), frame, serving, data, reply, status)) return false;
    return answer(*link, status, reply, [&](const OutgoingFrame& outgoing, UsedHandles spokenOf) {
        size_t sent = 0;
        const int error = sendFrame(channel, outgoing, sent, 0);
        if (error == 0) handles = std::move(spokenOf);
        return sent != 0 && error != 0 ? EPIPE : error;
    });
}

// False when no well-meaning peer sends such a frame.
bool SocketDriver::serve(const std::shared_ptr<Link>& link, const Caller& caller, Frame& frame, const Serving& serving,
                         Parcel& data, Parcel& reply, status_t& status) {
    status = translator_.unpack(frame, link, data);
    if (status == BAD_VALUE) return false;
    if (status != OK) return true;
    const sp<BBinder> target = references_.find(*link, frame.header.target);
    if (target == nullptr || serving.depth > kMaxDepth) {
        status = FAILED_TRANSACTION;
    } else {
        status = run(target, caller, frame.header, data, reply, &serving);
    }
    return true;
}

status_t SocketDriver::run(const sp<BBinder>& target, const Caller& caller, const FrameHeader& header,
                           const Parcel& data, Parcel& reply, const Serving* serving) {
    struct Scope {
        const Serving* const outer;
        explicit Scope(const Serving* inner) : outer(std::exchange(serving_, inner)) {}
        ~Scope() { serving_ = outer; }
    };
    keepReader();
    const Scope scope(serving);
    return process_.execute(target, caller, header.code, data, &reply, header.flags);
}

// -- Oneway

bool SocketDriver::acceptOneway(Arrival& arrival) {
    ServedChannel& channel = *arrival.channel;
    const FrameHeader header = arrival.frame.header;
    auto data = std::make_unique<Parcel>();
    status_t status = translator_.unpack(arrival.frame, channel.link(), *data);
    if (status == BAD_VALUE) {
        channel.link()->cut();
        return false;
    }
    AsyncCall call{channel.link(), references_.find(*channel.link(), header.target), channel.caller(), header,
                   std::move(data)};
    const BBinder* target = call.target.get();
    if (target == nullptr) status = FAILED_TRANSACTION;
    auto admission = AsyncCalls::Admission::kRefused;
    if (status == OK) admission = asyncCalls_.admit(call);
    if (status == OK && admission == AsyncCalls::Admission::kRefused) status = FAILED_TRANSACTION;
    answer(channel, status, Parcel());

    if (admission == AsyncCalls::Admission::kRefused && keepsHouse_) {
        // Programs' objects, which may be in it, do not go away on this thread.
        errands_->push({[refused = std::make_shared<AsyncCall>(std::move(call))] {}, true});
    }
    if (admission != AsyncCalls::Admission::kQueuedFirst) return true;
    if (keepsHouse_) {
        errands_->push({[this, target] { runOneway(target); }});
        return true;
    }
    channel.resume();
    runOneway(target);
    return false;
}

void SocketDriver::runOneway(const BBinder* target) {
    // A program may end its thread in the middle of a call; the calls behind it are for another.
    struct Unfinished {
        SocketDriver& driver;
        const BBinder* target;
        ~Unfinished() {
            if (target == nullptr) return;
            driver.errands_->push({[this_driver = &driver, rest = target] { this_driver->runOneway(rest); }});
        }
    };
    Unfinished unfinished{*this, target};
    asyncCalls_.run(target, [this](AsyncCall& call) {
        const RunningCalls::Call running(running_);
        const AsyncCall own = std::move(call);  // what it holds goes away while the call still counts
        Parcel reply;
        run(own.target, own.caller, own.header, *own.data, reply, nullptr);
    });
    unfinished.target = nullptr;
}

// -- The directory

bool SocketDriver::serveDirectory(Arrival& arrival) {
    ServedChannel& channel = *arrival.channel;
    Parcel data, reply;
    const status_t unpacked = translator_.unpack(arrival.frame, channel.link(), data);
    const FrameHeader& header = arrival.frame.header;
    if (unpacked == BAD_VALUE || header.target != kDirectoryNode || (header.flags & IBinder::FLAG_ONEWAY) != 0) {
        channel.link()->cut();
        return false;
    }
    switch (header.code) {
        case kLookUp: {
            const String8 name(data.readString16());
            return serveLookUp(arrival, std::string(name.string(), name.size()));
        }
        case kIntroduce: {
            const status_t status = makeIntroduction(*channel.link(), static_cast<uint64_t>(data.readInt64()), reply);
            answer(channel, status, reply);
            return true;
        }
        default: answer(channel, UNKNOWN_TRANSACTION, reply); return true;
    }
}

bool SocketDriver::serveLookUp(Arrival& arrival, const std::string& name) {
    const sp<IBinder> service = directory_.published(name);
    const auto answerWith = [this, channel = arrival.channel, service] {
        Parcel reply;
        reply.writeStrongBinder(service);
        answer(*channel, OK, reply);
    };
    if (service == nullptr || service->localBinder() != nullptr) {
        answerWith();
        return true;
    }
    // Passing on somebody else's object takes a call to its owner, which is nothing for the housekeeper.
    errands_->push({[answerWith, channel = arrival.channel] {
                        try {
                            answerWith();
                        } catch (const std::bad_alloc&) {
                            channel->giveUp();
                        }
                        channel->resume();
                    },
                    true, arrival.channel->link().get()});
    return false;
}

// -- Replies

// False when the peer is gone.
template <typename Send>
bool SocketDriver::answer(Link& link, status_t status, const Parcel& reply, Send send) {
    OutgoingParcel out;
    if (status == OK) status = translator_.pack(reply, link, out);
    if (status != OK) out = OutgoingParcel();
    out.frame.header.magic = kMagic;
    out.frame.header.type = FrameType::kReply;
    out.frame.header.code = static_cast<uint32_t>(status);
    const int error = send(out.frame, std::move(out.handles));
    if (error == 0) return true;
    translator_.takeBack(link, out);
    if (error == EPIPE || error == ECONNRESET) return false;

    // The reply cannot be carried, for a descriptor that is not open or one too many. The caller must hear of it.
    OutgoingFrame refusal;
    refusal.header.magic = kMagic;
    refusal.header.type = FrameType::kReply;
    refusal.header.code = static_cast<uint32_t>(FAILED_TRANSACTION);
    return send(refusal, UsedHandles()) == 0;
}

void SocketDriver::answer(ServedChannel& channel, status_t status, const Parcel& reply) {
    const bool answered =
        answer(*channel.link(), status, reply, [&channel](const OutgoingFrame& frame, UsedHandles handles) {
            return channel.send(frame, std::move(handles));
        });
    // Where the peer is still there after all, it is not to wait for ever.
    if (!answered) shutdown(channel.fd(), SHUT_RDWR);
}

}  // namespace android::socket_driver

#include "SocketDriver.h"

#include <binder/Parcel.h>
#include <fcntl.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace android {

std::unique_ptr<Driver> openSocketDriver(Driver::Process& process) {
    socket_driver::RuntimeDirectory directory;
    if (socket_driver::RuntimeDirectory::open(directory) != OK) return nullptr;
    auto driver = std::make_unique<socket_driver::SocketDriver>(process, std::move(directory));
    if (!driver->valid()) return nullptr;
    return driver;
}

namespace socket_driver {
namespace {

constexpr std::chrono::milliseconds kQuiesceLimit{1000};

bool isUnixSocket(int fd, int type) {
    int value = 0;
    socklen_t size = sizeof value;
    if (getsockopt(fd, SOL_SOCKET, SO_DOMAIN, &value, &size) != 0 || value != AF_UNIX) return false;
    size = sizeof value;
    return getsockopt(fd, SOL_SOCKET, SO_TYPE, &value, &size) == 0 && value == type;
}

bool isGone(int error) { return error == EPIPE || error == ECONNRESET; }

}  // namespace

thread_local const SocketDriver::Serving* SocketDriver::serving_ = nullptr;
thread_local std::vector<const BBinder*> SocketDriver::queued_;

SocketDriver::SocketDriver(Process& process, RuntimeDirectory directory)
    : process_(process),
      translator_(references_, *this),
      directory_(*this, std::move(directory)),
      serviceManager_(new SocketServiceManager(directory_)) {}

status_t SocketDriver::requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) {
    return references_.mourn(handle, proxy);
}

void SocketDriver::joinThreadPool(bool isMain) {
    threads_.beginWait();
    threads_.joined(!isMain);
    for (;;) {
        std::shared_ptr<Endpoint> endpoint = poller_.wait();
        threads_.endWait();
        if (endpoint != nullptr) endpoint->onReady();
        endpoint.reset();
        for (const BBinder* target : std::exchange(queued_, {})) {
            asyncCalls_.run(target, [this](AsyncCall& call) {
                Parcel reply;
                run(call, *call.data, reply, nullptr);
            });
        }
        threads_.beginWait();
    }
}

void SocketDriver::quiesce() { running_.stop(kQuiesceLimit); }

// -- Links

std::shared_ptr<Link> SocketDriver::addLink(UniqueFd control, Caller peer, uint64_t instance) {
    auto link = std::make_shared<Link>(static_cast<LinkEvents&>(*this), std::move(control), peer, instance);
    return poller_.add(link, true) ? link : nullptr;
}

void SocketDriver::channelOffered(const std::shared_ptr<Link>& link, UniqueFd channel) {
    // Who made the channel is who calls on it: the kernel noted it when the pair was made.
    const Caller caller = peerOf(channel.get());
    const uint64_t id = poller_.reserveId();
    if (!isUnixSocket(channel.get(), SOCK_STREAM) || !link->addServed(id)) {
        link->cut();
        return;
    }
    auto served = std::make_shared<ServedChannel>(static_cast<TransactionServer&>(*this), poller_, link,
                                                  std::move(channel), caller);
    served->id = id;
    if (!poller_.add(served)) link->removeServed(id);
}

void SocketDriver::referencesReleased(Link& link, uint64_t node, uint64_t count) {
    references_.takeBack(link, node, count);
}

void SocketDriver::linkEnded(const std::shared_ptr<Link>& link) {
    link->cut();
    for (const uint64_t id : link->takeServed()) {
        // A thread may still run a transaction for the channel; it finds that nobody wants the reply.
        if (const std::shared_ptr<Endpoint> channel = poller_.remove(id)) shutdown(channel->fd(), SHUT_RDWR);
    }
    directory_.forget(link);
    poller_.remove(link->id);
    for (const wp<BpBinder>& mourner : references_.end(*link)) {
        if (const sp<BpBinder> proxy = mourner.promote()) proxy->sendObituary();
    }
}

void SocketDriver::channelClosed(ServedChannel& channel) {
    channel.link()->removeServed(channel.id);
    poller_.remove(channel.id);
}

void SocketDriver::peerMisbehaved(ServedChannel& channel) { linkEnded(channel.link()); }

status_t SocketDriver::introduce(const References::Route& route, UniqueFd& control) {
    Parcel data, reply;
    data.writeInt64(static_cast<int64_t>(route.node));
    const status_t status = call(route.link, kDirectoryNode, kIntroduce, data, &reply, 0);
    if (status != OK) return status;
    control.reset(fcntl(reply.readFileDescriptor(), F_DUPFD_CLOEXEC, 0));
    return control.valid() ? OK : FAILED_TRANSACTION;
}

std::shared_ptr<Link> SocketDriver::meet(UniqueFd control) {
    if (!isUnixSocket(control.get(), SOCK_SEQPACKET)) return nullptr;
    const Caller peer = peerOf(control.get());
    return addLink(std::move(control), peer, 0);
}

// -- Calling

status_t SocketDriver::transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    References::Route route;
    if (!references_.route(handle, route)) return BAD_TYPE;
    return call(route.link, route.node, code, data, reply, flags);
}

status_t SocketDriver::call(const std::shared_ptr<Link>& link, uint64_t node, uint32_t code, const Parcel& data,
                            Parcel* reply, uint32_t flags) {
    if (link->dead()) return DEAD_OBJECT;
    OutgoingParcel out;
    status_t status = translator_.pack(data, *link, out);
    if (status != OK) return status;
    FrameHeader& header = out.frame.header;
    header.type = FrameType::kTransaction;
    header.code = code;
    header.flags = flags;
    header.target = node;

    // A oneway call is only accepted by the peer, not run, before it answers: nothing can come back.
    const bool oneway = (flags & IBinder::FLAG_ONEWAY) != 0;
    const int back = oneway ? -1 : channelBackTo(*link);
    bool reusable = false;
    if (back >= 0) return exchange(link, back, out, reply, reusable);

    UniqueFd channel = link->takeChannel(status);
    if (!channel.valid()) {
        translator_.takeBack(*link, out);
        return status == DEAD_OBJECT ? lose(link) : status;
    }
    status = exchange(link, channel.get(), out, oneway ? nullptr : reply, reusable);
    link->returnChannel(std::move(channel), reusable);
    return status;
}

// The channel on which this thread serves the link's peer, whose own thread waits there and can serve in turn.
int SocketDriver::channelBackTo(const Link& link) {
    for (const Serving* serving = serving_; serving != nullptr; serving = serving->outer) {
        if (serving->link == &link) return serving->channel;
    }
    return -1;
}

status_t SocketDriver::exchange(const std::shared_ptr<Link>& link, int channel, OutgoingParcel& out, Parcel* reply,
                                bool& reusable) {
    size_t sent = 0;
    const int error = sendFrame(channel, out.frame, sent, 0);
    if (error != 0) {
        translator_.takeBack(*link, out);
        if (sent != 0 || isGone(error)) return lose(link);
        reusable = true;  // refused as a whole: a descriptor that is not open, or too many under way
        return FAILED_TRANSACTION;
    }

    const bool counts = serving_ != nullptr;
    if (counts) {
        threads_.beginCall();
        keepSpareThread();
    }
    status_t status = DEAD_OBJECT;
    FrameReader reader;
    for (Frame frame; reader.read(channel, 0, frame) == FrameReader::Result::kFrame;) {
        if (frame.header.type == FrameType::kReply) {
            reusable = true;
            status = takeReply(frame, link, reply);
            break;
        }
        // Oneway calls never come this way: nobody would run them once this thread has its reply.
        if ((frame.header.flags & IBinder::FLAG_ONEWAY) != 0) break;
        Parcel answerParcel;
        const status_t served = serve(link, link->peer(), channel, frame, answerParcel);
        const bool answered = answer(*link, served, answerParcel, [&](const OutgoingFrame& outgoing) {
            size_t count = 0;
            return sendFrame(channel, outgoing, count, 0);
        });
        if (!answered) break;
    }
    if (counts) threads_.endCall();
    return reusable ? status : lose(link);
}

status_t SocketDriver::takeReply(Frame& frame, const std::shared_ptr<Link>& link, Parcel* reply) {
    const auto status = static_cast<status_t>(frame.header.code);
    // What comes with an answer that nobody asked for is unpacked all the same, to be given back.
    Parcel unwanted;
    Parcel& target = reply != nullptr && status == OK ? *reply : unwanted;
    const status_t unpacked = translator_.unpack(frame, link, target);
    if (unpacked == BAD_VALUE) {
        linkEnded(link);
        return DEAD_OBJECT;
    }
    return status != OK ? status : unpacked;
}

status_t SocketDriver::lose(const std::shared_ptr<Link>& link) {
    link->cut();
    // Usually the poller has seen it as well, and a thread of the pool brings the news to those who asked for it.
    // Where there is neither, the rest is done here.
    if (!threads_.hasThreads() && !references_.anybodyMourns(*link)) linkEnded(link);
    return DEAD_OBJECT;
}

// -- Serving

void SocketDriver::transactionArrived(ServedChannel& channel, Frame& frame) {
    Parcel reply;
    const status_t status = serve(channel.link(), channel.caller(), channel.fd(), frame, reply);
    answer(*channel.link(), status, reply, [&](const OutgoingFrame& outgoing) { return channel.send(outgoing); });
}

status_t SocketDriver::serve(const std::shared_ptr<Link>& link, const Caller& caller, int channel, Frame& frame,
                             Parcel& reply) {
    const FrameHeader header = frame.header;
    auto data = std::make_unique<Parcel>();
    const status_t status = translator_.unpack(frame, link, *data);
    if (status == BAD_VALUE) linkEnded(link);
    if (status != OK) return status;

    if (header.target == kDirectoryNode) return serveDirectory(*link, header.code, *data, reply);
    AsyncCall call{references_.find(*link, header.target), caller, header.code, header.flags, nullptr};
    if (call.target == nullptr) return FAILED_TRANSACTION;
    if ((header.flags & IBinder::FLAG_ONEWAY) == 0) {
        const Serving serving{link.get(), channel, serving_};
        return run(call, *data, reply, &serving);
    }
    const BBinder* target = call.target.get();
    call.data = std::move(data);
    const AsyncCalls::Admission admission = asyncCalls_.admit(std::move(call));
    if (admission == AsyncCalls::Admission::kQueuedFirst) queued_.push_back(target);
    return admission == AsyncCalls::Admission::kRefused ? FAILED_TRANSACTION : OK;
}

status_t SocketDriver::run(const AsyncCall& call, const Parcel& data, Parcel& reply, const Serving* serving) {
    const RunningCalls::Call running(running_);
    keepSpareThread();
    const Serving* outer = std::exchange(serving_, serving);
    const status_t status = process_.execute(call.target, call.caller, call.code, data, &reply, call.flags);
    serving_ = outer;
    return status;
}

template <typename Send>
bool SocketDriver::answer(Link& link, status_t status, const Parcel& reply, Send send) {
    OutgoingParcel out;
    if (status == OK) status = translator_.pack(reply, link, out);
    if (status != OK) out = OutgoingParcel();
    out.frame.header.magic = kMagic;
    out.frame.header.type = FrameType::kReply;
    out.frame.header.code = static_cast<uint32_t>(status);
    const int error = send(out.frame);
    if (error == 0) return true;
    translator_.takeBack(link, out);
    if (isGone(error)) return false;

    // The reply cannot be carried, for a descriptor that is not open or one too many. The caller must hear of it.
    OutgoingFrame refusal;
    refusal.header.magic = kMagic;
    refusal.header.type = FrameType::kReply;
    refusal.header.code = static_cast<uint32_t>(FAILED_TRANSACTION);
    return send(refusal) == 0;
}

status_t SocketDriver::serveDirectory(Link& link, uint32_t code, const Parcel& data, Parcel& reply) {
    switch (code) {
        case kLookUp: {
            const String8 name(data.readString16());
            return reply.writeStrongBinder(directory_.published(std::string(name.string(), name.size())));
        }
        case kIntroduce: return makeIntroduction(link, static_cast<uint64_t>(data.readInt64()), reply);
        default: return UNKNOWN_TRANSACTION;
    }
}

status_t SocketDriver::makeIntroduction(Link& link, uint64_t node, Parcel& reply) {
    const sp<BBinder> object = references_.find(link, node);
    if (object == nullptr) return NAME_NOT_FOUND;
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) return -errno;
    UniqueFd own(ends[0]);
    UniqueFd passed(ends[1]);
    // Whoever will hold the other end is known by what it sends first.
    const int on = 1;
    setsockopt(own.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    const std::shared_ptr<Link> introduced = addLink(std::move(own), {0, static_cast<uid_t>(-1)}, 0);
    if (introduced == nullptr) return NO_MEMORY;
    // The node's number is the process's own, so it is the same on the new link.
    references_.give(*introduced, object);
    return reply.writeFileDescriptor(passed.release(), true);
}

void SocketDriver::keepSpareThread() {
    if (threads_.hasThreads() && threads_.wantsThread()) process_.spawnPooledThread();
}

}  // namespace socket_driver
}  // namespace android

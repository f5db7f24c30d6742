// How this process gets to know others, and what it leaves behind of those that are gone.
#include <binder/Parcel.h>
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>

#include "Frame.h"
#include "SocketDriver.h"

namespace android::socket_driver {
namespace {

bool isUnixSocket(int fd, int type) {
    int value = 0;
    socklen_t size = sizeof value;
    if (getsockopt(fd, SOL_SOCKET, SO_DOMAIN, &value, &size) != 0 || value != AF_UNIX) return false;
    size = sizeof value;
    return getsockopt(fd, SOL_SOCKET, SO_TYPE, &value, &size) == 0 && value == type;
}

}  // namespace

Greeting SocketDriver::greeting(ControlType type) const {
    Greeting greeting{};
    greeting.header = {kMagic, type};
    greeting.instance = instance_;
    greeting.maxChannels = Link::maxServedChannels();
    return greeting;
}

// Null when the peer is gone already, or the machine gives no more.
std::shared_ptr<Link> SocketDriver::addLink(UniqueFd control, const Greeting* welcome) {
    if (!startHousekeeper()) return nullptr;
    const Caller peer = peerOf(control.get());
    auto link = std::make_shared<Link>(static_cast<LinkEvents&>(*this), house_, std::move(control), peer);
    if (welcome != nullptr) {
        link->greet(*welcome);
        if (welcome->node != 0) link->setTemporary();
        const Greeting hello = greeting(ControlType::kHello);
        if (sendBytes(link->fd(), &hello, sizeof hello, {}, MSG_DONTWAIT) < 0) return nullptr;
    }
    return house_.add(link, Poller::kReadable) ? link : nullptr;
}

bool SocketDriver::addListener(const std::shared_ptr<Endpoint>& listener) {
    return startHousekeeper() && house_.add(listener, Poller::kReadable);
}

// -- LinkEvents

bool SocketDriver::channelOffered(const std::shared_ptr<Link>& link, Purpose purpose, UniqueFd channel) {
    // Who made the channel is who calls on it: the kernel noted it when the pair was made. A channel that its peer got
    // from somebody else would make that one call what he never meant to.
    Caller caller = peerOf(channel.get());
    if (!isUnixSocket(channel.get(), SOCK_STREAM) || caller.pid != link->peer().pid) return false;
    // A process of another pid namespace has no pid here that tells it from others.
    if (caller.pid <= 0) caller = link->peer();
    Poller& poller = purpose == Purpose::kDirectory ? house_ : pool_;
    const auto served = std::make_shared<ServedChannel>(static_cast<TransactionServer&>(*this), poller, link, purpose,
                                                        std::move(channel), caller);
    if (!link->addServed(served->id, purpose)) return false;
    if (served->start()) return true;
    link->removeServed(served->id);
    return false;
}

void SocketDriver::referencesReleased(Link& link, uint64_t node, uint64_t count) {
    sp<BBinder> dropped = references_.takeBack(link, node, count);
    if (dropped != nullptr) errands_->push({[dropped = std::move(dropped)] {}, true});
}

void SocketDriver::linkEnded(const std::shared_ptr<Link>& link) {
    link->cut();
    for (const uint64_t id : link->takeServed()) {
        std::shared_ptr<Endpoint> channel = pool_.remove(id);
        if (channel == nullptr) channel = house_.remove(id);
        // A thread may still run a transaction for the channel; it finds that nobody wants the reply.
        if (channel != nullptr) shutdown(channel->fd(), SHUT_RDWR);
    }
    directory_.forget(link);
    house_.remove(link->id);
    errands_->drop(*link);
    if (auto orphans = std::make_shared<std::vector<AsyncCall>>(asyncCalls_.orphan(*link)); !orphans->empty()) {
        errands_->push({[orphans = std::move(orphans)] {}, true});
    }

    References::Estate estate = references_.end(*link);
    if (!estate.objects.empty()) errands_->push({[objects = std::move(estate.objects)] {}, true});
    if (estate.mourners.empty()) return;
    errands_->push({[mourners = std::move(estate.mourners)] {
        for (const wp<BpBinder>& mourner : mourners) {
            if (const sp<BpBinder> proxy = mourner.promote()) proxy->sendObituary();
        }
    }});
}

// -- Introductions

status_t SocketDriver::introduce(const References::Route& route, UniqueFd& control) {
    Parcel data, reply;
    data.writeInt64(static_cast<int64_t>(route.node));
    const status_t status = askDirectory(route.link, kIntroduce, data, reply);
    if (status == OK) {
        control.reset(fcntl(reply.readFileDescriptor(), F_DUPFD_CLOEXEC, 0));
    } else if (status == DEAD_OBJECT) {
        // A connection to nobody: who gets it has a proxy of a dead object, as this process has.
        int ends[2];
        if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) return FAILED_TRANSACTION;
        control.reset(ends[0]);
        close(ends[1]);
    }
    return control.valid() ? OK : FAILED_TRANSACTION;
}

// Of the process that owns the object: makes a connection for a third one.
status_t SocketDriver::makeIntroduction(Link& link, uint64_t node, Parcel& reply) {
    const sp<BBinder> object = references_.find(link, node);
    if (object == nullptr) return NAME_NOT_FOUND;
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) return NO_MEMORY;
    UniqueFd own(ends[0]);
    UniqueFd passed(ends[1]);
    // Whoever will hold the other end is known by what it sends first.
    const int on = 1;
    setsockopt(own.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    const std::shared_ptr<Link> introduced = addLink(std::move(own), nullptr);
    if (introduced == nullptr || !link.addIntroduction(introduced)) return NO_MEMORY;
    Greeting welcome = greeting(ControlType::kWelcome);
    welcome.link = introduced->id;
    welcome.node = references_.give(*introduced, object);
    if (sendBytes(introduced->fd(), &welcome, sizeof welcome, {}, MSG_DONTWAIT) < 0) return NO_MEMORY;
    return reply.writeFileDescriptor(passed.release(), true);
}

bool SocketDriver::meet(UniqueFd control, sp<BBinder>& own, int32_t& handle) {
    if (!isUnixSocket(control.get(), SOCK_SEQPACKET)) return false;
    Greeting welcome{};
    iovec buffer{&welcome, sizeof welcome};
    std::vector<UniqueFd> descriptors;
    bool lost = false;
    const ssize_t size = receive(control.get(), &buffer, 1, MSG_DONTWAIT, descriptors, lost);
    const Caller peer = peerOf(control.get());
    if (size == 0) {
        handle = adoptDead();
        return true;
    }
    // It was there before the connection was passed on, and nobody but its maker can have put it there.
    if (size != sizeof welcome || welcome.header.magic != kMagic || welcome.header.type != ControlType::kWelcome ||
        welcome.node == 0) {
        return false;
    }
    if (welcome.instance == instance_ && peer.pid == getpid()) {
        const auto link = std::dynamic_pointer_cast<Link>(house_.find(welcome.link));
        if (link != nullptr) own = references_.find(*link, welcome.node);
        return own != nullptr;
    }
    if (peer.pid > 0) handle = references_.share({welcome.instance, peer.pid}, welcome.node);
    if (handle != 0) return true;
    const std::shared_ptr<Link> link = addLink(std::move(control), &welcome);
    handle = link != nullptr ? references_.adopt(link, welcome.node) : adoptDead();
    return true;
}

// A handle of an object whose process is gone, or cannot be reached.
int32_t SocketDriver::adoptDead() {
    const auto nobody = std::make_shared<Link>(static_cast<LinkEvents&>(*this), house_, UniqueFd(), Caller{-1, 0});
    nobody->cut();
    return references_.adopt(nobody, 1);
}

}  // namespace android::socket_driver

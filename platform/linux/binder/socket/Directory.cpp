#include "Directory.h"

#include <binder/Parcel.h>
#include <fcntl.h>
#include <sys/random.h>
#include <sys/socket.h>
#include <utils/String8.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <thread>

#include "Frame.h"
#include "Wire.h"

namespace android::socket_driver {
namespace {

// As long as the platform waits for a service that is not there yet.
constexpr std::chrono::milliseconds kServiceWait{5000};
constexpr std::chrono::milliseconds kServicePoll{50};

std::string toString(const String16& text) {
    const String8 utf8(text);
    return std::string(utf8.string(), utf8.size());
}

}  // namespace

Driver::Caller peerOf(int socket) {
    ucred credentials{};
    socklen_t size = sizeof credentials;
    if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return {0, static_cast<uid_t>(-1)};
    return {credentials.pid, credentials.uid};
}

// A published name's socket.
class Directory::Listener : public Endpoint {
public:
    Listener(Directory& directory, UniqueFd socket)
        : directory_(directory), socket_(std::move(socket)), spare_(open("/dev/null", O_RDONLY | O_CLOEXEC)) {}

    int fd() const override { return socket_.get(); }

    void onReady() override {
        for (;;) {
            UniqueFd connection(accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC));
            if (connection.valid()) {
                directory_.welcome(std::move(connection));
            } else if (errno == EMFILE || errno == ENFILE) {
                if (!turnAway()) return;
            } else if (errno != EINTR && errno != ECONNABORTED) {
                return;
            }
        }
    }

private:
    // Without descriptors left, nobody can be let in; but nobody is to wait at the door for ever either.
    bool turnAway() {
        const std::lock_guard<std::mutex> lock(mutex_);
        if (!spare_.valid()) return false;
        spare_.reset();
        UniqueFd connection(accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        const bool turnedAway = connection.valid();
        connection.reset();
        spare_.reset(open("/dev/null", O_RDONLY | O_CLOEXEC));
        return turnedAway;
    }

    Directory& directory_;
    const UniqueFd socket_;
    std::mutex mutex_;
    UniqueFd spare_;
};

Directory::Directory(Neighbourhood& neighbourhood, RuntimeDirectory directory)
    : neighbourhood_(neighbourhood), runtime_(std::move(directory)) {
    if (getrandom(&instance_, sizeof instance_, 0) != sizeof instance_) instance_ = static_cast<uint64_t>(getpid());
}

status_t Directory::publish(const std::string& name, const sp<IBinder>& service) {
    if (service == nullptr || !RuntimeDirectory::isValidName(name)) return BAD_VALUE;
    UniqueFd socket;
    FileId file;
    const status_t status = runtime_.publish(name, socket, file);
    if (status != OK) return status;

    const auto listener = std::make_shared<Listener>(*this, std::move(socket));
    sp<IBinder> previous;  // declared first: dropped without the lock
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        Publication& publication = publications_[name];
        if (publication.service != nullptr) neighbourhood_.poller().remove(publication.listener);
        previous = publication.service;
        listener->id = neighbourhood_.poller().reserveId();
        publication = {service, listener->id, file};
    }
    return neighbourhood_.poller().add(listener) ? OK : -errno;
}

sp<IBinder> Directory::published(const std::string& name) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto publication = publications_.find(name);
    return publication != publications_.end() ? publication->second.service : nullptr;
}

sp<IBinder> Directory::lookUp(const std::string& name) {
    if (!RuntimeDirectory::isValidName(name)) return nullptr;
    FileId file;
    if (!runtime_.identify(name, file)) return nullptr;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto publication = publications_.find(name);
        // The name may have gone to another process since.
        if (publication != publications_.end() && publication->second.file == file) return publication->second.service;
    }
    const std::shared_ptr<Link> link = linkTo(name);
    if (link == nullptr) return nullptr;
    Parcel data, reply;
    data.writeString16(String16(name.c_str(), name.size()));
    if (neighbourhood_.call(link, kDirectoryNode, kLookUp, data, &reply, 0) != OK) return nullptr;
    return reply.readStrongBinder();
}

void Directory::forget(const std::shared_ptr<Link>& link) {
    const std::lock_guard<std::mutex> lock(mutex_);
    links_.erase(std::remove(links_.begin(), links_.end(), link), links_.end());
}

void Directory::welcome(UniqueFd connection) {
    const Welcome greeting{{kMagic, ControlType::kWelcome}, instance_};
    const Driver::Caller peer = peerOf(connection.get());
    if (sendBytes(connection.get(), &greeting, sizeof greeting, {}, MSG_DONTWAIT) < 0) return;
    neighbourhood_.addLink(std::move(connection), peer, 0);
}

std::shared_ptr<Link> Directory::linkTo(const std::string& name) {
    UniqueFd connection;
    if (runtime_.connect(name, connection) != OK) return nullptr;
    Welcome greeting{};
    iovec buffer{&greeting, sizeof greeting};
    std::vector<UniqueFd> descriptors;
    bool lost = false;
    const ssize_t size = receive(connection.get(), &buffer, 1, 0, descriptors, lost);
    if (size != sizeof greeting || greeting.header.magic != kMagic || greeting.header.type != ControlType::kWelcome) {
        return nullptr;
    }
    // One link per process, whichever of its names was asked for: its objects are to have one handle each. The
    // process says itself who it is, so the kernel's word for its pid must agree.
    const Driver::Caller peer = peerOf(connection.get());
    const std::lock_guard<std::mutex> lock(mutex_);
    for (const std::shared_ptr<Link>& link : links_) {
        if (link->peerInstance() == greeting.instance && link->peer().pid == peer.pid && !link->dead()) return link;
    }
    std::shared_ptr<Link> link = neighbourhood_.addLink(std::move(connection), peer, greeting.instance);
    if (link != nullptr) links_.push_back(link);
    return link;
}

sp<IBinder> SocketServiceManager::getService(const String16& name) const {
    const auto end = std::chrono::steady_clock::now() + kServiceWait;
    for (;;) {
        const sp<IBinder> service = checkService(name);
        if (service != nullptr || std::chrono::steady_clock::now() >= end) return service;
        std::this_thread::sleep_for(kServicePoll);
    }
}

sp<IBinder> SocketServiceManager::checkService(const String16& name) const { return directory_.lookUp(toString(name)); }

status_t SocketServiceManager::addService(const String16& name, const sp<IBinder>& service, bool) {
    return directory_.publish(toString(name), service);
}

Vector<String16> SocketServiceManager::listServices() {
    Vector<String16> names;
    for (const std::string& name : directory_.list()) names.add(String16(name.c_str(), name.size()));
    return names;
}

}  // namespace android::socket_driver

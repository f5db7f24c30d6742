#include "Directory.h"

#include <binder/Parcel.h>
#include <sys/socket.h>

#include <algorithm>
#include <utility>

#include "../Forked.h"
#include "Frame.h"
#include "Listener.h"
#include "Wire.h"

namespace android::socket_driver {
namespace {

// How often a name may go from hand to hand during one look-up.
constexpr int kMaxAttempts = 100;

}  // namespace

Driver::Caller peerOf(int socket) {
    ucred credentials{};
    socklen_t size = sizeof credentials;
    if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return {-1, static_cast<uid_t>(-1)};
    return {credentials.pid, credentials.uid};
}

Directory::Directory(Neighbourhood& neighbourhood, RuntimeDirectory directory)
    : neighbourhood_(neighbourhood), runtime_(std::move(directory)) {}

status_t Directory::publish(const std::string& name, const sp<IBinder>& service) {
    if (service == nullptr || !RuntimeDirectory::isValidName(name)) return BAD_VALUE;
    if (isForked()) return INVALID_OPERATION;
    hasPublished_ = true;
    sp<IBinder> previous;  // declared first: dropped without the lock
    // Held from before the name is given until it is known here whose it is, or a look-up in between would take this
    // process for another.
    const std::lock_guard<std::mutex> lock(mutex_);
    RuntimeDirectory::Unnamed unnamed;
    status_t status = runtime_.listen(unnamed);
    if (status != OK) return status;
    const auto listener = std::make_shared<Listener>(std::move(unnamed.socket),
                                                     [this](UniqueFd connection) { welcome(std::move(connection)); });
    status = neighbourhood_.addListener(listener) ? runtime_.give(unnamed, name) : status_t{NO_MEMORY};
    if (status != OK) {
        neighbourhood_.removeListener(listener->id);
        runtime_.discard(unnamed);
        return status;
    }
    Publication& publication = publications_[name];
    if (publication.listener != nullptr) {
        publication.listener->finish();
        neighbourhood_.removeListener(publication.listener->id);
    }
    previous = std::exchange(publication, {service, listener, unnamed.file}).service;
    return OK;
}

sp<IBinder> Directory::published(const std::string& name) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto publication = publications_.find(name);
    return publication != publications_.end() ? publication->second.service : nullptr;
}

sp<IBinder> Directory::lookUp(const std::string& name) {
    if (!RuntimeDirectory::isValidName(name) || isForked()) return nullptr;
    for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
        if (sp<IBinder> service = lookUpHere(name)) return service;
        RuntimeDirectory::Found found;
        const status_t status = runtime_.connect(name, found);
        sp<IBinder> service = status == OK ? ask(name, std::move(found.connection)) : nullptr;
        if (service != nullptr) return service;
        // Whoever had the name is gone, or has just lost it to another.
        FileId now;
        if (!runtime_.identify(name, now) || now == found.file) return nullptr;
    }
    return nullptr;
}

// What this process published, if nobody else has taken the name since.
sp<IBinder> Directory::lookUpHere(const std::string& name) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto publication = publications_.find(name);
    FileId file;
    if (publication == publications_.end() || !runtime_.identify(name, file)) return nullptr;
    return publication->second.file == file ? publication->second.service : nullptr;
}

sp<IBinder> Directory::ask(const std::string& name, UniqueFd connection) {
    const std::shared_ptr<Link> link = linkThrough(std::move(connection));
    if (link == nullptr) return nullptr;
    Parcel data, reply;
    data.writeString16(String16(name.c_str(), name.size()));
    if (neighbourhood_.askDirectory(link, kLookUp, data, reply) != OK) return nullptr;
    return reply.readStrongBinder();
}

void Directory::forget(const std::shared_ptr<Link>& link) {
    const std::lock_guard<std::mutex> lock(mutex_);
    links_.erase(std::remove(links_.begin(), links_.end(), link), links_.end());
}

void Directory::welcome(UniqueFd connection) {
    const Greeting greeting = neighbourhood_.greeting(ControlType::kWelcome);
    if (sendBytes(connection.get(), &greeting, sizeof greeting, {}, MSG_DONTWAIT) < 0) return;
    neighbourhood_.addLink(std::move(connection), nullptr);
}

std::shared_ptr<Link> Directory::linkThrough(UniqueFd connection) {
    Greeting welcome{};
    iovec buffer{&welcome, sizeof welcome};
    std::vector<UniqueFd> descriptors;
    bool lost = false;
    const ssize_t size = receive(connection.get(), &buffer, 1, 0, descriptors, lost);
    if (size != sizeof welcome || welcome.header.magic != kMagic || welcome.header.type != ControlType::kWelcome) {
        return nullptr;
    }
    // One link per process will do, whichever of its names was asked for.
    const pid_t pid = peerOf(connection.get()).pid;
    const std::lock_guard<std::mutex> lock(mutex_);
    for (const std::shared_ptr<Link>& link : links_) {
        if (link->instance() == welcome.instance && link->peer().pid == pid && !link->dead()) return link;
    }
    welcome.node = 0;
    links_.reserve(links_.size() + 1);  // first: a link that is not noted would stay for nothing
    std::shared_ptr<Link> link = neighbourhood_.addLink(std::move(connection), &welcome);
    if (link != nullptr) links_.push_back(link);
    return link;
}

}  // namespace android::socket_driver

// Services by name: what this process publishes, and how it finds what others do.
#pragma once

#include <binder/IBinder.h>

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "Link.h"
#include "Poller.h"
#include "RuntimeDirectory.h"

namespace android::socket_driver {

class Listener;

// What the directory needs of the driver around it.
class Neighbourhood {
public:
    // The link at the other end of a control connection: with the peer's Welcome where this process connected, without
    // where the peer did. Null when it cannot be used.
    virtual std::shared_ptr<Link> addLink(UniqueFd control, const Greeting* welcome) = 0;
    virtual Greeting greeting(ControlType type) const = 0;
    virtual status_t askDirectory(const std::shared_ptr<Link>& link, DirectoryCode code, const Parcel& data,
                                  Parcel& reply) = 0;
    // The listener is told when somebody connects.
    virtual bool addListener(const std::shared_ptr<Endpoint>& listener) = 0;
    virtual void removeListener(uint64_t listener) = 0;

protected:
    ~Neighbourhood() = default;
};

// The credentials the kernel keeps with a connection.
Driver::Caller peerOf(int socket);

class Directory {
public:
    Directory(Neighbourhood& neighbourhood, RuntimeDirectory directory);

    status_t publish(const std::string& name, const sp<IBinder>& service);
    // What this process itself published; null for anything else.
    sp<IBinder> published(const std::string& name);
    bool hasPublished() const { return hasPublished_; }
    // Whoever holds the name now, this process or another; null when nobody does.
    sp<IBinder> lookUp(const std::string& name);
    std::vector<std::string> list() const { return runtime_.list(); }
    // A link is no longer to be used for look-ups.
    void forget(const std::shared_ptr<Link>& link);

private:
    struct Publication {
        sp<IBinder> service;
        std::shared_ptr<Listener> listener;
        FileId file;
    };

    void welcome(UniqueFd connection);
    sp<IBinder> lookUpHere(const std::string& name);
    sp<IBinder> ask(const std::string& name, UniqueFd connection);
    std::shared_ptr<Link> linkThrough(UniqueFd connection);

    Neighbourhood& neighbourhood_;
    const RuntimeDirectory runtime_;
    std::atomic<bool> hasPublished_{false};
    std::mutex mutex_;
    std::map<std::string, Publication> publications_;
    std::vector<std::shared_ptr<Link>> links_;  // that this process made by connecting
};

}  // namespace android::socket_driver

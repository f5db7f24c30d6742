// Services by name: what this process publishes, and how it finds what others do.
#pragma once

#include <binder/IServiceManager.h>

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "Link.h"
#include "Poller.h"
#include "RuntimeDirectory.h"

namespace android::socket_driver {

// What the directory needs of the driver around it.
class Neighbourhood {
public:
    virtual std::shared_ptr<Link> addLink(UniqueFd control, Driver::Caller peer, uint64_t instance) = 0;
    virtual status_t call(const std::shared_ptr<Link>& link, uint64_t node, uint32_t code, const Parcel& data,
                          Parcel* reply, uint32_t flags) = 0;
    virtual Poller& poller() = 0;

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
    // Whoever holds the name now, this process or another; null when nobody does.
    sp<IBinder> lookUp(const std::string& name);
    std::vector<std::string> list() const { return runtime_.list(); }
    // A link is no longer to be used for look-ups.
    void forget(const std::shared_ptr<Link>& link);

private:
    class Listener;
    struct Publication {
        sp<IBinder> service;
        uint64_t listener;
        FileId file;
    };

    void welcome(UniqueFd connection);
    std::shared_ptr<Link> linkTo(const std::string& name);

    Neighbourhood& neighbourhood_;
    const RuntimeDirectory runtime_;
    uint64_t instance_ = 0;
    std::mutex mutex_;
    std::map<std::string, Publication> publications_;
    std::vector<std::shared_ptr<Link>> links_;  // that this process made by connecting
};

// The service manager of a process that has no daemon to ask.
class SocketServiceManager : public BnServiceManager {
public:
    explicit SocketServiceManager(Directory& directory) : directory_(directory) {}

    sp<IBinder> getService(const String16& name) const override;
    sp<IBinder> checkService(const String16& name) const override;
    status_t addService(const String16& name, const sp<IBinder>& service, bool allowIsolated) override;
    Vector<String16> listServices() override;

private:
    Directory& directory_;
};

}  // namespace android::socket_driver

#include "ServiceRegistry.h"

#include <utility>
#include <vector>

namespace android {

sp<IBinder> ServiceRegistry::checkService(const String16& name) const {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto service = services_.find(name);
    return service != services_.end() ? service->second : nullptr;
}

status_t ServiceRegistry::addService(const String16& name, const sp<IBinder>& service, bool) {
    if (name.size() == 0 || name.size() > kMaxNameLength || service == nullptr) return BAD_VALUE;
    sp<IBinder> replaced;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        const auto known = services_.find(name);
        if (known == services_.end() && services_.size() >= kMaxNames) return NO_MEMORY;
        // Each name has a link of its own, also where several stand for one object.
        const status_t status = service->linkToDeath(this);
        if (status != OK && service->localBinder() == nullptr) return status;
        if (known != services_.end()) {
            replaced = std::exchange(known->second, service);
        } else {
            services_.emplace(name, service);
        }
    }
    if (replaced != nullptr) replaced->unlinkToDeath(this);
    return OK;
}

Vector<String16> ServiceRegistry::listServices() {
    Vector<String16> names;
    const std::lock_guard<std::mutex> lock(mutex_);
    for (const auto& [name, service] : services_) names.add(name);
    return names;
}

void ServiceRegistry::binderDied(const wp<IBinder>& who) {
    std::vector<sp<IBinder>> dropped;  // only when the lock is given back
    const std::lock_guard<std::mutex> lock(mutex_);
    for (auto service = services_.begin(); service != services_.end();) {
        if (who != service->second) {
            ++service;
            continue;
        }
        dropped.push_back(std::move(service->second));
        service = services_.erase(service);
    }
}

}  // namespace android

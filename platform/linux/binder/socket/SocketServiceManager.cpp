#include "SocketServiceManager.h"

#include <utils/String8.h>

#include "../ServiceWait.h"

namespace android::socket_driver {
namespace {

// As on the platform, in UTF-16 units. A name of many that take three bytes is still too long for a file.
constexpr size_t kMaxNameLength = 127;

std::string toString(const String16& text) {
    const String8 utf8(text);
    return std::string(utf8.string(), utf8.size());
}

}  // namespace

sp<IBinder> SocketServiceManager::getService(const String16& name) const {
    return waitForService(name, [this, &name](sp<IBinder>* service) {
        *service = checkService(name);
        return status_t{OK};
    });
}

sp<IBinder> SocketServiceManager::checkService(const String16& name) const {
    return name.size() <= kMaxNameLength ? directory_.lookUp(toString(name)) : nullptr;
}

status_t SocketServiceManager::addService(const String16& name, const sp<IBinder>& service, bool) {
    return name.size() <= kMaxNameLength ? directory_.publish(toString(name), service) : status_t{BAD_VALUE};
}

Vector<String16> SocketServiceManager::listServices() {
    Vector<String16> names;
    for (const std::string& name : directory_.list()) names.add(String16(name.c_str(), name.size()));
    return names;
}

}  // namespace android::socket_driver

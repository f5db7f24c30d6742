// Which object goes by which name.
#pragma once

#include <binder/IServiceManager.h>

#include <map>
#include <mutex>

namespace android {

// Answers at once: whoever wants to wait for a service does so itself. What is asked may be anything, and by
// anybody who can open the device.
class ServiceRegistry : public BnServiceManager, public IBinder::DeathRecipient {
public:
    // In UTF-16 units, as on the platform.
    static constexpr size_t kMaxNameLength = 127;
    // So that nobody can have all the memory.
    static constexpr size_t kMaxNames = 10000;

    sp<IBinder> getService(const String16& name) const override { return checkService(name); }
    sp<IBinder> checkService(const String16& name) const override;
    // BAD_VALUE for a name that is empty or too long and for a null service, DEAD_OBJECT for one whose process died,
    // NO_MEMORY for a name too many.
    status_t addService(const String16& name, const sp<IBinder>& service, bool allowIsolated) override;
    // In alphabetical order.
    Vector<String16> listServices() override;

private:
    void binderDied(const wp<IBinder>& who) override;

    mutable std::mutex mutex_;
    std::map<String16, sp<IBinder>> services_;
};

}  // namespace android

// An object of another process, known here by its handle.
#pragma once

#include <binder/IBinder.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

namespace android {

class AttachedObjects;

class LIBBINDER_EXPORT BpBinder : public IBinder {
public:
    // Programs get theirs from ProcessState::getStrongProxyForHandle, which makes one per handle.
    explicit BpBinder(int32_t handle);
    BpBinder(const BpBinder&) = delete;
    BpBinder& operator=(const BpBinder&) = delete;

    int32_t handle() const { return mHandle; }

    const String16& getInterfaceDescriptor() const override;
    bool isBinderAlive() const override;
    status_t pingBinder() override;
    status_t dump(int fd, const Vector<String16>& args) override;

    // Once a call has come back with DEAD_OBJECT, every further one does so at once.
    status_t transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) override;

    status_t linkToDeath(const sp<DeathRecipient>& recipient, void* cookie = nullptr, uint32_t flags = 0) override;
    status_t unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie = nullptr, uint32_t flags = 0,
                           wp<DeathRecipient>* outRecipient = nullptr) override;

    void attachObject(const void* objectID, void* object, void* cleanupCookie, object_cleanup_func func) override;
    void* findObject(const void* objectID) const override;
    void detachObject(const void* objectID) override;

    BpBinder* remoteBinder() override;

    // The driver's news that the object's process died: tells every recipient, once.
    void sendObituary();

protected:
    ~BpBinder() override;

private:
    friend class ProcessState;

    struct Link {
        wp<DeathRecipient> recipient;
        void* cookie;
        uint32_t flags;
    };

    // Behind handle 0 is whoever is the service manager at the moment, which may be nobody for a while.
    bool mayReturn() const { return mHandle == 0; }
    // Takes the driver's death notification back when any is wanted. ProcessState calls it while this object is
    // still the handle's one proxy, so that it cannot hit the notification of the next one.
    void cancelDeathNotification();

    const int32_t mHandle;
    std::atomic<bool> mAlive{true};
    // Keeps requests to the driver in the order of the links that caused them. Never held by sendObituary.
    std::mutex mNotificationLock;
    mutable std::mutex mLock;
    bool mObituarySent = false;
    std::vector<Link> mLinks;
    mutable std::atomic<bool> mDescriptorKnown{false};
    mutable String16 mDescriptor;
    const std::unique_ptr<AttachedObjects> mAttached;
};

}  // namespace android

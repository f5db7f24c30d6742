// The base of objects that live in this process, and of the proxies' interface classes.
#pragma once

#include <binder/IBinder.h>

#include <atomic>

namespace android {

class AttachedObjects;

class LIBBINDER_EXPORT BBinder : public IBinder {
public:
    BBinder();
    BBinder(const BBinder&) = delete;
    BBinder& operator=(const BBinder&) = delete;

    const String16& getInterfaceDescriptor() const override;
    bool isBinderAlive() const override;
    status_t pingBinder() override;
    status_t dump(int fd, const Vector<String16>& args) override;

    // Answers a ping; everything else goes to onTransact. Both parcels are read from their beginning.
    status_t transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) override;

    status_t linkToDeath(const sp<DeathRecipient>& recipient, void* cookie = nullptr, uint32_t flags = 0) override;
    status_t unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie = nullptr, uint32_t flags = 0,
                           wp<DeathRecipient>* outRecipient = nullptr) override;

    void attachObject(const void* objectID, void* object, void* cleanupCookie, object_cleanup_func func) override;
    void* findObject(const void* objectID) const override;
    void detachObject(const void* objectID) override;

    BBinder* localBinder() override;

protected:
    ~BBinder() override;

    // A transaction of the object's interface. This one answers interface and dump requests, and refuses
    // the rest with UNKNOWN_TRANSACTION. reply is null in a oneway transaction of the same process.
    virtual status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0);

private:
    // Made for the first object that is attached: almost no binder has any.
    std::atomic<AttachedObjects*> mAttached{nullptr};
};

// The base of BpInterface: keeps the object that the proxy speaks to.
class LIBBINDER_EXPORT BpRefBase : public virtual RefBase {
protected:
    explicit BpRefBase(const sp<IBinder>& o);
    ~BpRefBase() override;
    BpRefBase(const BpRefBase&) = delete;
    BpRefBase& operator=(const BpRefBase&) = delete;

    IBinder* remote() { return mRemote.get(); }
    IBinder* remote() const { return mRemote.get(); }

private:
    const sp<IBinder> mRemote;
};

}  // namespace android

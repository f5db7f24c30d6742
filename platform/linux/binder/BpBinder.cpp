#include <binder/BpBinder.h>
#include <binder/IPCThreadState.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>

#include <algorithm>
#include <utility>

#include "AttachedObjects.h"
#include "Driver.h"

namespace android {

BpBinder::BpBinder(int32_t handle) : mHandle(handle), mAttached(std::make_unique<AttachedObjects>()) {
    if (Driver* driver = ProcessState::driver()) driver->acquire(mHandle);
}

BpBinder::~BpBinder() {
    // Before the handle is given back: its number may then come to mean another object.
    ProcessState::instance()->expungeHandle(mHandle, this);
    if (Driver* driver = ProcessState::driver()) driver->release(mHandle);
}

const String16& BpBinder::getInterfaceDescriptor() const {
    static const String16& kUnknown = *new String16;
    if (mDescriptorKnown.load(std::memory_order_acquire)) return mDescriptor;
    Parcel data, reply;
    const status_t status = const_cast<BpBinder*>(this)->transact(INTERFACE_TRANSACTION, data, &reply);
    if (status != NO_ERROR) return kUnknown;
    const std::lock_guard<std::mutex> lock(mLock);
    // Once known it never changes, because callers hold references to it.
    if (!mDescriptorKnown.load(std::memory_order_relaxed)) {
        mDescriptor = reply.readString16();
        mDescriptorKnown.store(true, std::memory_order_release);
    }
    return mDescriptor;
}

bool BpBinder::isBinderAlive() const { return mAlive.load(std::memory_order_acquire); }

status_t BpBinder::pingBinder() {
    Parcel data, reply;
    status_t status = transact(PING_TRANSACTION, data, &reply);
    if (status != NO_ERROR) return status;
    int32_t result = 0;
    status = reply.readInt32(&result);
    return status == NO_ERROR ? result : status;
}

status_t BpBinder::dump(int fd, const Vector<String16>& args) {
    Parcel data, reply;
    data.writeFileDescriptor(fd);
    data.writeInt32(static_cast<int32_t>(args.size()));
    for (const String16& arg : args) data.writeString16(arg);
    return transact(DUMP_TRANSACTION, data, &reply);
}

status_t BpBinder::transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    if (!isBinderAlive()) return DEAD_OBJECT;
    const status_t status = IPCThreadState::self()->transact(mHandle, code, data, reply, flags);
    if (status == DEAD_OBJECT && !mayReturn()) mAlive.store(false, std::memory_order_release);
    return status;
}

status_t BpBinder::linkToDeath(const sp<DeathRecipient>& recipient, void* cookie, uint32_t flags) {
    if (recipient == nullptr) return BAD_VALUE;
    Driver* driver = ProcessState::driver();
    if (driver == nullptr) return NO_INIT;
    const std::lock_guard<std::mutex> notification(mNotificationLock);
    bool first = false;
    {
        const std::lock_guard<std::mutex> lock(mLock);
        if (mObituarySent) return DEAD_OBJECT;
        first = mLinks.empty();
        mLinks.push_back({recipient, cookie, flags});
    }
    const status_t status = first ? driver->requestDeathNotification(mHandle, this) : NO_ERROR;
    if (status != NO_ERROR) {
        const std::lock_guard<std::mutex> lock(mLock);
        mLinks.clear();
    }
    return status;
}

status_t BpBinder::unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie, uint32_t flags,
                                 wp<DeathRecipient>* outRecipient) {
    const auto matches = [&](const Link& link) {
        const bool same = recipient == nullptr ? link.cookie == cookie : link.recipient == recipient;
        return same && link.flags == flags;
    };
    const std::lock_guard<std::mutex> notification(mNotificationLock);
    bool last = false;
    {
        const std::lock_guard<std::mutex> lock(mLock);
        if (mObituarySent) return DEAD_OBJECT;
        const auto link = std::find_if(mLinks.begin(), mLinks.end(), matches);
        if (link == mLinks.end()) return NAME_NOT_FOUND;
        if (outRecipient != nullptr) *outRecipient = link->recipient;
        mLinks.erase(link);
        last = mLinks.empty();
    }
    Driver* driver = ProcessState::driver();
    if (last && driver != nullptr) driver->clearDeathNotification(mHandle);
    return NO_ERROR;
}

void BpBinder::cancelDeathNotification() {
    bool wanted = false;
    {
        const std::lock_guard<std::mutex> lock(mLock);
        wanted = !mLinks.empty();
    }
    Driver* driver = ProcessState::driver();
    if (wanted && driver != nullptr) driver->clearDeathNotification(mHandle);
}

void BpBinder::sendObituary() {
    mAlive.store(mayReturn(), std::memory_order_release);
    std::vector<Link> links;
    {
        const std::lock_guard<std::mutex> lock(mLock);
        mObituarySent = !mayReturn();
        links = std::exchange(mLinks, {});
    }
    for (const Link& link : links) {
        const sp<DeathRecipient> recipient = link.recipient.promote();
        if (recipient != nullptr) recipient->binderDied(this);
    }
}

void BpBinder::attachObject(const void* objectID, void* object, void* cleanupCookie, object_cleanup_func func) {
    mAttached->attach(objectID, object, cleanupCookie, func);
}

void* BpBinder::findObject(const void* objectID) const { return mAttached->find(objectID); }
void BpBinder::detachObject(const void* objectID) { mAttached->detach(objectID); }
BpBinder* BpBinder::remoteBinder() { return this; }

}  // namespace android

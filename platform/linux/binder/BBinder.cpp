#include <binder/Binder.h>
#include <binder/Parcel.h>

#include <memory>

#include "AttachedObjects.h"

namespace android {

BBinder::BBinder() = default;
BBinder::~BBinder() { delete mAttached.load(std::memory_order_acquire); }

const String16& BBinder::getInterfaceDescriptor() const {
    static const String16& kNone = *new String16;  // outlives every object that may be asked while the process exits
    return kNone;
}

bool BBinder::isBinderAlive() const { return true; }
status_t BBinder::pingBinder() { return NO_ERROR; }
status_t BBinder::dump(int, const Vector<String16>&) { return NO_ERROR; }
BBinder* BBinder::localBinder() { return this; }

status_t BBinder::transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    Parcel unwanted;
    if (reply == nullptr) reply = &unwanted;
    data.setDataPosition(0);
    const status_t status =
        code == PING_TRANSACTION ? reply->writeInt32(pingBinder()) : onTransact(code, data, reply, flags);
    reply->setDataPosition(0);
    return status;
}

status_t BBinder::onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t) {
    switch (code) {
        case INTERFACE_TRANSACTION: return reply->writeString16(getInterfaceDescriptor());
        case DUMP_TRANSACTION: {
            const int fd = data.readFileDescriptor();
            if (fd < 0) return BAD_TYPE;
            Vector<String16> args;
            String16 arg;
            for (int32_t count = data.readInt32(); count > 0 && data.readString16(&arg) == NO_ERROR; --count) {
                args.add(arg);
            }
            return dump(fd, args);
        }
        default: return UNKNOWN_TRANSACTION;
    }
}

status_t BBinder::linkToDeath(const sp<DeathRecipient>&, void*, uint32_t) { return INVALID_OPERATION; }

status_t BBinder::unlinkToDeath(const wp<DeathRecipient>&, void*, uint32_t, wp<DeathRecipient>*) {
    return INVALID_OPERATION;
}

void BBinder::attachObject(const void* objectID, void* object, void* cleanupCookie, object_cleanup_func func) {
    AttachedObjects* attached = mAttached.load(std::memory_order_acquire);
    if (attached == nullptr) {
        auto made = std::make_unique<AttachedObjects>();
        if (mAttached.compare_exchange_strong(attached, made.get(), std::memory_order_acq_rel)) {
            attached = made.release();
        }
    }
    attached->attach(objectID, object, cleanupCookie, func);
}

void* BBinder::findObject(const void* objectID) const {
    const AttachedObjects* attached = mAttached.load(std::memory_order_acquire);
    return attached != nullptr ? attached->find(objectID) : nullptr;
}

void BBinder::detachObject(const void* objectID) {
    AttachedObjects* attached = mAttached.load(std::memory_order_acquire);
    if (attached != nullptr) attached->detach(objectID);
}

BpRefBase::BpRefBase(const sp<IBinder>& o) : mRemote(o) {}
BpRefBase::~BpRefBase() = default;

}  // namespace android

// What every binder object can do, wherever it lives: in this process (BBinder) or in another (BpBinder).
#pragma once

#include <binder/Export.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/Vector.h>

#include <cstdint>

// The kernel's header has the same macro, to the blank; either may be included first.
// clang-format off
#ifndef B_PACK_CHARS
#define B_PACK_CHARS(c1, c2, c3, c4) \
	((((c1)<<24)) | (((c2)<<16)) | (((c3)<<8)) | (c4))
#endif
// clang-format on

namespace android {

class BBinder;
class BpBinder;
class IInterface;
class Parcel;

class LIBBINDER_EXPORT IBinder : public virtual RefBase {
public:
    enum {
        // An interface's own transactions are numbered from the first to the last.
        FIRST_CALL_TRANSACTION = 0x00000001,
        LAST_CALL_TRANSACTION = 0x00ffffff,

        // Every object answers these.
        PING_TRANSACTION = B_PACK_CHARS('_', 'P', 'N', 'G'),
        DUMP_TRANSACTION = B_PACK_CHARS('_', 'D', 'M', 'P'),
        INTERFACE_TRANSACTION = B_PACK_CHARS('_', 'N', 'T', 'F'),
        SYSPROPS_TRANSACTION = B_PACK_CHARS('_', 'S', 'P', 'R'),

        // The caller does not wait, and there is no reply.
        FLAG_ONEWAY = 0x00000001
    };

    IBinder();

    // The object itself when it implements the interface in this process, otherwise null.
    virtual sp<IInterface> queryLocalInterface(const String16& descriptor);
    // Asks the object's process the first time; empty when that fails.
    virtual const String16& getInterfaceDescriptor() const = 0;

    // False once the object's process is known to have died. True proves nothing.
    virtual bool isBinderAlive() const = 0;
    virtual status_t pingBinder() = 0;
    // Has the object describe itself on a descriptor, which stays the caller's.
    virtual status_t dump(int fd, const Vector<String16>& args) = 0;

    // Calls the object. Returns what its onTransact returned, or DEAD_OBJECT, FAILED_TRANSACTION and the like when
    // it was not reached; then the reply is empty. reply may be null.
    virtual status_t transact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) = 0;

    class LIBBINDER_EXPORT DeathRecipient : public virtual RefBase {
    public:
        // Called once, on a thread of the pool, with no lock held.
        virtual void binderDied(const wp<IBinder>& who) = 0;
    };

    // Has the recipient told when the object's process dies. The link does not keep the recipient alive.
    // DEAD_OBJECT when that has happened already; INVALID_OPERATION for an object of this process, which
    // cannot outlive it.
    virtual status_t linkToDeath(const sp<DeathRecipient>& recipient, void* cookie = nullptr, uint32_t flags = 0) = 0;
    // Takes the first such link back: the one with this recipient, or with a null recipient the one with this
    // cookie; the flags must match. NAME_NOT_FOUND when there is none, DEAD_OBJECT when the object is dead.
    virtual status_t unlinkToDeath(const wp<DeathRecipient>& recipient, void* cookie = nullptr, uint32_t flags = 0,
                                   wp<DeathRecipient>* outRecipient = nullptr) = 0;

    virtual bool checkSubclass(const void* subclassID) const;

    // A program's own data on an object, one per id. func is called with it when the object goes away; detachObject
    // does not call it. An id that is taken keeps what it has.
    typedef void (*object_cleanup_func)(const void* id, void* obj, void* cleanupCookie);
    virtual void attachObject(const void* objectID, void* object, void* cleanupCookie, object_cleanup_func func) = 0;
    virtual void* findObject(const void* objectID) const = 0;
    virtual void detachObject(const void* objectID) = 0;

    // This object as what it is; the other one is null.
    virtual BBinder* localBinder();
    virtual BpBinder* remoteBinder();

protected:
    ~IBinder() override;
};

}  // namespace android

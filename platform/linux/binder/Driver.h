// What carries transactions between processes, behind one small interface.
//
// Everything above a driver (Parcel, BBinder, BpBinder, ProcessState, IPCThreadState) is the same for all of
// them. A driver moves parcels, knows which process holds which object, and tells when one died.
//
// Flat objects. In an outgoing parcel a flat_binder_object speaks the sender's language and in an incoming
// one the receiver's; translating is the driver's work:
//   BINDER_TYPE_BINDER  an object of this process: cookie is its BBinder*, binder its weak reference block;
//                       both are 0 for a null binder
//   BINDER_TYPE_HANDLE  an object of another process: handle is this process's number for it, 1 and up
//   BINDER_TYPE_FD      handle is a descriptor of this process; in an incoming parcel it is a new one
#pragma once

#include <binder/IBinder.h>
#include <sys/types.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>

#include <cstddef>
#include <cstdint>
#include <memory>

namespace android {

class BBinder;
class BpBinder;
class Parcel;

class LIBBINDER_EXPORT Driver {
public:
    // The most bytes of data, and the most bytes of anything else, that one parcel may hold.
    static constexpr size_t kParcelLimit = size_t{1024} * 1024;

    // Who called, as the kernel says, not as the caller says.
    struct Caller {
        pid_t pid;
        uid_t uid;
    };

    // What a driver asks of the process it serves.
    class LIBBINDER_EXPORT Process {
    public:
        // Runs a transaction on the calling thread: makes the caller known to IPCThreadState for as long as it
        // lasts and calls target's transact. For a oneway transaction reply is a parcel nobody will see.
        virtual status_t execute(const sp<BBinder>& target, const Caller& caller, uint32_t code, const Parcel& data,
                                 Parcel* reply, uint32_t flags) = 0;
        // Starts one more thread that calls joinThreadPool(false). False when there is none to be had.
        virtual bool spawnPooledThread() = 0;

    protected:
        ~Process() = default;
    };

    // The driver that suits this machine: $BINDER_DRIVER names one, otherwise the kernel's where there is one, and
    // sockets where there is none. `process` outlives the driver.
    static std::unique_ptr<Driver> open(Process& process);

    virtual ~Driver() = default;

    // Sends data to the object behind handle and, unless flags hold IBinder::FLAG_ONEWAY, waits for the reply.
    // Returns the status of the object's transact, or the driver's own:
    //   DEAD_OBJECT         the object's process is gone, before or during the call
    //   FAILED_TRANSACTION  the parcel or the reply cannot be carried (too large, an invalid descriptor, ...)
    //   BAD_TYPE            no such handle
    //   INVALID_OPERATION   this process is a copy, made by fork, of one that had the driver open
    // reply may be null; on any failure it stays empty. No lock is held while waiting. A received parcel's buffer is
    // attached with Parcel::ipcSetDataReference; its release function gives back everything that came in
    // it: references, descriptors and memory.
    virtual status_t transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) = 0;

    // A handle in a received parcel is valid until the parcel's buffer is released. acquire keeps it valid for
    // longer; each call is paid back by one release. BpBinder holds one.
    virtual void acquire(int32_t handle) = 0;
    virtual void release(int32_t handle) = 0;

    // Asks for proxy->sendObituary(), once, on a pool thread, when the process of the object behind handle dies.
    // DEAD_OBJECT when that has happened already and is known here; otherwise it is told all the same.
    virtual status_t requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) = 0;
    virtual status_t clearDeathNotification(int32_t handle) = 0;

    // The object behind handle 0: the service manager's.
    virtual sp<IBinder> contextObject() = 0;
    // Makes an object of this process the one behind everybody's handle 0. ALREADY_EXISTS when there is one,
    // INVALID_OPERATION for a driver that has no use for one.
    virtual status_t becomeContextManager(const sp<BBinder>& object);

    // The most threads of the pool, those that called joinThreadPool(true) not counted.
    virtual void setMaxThreads(size_t count) = 0;
    // Serves incoming transactions on the calling thread, for as long as the process lives.
    virtual void joinThreadPool(bool isMain) = 0;
    // Says at once what the calling thread would say with its next call.
    virtual void flushCommands() {}

    // Starts no further transaction and waits, for a second at most, for those that run on other threads. Called
    // when the process exits, before static objects go away.
    virtual void quiesce() = 0;
};

}  // namespace android

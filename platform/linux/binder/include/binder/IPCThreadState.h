// The calling thread's part in binder: whom it serves at the moment.
#pragma once

#include <binder/ProcessState.h>
#include <sys/types.h>
#include <utils/Errors.h>

#include <cstdint>

namespace android {

class Parcel;

class LIBBINDER_EXPORT IPCThreadState {
public:
    static IPCThreadState* self();
    // The same: a thread's state takes no making.
    static IPCThreadState* selfOrNull();

    sp<ProcessState> process();

    // Who made the call that this thread serves; the process itself when it serves none.
    pid_t getCallingPid() const;
    uid_t getCallingUid() const;
    // From here on this process is its own caller, until the token is given back.
    int64_t clearCallingIdentity();
    void restoreCallingIdentity(int64_t token);

    void setStrictModePolicy(int32_t policy) { mStrictModePolicy = policy; }
    int32_t getStrictModePolicy() const { return mStrictModePolicy; }
    void setLastTransactionBinderFlags(int32_t flags) { mLastTransactionBinderFlags = flags; }
    int32_t getLastTransactionBinderFlags() const { return mLastTransactionBinderFlags; }

    // NO_INIT without a driver, the parcel's own error when it has one, otherwise what the driver says.
    status_t transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags);

    // Serves calls on this thread for as long as the process lives. Returns at once without a driver.
    void joinThreadPool(bool isMain = true);
    // Calls go out when they are made. What is given back to others may wait for the thread's next call, or for this.
    void flushCommands();
    // There is no background scheduling to be disabled.
    static void disableBackgroundScheduling(bool) {}

private:
    friend class ProcessState;

    struct Identity {
        bool serving;
        pid_t pid;
        uid_t uid;
    };

    // One transaction that this thread serves; nested ones restore what they found.
    class Serving {
    public:
        Serving(const Identity& caller, uint32_t flags);
        ~Serving();
        Serving(const Serving&) = delete;
        Serving& operator=(const Serving&) = delete;

    private:
        const Identity mCaller;
        const int32_t mStrictModePolicy;
        const int32_t mFlags;
    };

    constexpr IPCThreadState() = default;

    // Trivially destroyed, so that it can be used until the very end of a thread.
    Identity mCaller{false, 0, 0};
    int32_t mStrictModePolicy = 0;
    int32_t mLastTransactionBinderFlags = 0;

    static thread_local IPCThreadState sState;
};

}  // namespace android

// This process's part in binder: its driver, its thread pool, and one proxy per object of another process.
#pragma once

#include <binder/IBinder.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <unordered_map>

namespace android {

class BBinder;
class BpBinder;
class Driver;

class LIBBINDER_EXPORT ProcessState : public virtual RefBase {
public:
    // Opens the driver on the first call. Where there is none, calls to other processes fail with NO_INIT.
    static sp<ProcessState> self();

    ProcessState(const ProcessState&) = delete;
    ProcessState& operator=(const ProcessState&) = delete;

    // The service manager's object; null without a driver. The caller does not matter.
    sp<IBinder> getContextObject(const sp<IBinder>& caller);
    // Makes an object of this process the service manager's. ALREADY_EXISTS where there is a service manager, NO_INIT
    // without a driver, INVALID_OPERATION where the driver does not need one.
    status_t becomeContextManager(const sp<BBinder>& object);

    // Starts serving calls on threads of the process's own. Every call after the first does nothing.
    void startThreadPool();
    void spawnPooledThread(bool isMain);
    // The most threads beside the ones that joined on their own; 15 unless set.
    status_t setThreadPoolMaxThreadCount(size_t maxThreads);
    // Gives the calling thread the name of a thread of the pool.
    void giveThreadPoolName();

    // The one proxy for a handle, null for a handle that cannot be. The handle must be valid for the
    // length of the call: it came in a parcel that is not yet freed, or somebody holds its proxy.
    // The driver must not hold a lock of its own around this call.
    sp<IBinder> getStrongProxyForHandle(int32_t handle);
    // Forgets a proxy that goes away.
    void expungeHandle(int32_t handle, IBinder* binder);

private:
    friend class BpBinder;
    friend class IPCThreadState;
    class Link;

    ProcessState();
    ~ProcessState() override;

    bool startPooledThread(bool isMain);
    // Null when it could not be opened.
    static Driver* driver();
    static const sp<ProcessState>& instance();

    std::unique_ptr<Link> mLink;
    std::unique_ptr<Driver> mDriver;
    std::atomic<bool> mThreadPoolStarted{false};
    std::atomic<uint32_t> mThreadSequence{1};
    std::mutex mLock;
    std::unordered_map<int32_t, wp<BpBinder>> mProxies;
};

}  // namespace android

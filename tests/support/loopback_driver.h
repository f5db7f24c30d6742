// A driver without processes: what leaves through it comes back in, translated as between two processes.
//
// An object that is sent arrives as a handle and a handle that is sent back arrives as the object, so both ends of a
// call can be looked at in one test. Transactions run on the calling thread.
#pragma once

#include <binder/Binder.h>
#include <linux/android/binder.h>

#include <condition_variable>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/linux/binder/Driver.h"

namespace tavo::test {

class LoopbackDriver : public android::Driver {
public:
    // The driver of this process, opened by the first call. A process has one for all its life.
    static LoopbackDriver& open();

    static constexpr Caller kCaller{4321, 8765};

    // Makes an object known as if another process had sent it.
    int32_t publish(const android::sp<android::BBinder>& object);
    android::sp<android::IBinder> proxy(const android::sp<android::BBinder>& object);
    void set_context_object(const android::sp<android::BBinder>& object);
    // The process of the object behind handle dies, and whoever wants to know is told.
    void kill(int32_t handle);
    // Every further transaction ends like this, without reaching anyone; NO_ERROR lets them through again.
    void fail_with(android::status_t status);

    struct Counts {
        int references = 0;  // acquired and not yet released, of all handles
        int buffers = 0;     // received parcels not yet freed
        int transactions = 0;
        int notifications = 0;  // wanted at the moment
        int requests = 0;       // ever asked for
        uint32_t last_flags = 0;
    };
    Counts counts() const;
    int references(int32_t handle) const;
    size_t max_threads() const;
    // The names of the threads that joined, once there are so many.
    std::vector<std::string> wait_for_threads(size_t count);
    // Has the process start one more thread, as a driver under load does.
    void ask_for_thread() { process_.spawnPooledThread(); }

    // Called when the process exits.
    void (*on_quiesce)() = nullptr;

    explicit LoopbackDriver(Process& process) : process_(process) {}
    android::status_t transact(int32_t handle, uint32_t code, const android::Parcel& data, android::Parcel* reply,
                               uint32_t flags) override;
    void acquire(int32_t handle) override;
    void release(int32_t handle) override;
    android::status_t requestDeathNotification(int32_t handle, const android::wp<android::BpBinder>& proxy) override;
    android::status_t clearDeathNotification(int32_t handle) override;
    android::sp<android::IBinder> contextObject() override;
    void setMaxThreads(size_t count) override;
    void joinThreadPool(bool isMain) override;
    void quiesce() override;

private:
    struct Object {
        android::sp<android::BBinder> object;
        bool dead = false;
        int references = 0;
        bool notify = false;
        android::wp<android::BpBinder> proxy;
    };
    struct Buffer;

    int32_t publish_locked(const android::sp<android::BBinder>& object);
    android::status_t carry(const android::Parcel& from, android::Parcel* to);
    android::status_t translate(flat_binder_object& object, Buffer& buffer);
    static void free_buffer(android::Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie);

    Process& process_;
    mutable std::mutex mutex_;
    std::condition_variable joined_;
    std::map<int32_t, Object> objects_;
    int32_t next_handle_ = 1;
    android::sp<android::BBinder> context_;
    android::status_t failure_ = android::NO_ERROR;
    Counts counts_;
    size_t max_threads_ = 0;
    std::vector<std::string> threads_;
};

}  // namespace tavo::test

// Binder between processes by the kernel's own driver, in the platform's protocol: processes of this library and of the
// platform's can call each other.
#pragma once

#include <binder/Parcel.h>
#include <pthread.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>

#include "../Driver.h"
#include "../RunningCalls.h"
#include "Conversation.h"
#include "Device.h"
#include "Handles.h"

namespace android {

// Whether the machine has a device that this driver can speak with.
bool isKernelDriverThere();
// Null, after a word in the log, when it cannot be opened.
std::unique_ptr<Driver> openKernelDriver(Driver::Process& process);

namespace kernel_driver {

// KernelDriver.cpp has what this process wants of others and the pool, KernelDriverCommands.cpp what it is told.
class KernelDriver final : public Driver {
public:
    explicit KernelDriver(Process& process) : process_(process) {}
    ~KernelDriver() override;
    bool open();

    status_t transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override;
    void acquire(int32_t handle) override;
    void release(int32_t handle) override;
    status_t requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) override;
    status_t clearDeathNotification(int32_t handle) override;
    sp<IBinder> contextObject() override;
    status_t becomeContextManager(const sp<BBinder>& object) override;
    void setMaxThreads(size_t count) override;
    void joinThreadPool(bool isMain) override;
    void flushCommands() override;
    void quiesce() override;

private:
    enum class Outcome {
        kReply,  // the transaction's reply
        kTaken,  // that the kernel has taken the transaction
    };
    class Membership;
    class Answer;

    // Threads
    Conversation& self();
    static void endThread(void* conversation);
    void work(Conversation& thread);
    void startThread();
    void startOwedThread();
    void flush(Conversation& thread);
    void flushUnlessSoon(Conversation& thread);
    void abandon(Conversation& thread, int error);
    void settle(Conversation& thread);

    // Calling
    status_t await(Conversation& thread, Outcome awaited, Parcel* reply, bool* isDead = nullptr);
    status_t takeReply(const binder_transaction_data& transaction, Parcel* reply);
    void takeBackNotification(Conversation& thread, int32_t handle, uint64_t cookie);

    // What the kernel says
    void handle(Conversation& thread, const Command& command);
    void receive(const binder_transaction_data& transaction, Parcel& parcel, Parcel::release_func giveBack);
    static void releaseReply(Parcel* parcel, const uint8_t* data, size_t size, const binder_size_t* objects,
                             size_t count, void* driver);
    static void releaseMemory(Parcel* parcel, const uint8_t* data, size_t size, const binder_size_t* objects,
                              size_t count, void* driver);
    void serve(Conversation& thread, const binder_transaction_data& transaction);
    status_t run(Conversation& thread, const binder_transaction_data& transaction, const Parcel& data, Parcel& reply);
    sp<BBinder> targetOf(const binder_transaction_data& transaction);
    void tellOfDeath(Conversation& thread, uint64_t cookie);

    Process& process_;
    Device device_;
    Handles handles_;
    RunningCalls running_;
    pthread_key_t key_ = 0;
    bool hasKey_ = false;

    std::mutex contextMutex_;
    sp<BBinder> context_;

    // Threads that are missing, as they could not be started; and those whose places in the pool are free
    // though the kernel counts them in still.
    std::atomic<size_t> owed_{0};
    std::atomic<std::chrono::steady_clock::rep> triedLast_{0};
    std::atomic<size_t> freePlaces_{0};
};

}  // namespace kernel_driver
}  // namespace android

// A service for tests of what drivers have in common, and processes that serve it.
#pragma once

#include <binder/Binder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "support/eventually.h"
#include "support/pace.h"
#include "support/process.h"

namespace tavo::test {

// Whether the tests run on the kernel's driver, with a service manager, and not on sockets.
bool is_kernel_driver();

class TestService : public android::BBinder {
public:
    enum Code : uint32_t {
        kEcho = android::IBinder::FIRST_CALL_TRANSACTION,  // the request is the reply
        kCallerIds,                                        // -> pid, uid
        kThreadId,                                         // -> of the thread that runs the call
        kBlock,                                            // a Gate's descriptors: returns when the gate is opened
        kPingPong,     // depth, binder: calls it with depth - 1 and this -> depth reached
        kRelay,        // code, n, n binders: calls the first one with the rest, the last one with the code -> its reply
        kKeep,         // binder, or a null one
        kKept,         // -> what was kept
        kTakeKept,     // -> what was kept, which is forgotten
        kIsKept,       // binder -> whether it is what is kept
        kIsKeptNamed,  // name -> whether what it stands for is what is kept
        kPassKept,     // binder: has it keep what is kept here, which is forgotten
        kIsThis,       // binder -> whether it is this very object
        kCallKept,     // code, its request -> its reply
        kPingKept,     // -> the status of a ping of what is kept
        kWatchKept,    // wants to hear of its death
        kDeaths,       // -> how many deaths were heard of
        kOpenPipe,     // -> both ends
        kReplyDescriptor,  // descriptor number, size -> so many bytes and that descriptor, open or not
        kBytes,            // size -> as many bytes
        kAppend,           // number, milliseconds: notes the number after a while
        kAppended,         // -> n, n numbers
        kPublish,          // name, binder
        kCheck,            // name -> binder
        kEndThread,        // ends the thread that runs the call
        kExit,             // exits
    };

    ~TestService() override;
    android::status_t onTransact(uint32_t code, const android::Parcel& data, android::Parcel* reply,
                                 uint32_t flags) override;

    // Objects of this class that are there.
    static int count() { return count_; }

private:
    android::status_t relay(const android::Parcel& data, android::Parcel* reply, uint32_t flags);
    android::status_t onObject(uint32_t code, const android::Parcel& data, android::Parcel* reply);

    class Watcher : public android::IBinder::DeathRecipient {
    public:
        void binderDied(const android::wp<android::IBinder>&) override { ++deaths; }
        std::atomic<int> deaths{0};
    };
    static inline std::atomic<int> count_{0};
    const int counted_ = ++count_;
    std::mutex mutex_;
    std::vector<int32_t> appended_;
    android::sp<android::IBinder> kept_;
    android::sp<Watcher> watcher_;
};

// Holds up calls of kBlock, in whatever process they run, until it is opened.
class Gate {
public:
    Gate();
    ~Gate();
    Gate(const Gate&) = delete;
    Gate& operator=(const Gate&) = delete;

    // Blocks until the gate is opened.
    android::status_t call(const android::sp<android::IBinder>& service, uint32_t flags = 0) const;
    // The same, of the object that the service has kept.
    android::status_t call_kept(const android::sp<android::IBinder>& service) const;
    // Waits until so many more calls are held up, for ten seconds at most.
    bool wait_for(int count) const;
    // Whether a call has got to the gate since.
    bool is_quiet() const;
    void open();

private:
    void write_to(android::Parcel& data) const;

    int entered_[2];
    int closed_[2];
};

// A process that has published a TestService, and has a pool of this size at most.
Process start_server(const std::string& name = "test.service", size_t max_threads = 15);

android::sp<android::IBinder> find_service(const std::string& name = "test.service");

// The first integer of the reply, or -1000 and a failed test.
int32_t ask(const android::sp<android::IBinder>& service, uint32_t code);
int32_t ask(const android::sp<android::IBinder>& service, uint32_t code, const android::Parcel& data);
int32_t ask(const android::sp<android::IBinder>& service, uint32_t code, const android::sp<android::IBinder>& object);
android::sp<android::IBinder> ask_for_object(const android::sp<android::IBinder>& service, uint32_t code);

// How many threads of a process have a name that starts like this.
size_t count_threads_named(pid_t pid, const std::string& start);

// Serves calls on this process's own threads from now on.
void start_pool(size_t max_threads = 15);

}  // namespace tavo::test

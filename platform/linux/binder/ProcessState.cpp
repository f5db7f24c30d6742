#include <android/log.h>
#include <binder/Binder.h>
#include <binder/BpBinder.h>
#include <binder/IPCThreadState.h>
#include <binder/ProcessState.h>
#include <pthread.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "Driver.h"

namespace android {
namespace {

constexpr char kTag[] = "ProcessState";
constexpr size_t kDefaultMaxThreads = 15;

void* runPoolThread(void* isMain) {
    ProcessState::self()->giveThreadPoolName();
    IPCThreadState::self()->joinThreadPool(isMain != nullptr);
    return nullptr;
}

}  // namespace

// What the driver sees of the process.
class ProcessState::Link final : public Driver::Process {
public:
    explicit Link(ProcessState& process) : mProcess(process) {}

    status_t execute(const sp<BBinder>& target, const Driver::Caller& caller, uint32_t code, const Parcel& data,
                     Parcel* reply, uint32_t flags) override {
        const IPCThreadState::Serving serving({true, caller.pid, caller.uid}, flags);
        return target->transact(code, data, reply, flags);
    }
    bool spawnPooledThread() override { return mProcess.startPooledThread(false); }

private:
    ProcessState& mProcess;
};

ProcessState::ProcessState() : mLink(std::make_unique<Link>(*this)), mDriver(Driver::open(*mLink)) {
    if (mDriver == nullptr) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "There is no binder driver: no call leaves this process");
        return;
    }
    mDriver->setMaxThreads(kDefaultMaxThreads);
    // The threads of the pool go on while the process exits; what they use must not go away under them.
    atexit([] { driver()->quiesce(); });
}

ProcessState::~ProcessState() = default;

// Never destroyed: proxies are, until the very end of the process.
const sp<ProcessState>& ProcessState::instance() {
    static const sp<ProcessState>& process = *new sp<ProcessState>(new ProcessState);
    return process;
}

sp<ProcessState> ProcessState::self() { return instance(); }
Driver* ProcessState::driver() { return instance()->mDriver.get(); }

sp<IBinder> ProcessState::getContextObject(const sp<IBinder>&) {
    return mDriver != nullptr ? mDriver->contextObject() : nullptr;
}

status_t ProcessState::becomeContextManager(const sp<BBinder>& object) {
    return mDriver != nullptr ? mDriver->becomeContextManager(object) : status_t{NO_INIT};
}

void ProcessState::startThreadPool() {
    if (!mThreadPoolStarted.exchange(true)) spawnPooledThread(true);
}

void ProcessState::spawnPooledThread(bool isMain) { startPooledThread(isMain); }

bool ProcessState::startPooledThread(bool isMain) {
    if (!mThreadPoolStarted.load() || mDriver == nullptr) return false;
    pthread_attr_t attributes;
    if (pthread_attr_init(&attributes) != 0) return false;
    pthread_attr_setdetachstate(&attributes, PTHREAD_CREATE_DETACHED);
    pthread_t thread;
    const int error = pthread_create(&thread, &attributes, runPoolThread, isMain ? this : nullptr);
    pthread_attr_destroy(&attributes);
    if (error != 0) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "A thread of the pool could not be started: %s", strerror(error));
    }
    return error == 0;
}

status_t ProcessState::setThreadPoolMaxThreadCount(size_t maxThreads) {
    if (mDriver == nullptr) return NO_INIT;
    mDriver->setMaxThreads(maxThreads);
    return NO_ERROR;
}

void ProcessState::giveThreadPoolName() {
    char name[16];
    snprintf(name, sizeof name, "Binder_%X", mThreadSequence.fetch_add(1));
    pthread_setname_np(pthread_self(), name);
}

sp<IBinder> ProcessState::getStrongProxyForHandle(int32_t handle) {
    if (handle < 0 || mDriver == nullptr) return nullptr;
    const std::lock_guard<std::mutex> lock(mLock);
    wp<BpBinder>& entry = mProxies[handle];
    sp<BpBinder> proxy = entry.promote();
    if (proxy == nullptr) {
        // The earlier one, if any, is in its destructor and will find that the entry is no longer its own.
        proxy = new BpBinder(handle);
        entry = proxy;
    }
    return proxy;
}

void ProcessState::expungeHandle(int32_t handle, IBinder* binder) {
    const std::lock_guard<std::mutex> lock(mLock);
    const auto entry = mProxies.find(handle);
    if (entry == mProxies.end() || entry->second.unsafe_get() != binder) return;
    entry->second.unsafe_get()->cancelDeathNotification();
    mProxies.erase(entry);
}

}  // namespace android

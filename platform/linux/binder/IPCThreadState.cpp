#include <binder/IPCThreadState.h>
#include <binder/Parcel.h>
#include <unistd.h>

#include "Driver.h"

namespace android {
namespace {

// An identity as a number: the user above, the process below, and a mark that there is one at all.
constexpr uint64_t kServing = uint64_t{1} << 31;

}  // namespace

thread_local IPCThreadState IPCThreadState::sState;

IPCThreadState* IPCThreadState::self() { return &sState; }
IPCThreadState* IPCThreadState::selfOrNull() { return &sState; }
sp<ProcessState> IPCThreadState::process() { return ProcessState::self(); }

pid_t IPCThreadState::getCallingPid() const { return mCaller.serving ? mCaller.pid : getpid(); }
uid_t IPCThreadState::getCallingUid() const { return mCaller.serving ? mCaller.uid : getuid(); }

int64_t IPCThreadState::clearCallingIdentity() {
    uint64_t token = 0;
    if (mCaller.serving) token = uint64_t{mCaller.uid} << 32 | kServing | static_cast<uint32_t>(mCaller.pid);
    mCaller = {false, 0, 0};
    return static_cast<int64_t>(token);
}

void IPCThreadState::restoreCallingIdentity(int64_t token) {
    const auto bits = static_cast<uint64_t>(token);
    const auto pid = static_cast<pid_t>(bits & (kServing - 1));
    mCaller = {(bits & kServing) != 0, pid, static_cast<uid_t>(bits >> 32)};
}

status_t IPCThreadState::transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    const status_t status = data.errorCheck();
    if (status != NO_ERROR) return status;
    Driver* driver = ProcessState::driver();
    return driver != nullptr ? driver->transact(handle, code, data, reply, flags) : NO_INIT;
}

void IPCThreadState::joinThreadPool(bool isMain) {
    if (Driver* driver = ProcessState::driver()) driver->joinThreadPool(isMain);
}

void IPCThreadState::flushCommands() {
    if (Driver* driver = ProcessState::driver()) driver->flushCommands();
}

IPCThreadState::Serving::Serving(const Identity& caller, uint32_t flags)
    : mCaller(sState.mCaller), mStrictModePolicy(sState.mStrictModePolicy), mFlags(sState.mLastTransactionBinderFlags) {
    sState.mCaller = caller;
    sState.mLastTransactionBinderFlags = static_cast<int32_t>(flags);
}

IPCThreadState::Serving::~Serving() {
    sState.mCaller = mCaller;
    sState.mStrictModePolicy = mStrictModePolicy;
    sState.mLastTransactionBinderFlags = mFlags;
}

}  // namespace android

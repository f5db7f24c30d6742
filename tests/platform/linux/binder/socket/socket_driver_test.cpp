// Whole processes calling each other through the socket driver.
#include <binder/Binder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <thread>

#include "support/process.h"

namespace {

using android::BBinder;
using android::IBinder;
using android::Parcel;
using android::sp;
using android::status_t;
using android::String16;
using tavo::test::Process;

const String16 kName("test.echo");

enum Code : uint32_t {
    kEcho = IBinder::FIRST_CALL_TRANSACTION,
    kCallerIds,
    kSleep,
    kCallBack,
    kOpenPipe,
    kKeep,
    kDropKept,
    kBadDescriptor,
    kCount,
    kKept,
};

class EchoService : public BBinder {
public:
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        switch (code) {
            case kEcho: return reply->appendFrom(&data, 0, data.dataSize());
            case kCallerIds:
                reply->writeInt32(android::IPCThreadState::self()->getCallingPid());
                reply->writeInt32(static_cast<int32_t>(android::IPCThreadState::self()->getCallingUid()));
                return android::OK;
            case kSleep:
                ++running_;
                std::this_thread::sleep_for(std::chrono::milliseconds(data.readInt32()));
                --running_;
                return reply->writeInt32(0);
            case kCallBack: {
                // Depth counts down; every step calls the binder that came along, which calls back.
                const int32_t depth = data.readInt32();
                const sp<IBinder> other = data.readStrongBinder();
                if (depth == 0) return reply->writeInt32(0);
                Parcel request, answer;
                request.writeInt32(depth - 1);
                request.writeStrongBinder(this);
                const status_t status = other->transact(kCallBack, request, &answer);
                if (status != android::OK) return status;
                return reply->writeInt32(answer.readInt32() + 1);
            }
            case kOpenPipe: {
                int ends[2];
                if (pipe2(ends, O_CLOEXEC) != 0) return android::UNKNOWN_ERROR;
                reply->writeFileDescriptor(ends[0], true);
                return reply->writeFileDescriptor(ends[1], true);
            }
            case kKeep: kept_ = data.readStrongBinder(); return android::OK;
            case kKept: return reply->writeStrongBinder(kept_);
            case kDropKept: kept_ = nullptr; return android::OK;
            case kBadDescriptor: reply->writeFileDescriptor(data.readInt32()); return android::OK;
            case kCount: return reply->writeInt32(static_cast<int32_t>(tavo::test::count_threads()));
            default: return BBinder::onTransact(code, data, reply, flags);
        }
    }

    std::atomic<int> running_{0};
    sp<IBinder> kept_;
};

sp<IBinder> find_echo() { return android::defaultServiceManager()->checkService(kName); }

TEST_ROLE(echo_server) {
    const String16 name = arguments.empty() ? kName : String16(arguments[0].c_str());
    if (android::defaultServiceManager()->addService(name, new EchoService) != android::OK) return 1;
    android::ProcessState::self()->startThreadPool();
    puts("ready");
    android::IPCThreadState::self()->joinThreadPool();
    return 0;
}

Process start_server(const std::string& name = "test.echo") {
    Process server = Process::start("echo_server", {name});
    EXPECT_EQ(server.read_line(), "ready");
    return server;
}

TEST(SocketDriver, EchoesBetweenProcesses) {
    Process server = start_server();
    const sp<IBinder> echo = find_echo();
    ASSERT_NE(echo, nullptr);
    Parcel data, reply;
    data.writeInt32(42);
    data.writeString16(String16("text"));
    ASSERT_EQ(echo->transact(kEcho, data, &reply), android::OK);
    EXPECT_EQ(reply.readInt32(), 42);
    EXPECT_EQ(reply.readString16(), String16("text"));
}

TEST(SocketDriver, CallsBackAlongTheSameChannelAtAnyDepth) {
    Process server = start_server();
    const sp<IBinder> echo = find_echo();
    ASSERT_NE(echo, nullptr);
    Parcel data, reply;
    data.writeInt32(20);
    data.writeStrongBinder(new EchoService);
    ASSERT_EQ(echo->transact(kCallBack, data, &reply), android::OK);
    EXPECT_EQ(reply.readInt32(), 20);
}

}  // namespace

// The proxy and the stub with a process boundary between them.
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <filesystem>

#include "ipc/ITavoBinder.h"
#include "ipc/descriptors.h"
#include "ipc/log_lines.h"
#include "ipc/server.h"

namespace {

using android::IBinder;
using android::IMemoryHeap;
using android::ITavoBinder;
using android::Parcel;
using android::sp;
using android::String16;
using tavo::test::count_descriptors;
using tavo::test::count_pipe_ends;
using tavo::test::file_of;
using tavo::test::LogCapture;
using tavo::test::Server;

class BinderRemote : public testing::Test {
protected:
    BinderRemote() {
        std::filesystem::remove_all(tavo::test::kMarkerDirectory);
        server_ = std::make_unique<Server>();
        binder_ = android::defaultServiceManager()->checkService(String16("android.tavo.osal"));
        service_ = ITavoBinder::asInterface(binder_);
    }
    void SetUp() override { ASSERT_NE(service_, nullptr); }

    std::unique_ptr<Server> server_;
    sp<IBinder> binder_;
    sp<ITavoBinder> service_;
};

TEST_F(BinderRemote, KnowsTheServiceByItsDescriptor) {
    EXPECT_EQ(binder_->localBinder(), nullptr);
    EXPECT_EQ(binder_->getInterfaceDescriptor(), String16("tavo.mq"));
    EXPECT_EQ(binder_->pingBinder(), android::NO_ERROR);
}

TEST_F(BinderRemote, CarriesNumbers) {
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_EQ(service_->create_message_queue(-8), 1);
    EXPECT_EQ(service_->create_message_queue(0), -1);
    EXPECT_EQ(service_->delete_message_queue(7), 0);
    EXPECT_EQ(service_->delete_message_queue(7), -1);
    EXPECT_EQ(service_->delete_shared_mem(-5), 0x9001);
    EXPECT_EQ(service_->delete_shared_mem(5), 0);
}

TEST_F(BinderRemote, CarriesDescriptorsAsDuplicates) {
    service_->create_message_queue(7);
    const size_t before = count_descriptors();
    const int ends[] = {service_->get_fd(7), service_->get_fd(7), service_->get_write_fd(7)};
    EXPECT_NE(ends[0], ends[1]);
    const ino_t pipe = file_of(ends[0]);
    EXPECT_EQ(file_of(ends[1]), pipe);
    EXPECT_EQ(file_of(ends[2]), pipe);
    EXPECT_EQ(count_descriptors(), before + 3);
    EXPECT_EQ(count_pipe_ends(pipe, server_->pid()), 2U);
    EXPECT_EQ(write(ends[2], "x", 1), 1);
    char received = 0;
    EXPECT_EQ(read(ends[1], &received, 1), 1);
    for (const int end : ends) close(end);
}

TEST_F(BinderRemote, HasNoDescriptorForAnUnknownKey) {
    EXPECT_EQ(service_->get_fd(7), -1);  // makes whatever calls need
    const size_t before = count_descriptors();
    for (const int key : {7, 0, -7}) {
        EXPECT_EQ(service_->get_fd(key), -1);
        EXPECT_EQ(service_->get_write_fd(key), -1);
    }
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_EQ(service_->create_message_queue(7), 0);  // such a reply breaks nothing
}

TEST_F(BinderRemote, CarriesHeaps) {
    const sp<IMemoryHeap> heap = service_->get_shared_mem(7, 100);
    ASSERT_NE(heap, nullptr);
    ASSERT_NE(heap->getBase(), MAP_FAILED);
    EXPECT_GE(heap->getSize(), 100U);
    *static_cast<int*>(heap->getBase()) = 4711;
    const sp<IMemoryHeap> again = service_->get_shared_mem(7, 5000);
    ASSERT_NE(again, nullptr);
    EXPECT_EQ(*static_cast<int*>(again->getBase()), 4711);
    EXPECT_EQ(again->getSize(), heap->getSize());
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_EQ(*static_cast<int*>(heap->getBase()), 4711);  // mapped for as long as it is held
}

TEST_F(BinderRemote, HasNoHeapForInvalidArguments) {
    EXPECT_EQ(service_->get_shared_mem(0, 100), nullptr);
    EXPECT_EQ(service_->get_shared_mem(7, 0), nullptr);
    EXPECT_EQ(service_->get_shared_mem(7, -1), nullptr);
}

TEST_F(BinderRemote, RefusesTheServiceNameForAToken) {
    for (uint32_t code = 3; code <= 8; ++code) {
        Parcel data, reply;
        data.writeInterfaceToken(String16("android.tavo.osal"));
        data.writeInt32(7);
        EXPECT_EQ(binder_->transact(code, data, &reply), -1);
        EXPECT_EQ(reply.dataSize(), 0U);
    }
    EXPECT_EQ(service_->delete_message_queue(7), -1);  // nothing was made
}

TEST_F(BinderRemote, LeavesOtherCodesToThePlatform) {
    for (const uint32_t code : {1U, 2U, 9U}) {
        Parcel data, reply;
        data.writeInterfaceToken(ITavoBinder::descriptor);
        data.writeInt32(7);
        EXPECT_EQ(binder_->transact(code, data, &reply), android::UNKNOWN_TRANSACTION);
    }
}

TEST_F(BinderRemote, YieldsWhatEmptyRepliesYieldWhenTheServerIsGone) {
    service_->create_message_queue(7);
    server_->kill();
    EXPECT_EQ(service_->create_message_queue(7), 0);
    EXPECT_EQ(service_->delete_message_queue(7), 0);
    EXPECT_EQ(service_->delete_shared_mem(7), 0);
    EXPECT_EQ(service_->get_fd(7), -1);
    EXPECT_EQ(service_->get_write_fd(7), -1);
    EXPECT_EQ(service_->get_shared_mem(7, 100), nullptr);
}

}  // namespace

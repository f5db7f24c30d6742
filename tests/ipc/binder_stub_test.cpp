// What the stub makes of requests, written by hand, and what it writes into the replies.
#include <binder/MemoryHeapBase.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "ipc/fake_binders.h"
#include "ipc/log_lines.h"

namespace {

using android::IBinder;
using android::MemoryHeapBase;
using android::Parcel;
using android::sp;
using android::status_t;
using android::String16;
using tavo::test::ExpectedLine;
using tavo::test::FakeService;
using tavo::test::kBinderTag;
using tavo::test::library_lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using Calls = std::vector<std::string>;

class BinderStub : public testing::Test {
protected:
    // The wire's bytes themselves: nothing of the library's writes them.
    static void write_request(Parcel& data, const char* descriptor, std::initializer_list<int32_t> arguments) {
        const String16 name(descriptor);
        data.writeInt32(0);
        data.writeInt32(static_cast<int32_t>(name.size()));
        data.write(name.string(), (name.size() + 1) * sizeof(char16_t));
        for (const int32_t argument : arguments) data.writeInt32(argument);
    }

    status_t transact(uint32_t code, std::initializer_list<int32_t> arguments, const char* descriptor = "tavo.mq") {
        Parcel data;
        write_request(data, descriptor, arguments);
        return service_->transact(code, data, &reply_);
    }

    int32_t only_number() {
        EXPECT_EQ(reply_.dataSize(), sizeof(int32_t));
        EXPECT_EQ(reply_.objectsCount(), 0U);
        return reply_.readInt32();
    }

    const sp<FakeService> service_ = new FakeService;
    Parcel reply_;
};

TEST_F(BinderStub, WritesTheNumberThatDeletingABlockYields) {
    service_->result = 0x9001;
    EXPECT_EQ(transact(4, {-5}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{"delete_shared_mem -5"});
    EXPECT_EQ(only_number(), 0x9001);
}

TEST_F(BinderStub, WritesTheNumberThatCreatingAQueueYields) {
    service_->result = 3;
    EXPECT_EQ(transact(5, {7}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{"create_message_queue 7"});
    EXPECT_EQ(only_number(), 3);
}

TEST_F(BinderStub, WritesTheNumberThatDeletingAQueueYields) {
    service_->result = -1;
    EXPECT_EQ(transact(6, {7}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{"delete_message_queue 7"});
    EXPECT_EQ(only_number(), -1);
}

struct DescriptorCode {
    uint32_t code;
    const char* operation;
};

void PrintTo(const DescriptorCode& code, std::ostream* out) { *out << code.operation; }

class BinderStubDescriptor : public BinderStub, public testing::WithParamInterface<DescriptorCode> {};

TEST_P(BinderStubDescriptor, WritesTheDescriptorWithoutTakingIt) {
    const int descriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
    service_->result = descriptor;
    EXPECT_EQ(transact(GetParam().code, {9}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{std::string(GetParam().operation) + " 9"});
    EXPECT_EQ(reply_.dataSize(), sizeof(flat_binder_object));
    EXPECT_EQ(reply_.objectsCount(), 1U);
    flat_binder_object object = {};
    ASSERT_EQ(reply_.read(&object, sizeof object), android::NO_ERROR);
    EXPECT_EQ(object.hdr.type, static_cast<uint32_t>(BINDER_TYPE_FD));
    EXPECT_EQ(static_cast<int>(object.handle), descriptor);
    EXPECT_EQ(object.cookie, 0U);  // the platform's mark of a descriptor that the parcel owns
    reply_.freeData();
    EXPECT_EQ(close(descriptor), 0);
}

TEST_P(BinderStubDescriptor, HandsAMissingOneOnAsItIs) {
    service_->result = -1;
    EXPECT_EQ(transact(GetParam().code, {9}), android::NO_ERROR);
    EXPECT_EQ(reply_.readFileDescriptor(), -1);
}

INSTANTIATE_TEST_SUITE_P(Codes, BinderStubDescriptor,
                         testing::Values(DescriptorCode{7, "get_write_fd"}, DescriptorCode{8, "get_fd"}),
                         [](const auto& code) { return code.param.operation; });

TEST_F(BinderStub, WritesTheHeapsBinder) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(10, 0, "heap");
    service_->heap = heap;
    EXPECT_EQ(transact(3, {7, 100}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{"get_shared_mem 7 100"});
    EXPECT_EQ(reply_.dataSize(), sizeof(flat_binder_object));
    EXPECT_EQ(reply_.objectsCount(), 1U);
    EXPECT_EQ(reply_.readStrongBinder(), android::IInterface::asBinder(service_->heap));
}

TEST_F(BinderStub, WritesNothingWithoutAHeap) {
    EXPECT_EQ(transact(3, {0, 0}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{"get_shared_mem 0 0"});
    EXPECT_EQ(reply_.dataSize(), 0U);
}

TEST_F(BinderStub, RefusesAnotherInterfacesToken) {
    for (const char* descriptor : {"android.tavo.osal", "tavo.m", "tavo.mqx", ""}) {
        for (uint32_t code = 3; code <= 8; ++code) {
            EXPECT_EQ(transact(code, {7, 100}, descriptor), android::PERMISSION_DENIED);
            EXPECT_EQ(reply_.dataSize(), 0U);
        }
    }
    EXPECT_EQ(android::PERMISSION_DENIED, -1);
    EXPECT_EQ(service_->calls, Calls{});
}

TEST_F(BinderStub, RefusesRequestsWithoutAToken) {
    Parcel empty, number;
    number.writeInt32(7);
    for (uint32_t code = 3; code <= 8; ++code) {
        EXPECT_EQ(service_->transact(code, empty, &reply_), android::PERMISSION_DENIED);
        EXPECT_EQ(service_->transact(code, number, &reply_), android::PERMISSION_DENIED);
    }
    EXPECT_EQ(service_->calls, Calls{});
}

TEST_F(BinderStub, LeavesOtherCodesToThePlatform) {
    for (const uint32_t code : {0U, 1U, 2U, 9U, 10U, UINT32_MAX}) {
        EXPECT_EQ(transact(code, {7}), android::UNKNOWN_TRANSACTION) << code;
        EXPECT_EQ(reply_.dataSize(), 0U);
    }
    EXPECT_EQ(service_->calls, Calls{});
}

TEST_F(BinderStub, AnswersPlatformRequestsWithoutAToken) {
    Parcel data;
    EXPECT_EQ(service_->transact(IBinder::INTERFACE_TRANSACTION, data, &reply_), android::NO_ERROR);
    EXPECT_EQ(reply_.readString16(), String16("tavo.mq"));
    EXPECT_EQ(service_->transact(IBinder::PING_TRANSACTION, data, nullptr), android::NO_ERROR);
    EXPECT_EQ(service_->calls, Calls{});
}

TEST_F(BinderStub, TakesMissingArgumentsForZero) {
    for (uint32_t code = 3; code <= 8; ++code) EXPECT_EQ(transact(code, {}), android::NO_ERROR);
    EXPECT_EQ(service_->calls, (Calls{"get_shared_mem 0 0", "delete_shared_mem 0", "create_message_queue 0",
                                      "delete_message_queue 0", "get_write_fd 0", "get_fd 0"}));
}

TEST_F(BinderStub, ServesACallThatWantsNoReply) {
    Parcel data;
    write_request(data, "tavo.mq", {7, 100});
    service_->heap = new MemoryHeapBase(10, 0, "heap");
    for (uint32_t code = 3; code <= 8; ++code) {
        EXPECT_EQ(service_->transact(code, data, nullptr, IBinder::FLAG_ONEWAY), android::NO_ERROR);
    }
    EXPECT_EQ(service_->calls.size(), 6U);
}

struct LoggedCode {
    uint32_t code;
    std::vector<ExpectedLine> lines;  // behind the entry
};

void PrintTo(const LoggedCode& logged, std::ostream* out) { *out << logged.code; }

class BinderStubLog : public BinderStub, public testing::WithParamInterface<LoggedCode> {};

TEST_P(BinderStubLog, SaysWhatItWasAskedFor) {
    const LogCapture log;
    transact(GetParam().code, {-12, 345});
    std::vector<ExpectedLine> expected = GetParam().lines;
    expected.insert(expected.begin(), {6, kBinderTag, "++Entered\n"});
    EXPECT_TRUE(logged_exactly(library_lines(log), expected));
}

TEST_P(BinderStubLog, SaysNothingMoreToAStranger) {
    const LogCapture log;
    transact(GetParam().code, {-12, 345}, "android.tavo.osal");
    EXPECT_TRUE(logged_exactly(library_lines(log), {{6, kBinderTag, "++Entered\n"}}));
}

INSTANTIATE_TEST_SUITE_P(Codes, BinderStubLog,
                         testing::Values(LoggedCode{2, {}}, LoggedCode{9, {}},
                                         LoggedCode{3,
                                                    {{3, kBinderTag, "Key received at get_shared_memory is -12 \n"},
                                                     {3, kBinderTag, "Size received at get_shared_memory is 345 \n"}}},
                                         LoggedCode{4,
                                                    {{3, kBinderTag, "Key received at get_shared_memory is -12 \n"}}},
                                         LoggedCode{5, {{1, kBinderTag, "CREATE MSG -12 \n"}}}, LoggedCode{6, {}},
                                         LoggedCode{7, {{1, kBinderTag, "Key received at  GET FD WRITE is -12"}}},
                                         LoggedCode{8, {{1, kBinderTag, "Key received at FD READ KEY  is -12"}}}),
                         [](const auto& logged) { return "Code" + std::to_string(logged.param.code); });

}  // namespace

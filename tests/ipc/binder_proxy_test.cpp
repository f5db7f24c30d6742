// What the proxy sends, to the byte, and what it makes of the replies.
#include <binder/IPCThreadState.h>
#include <binder/MemoryHeapBase.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <new>
#include <optional>

#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/fake_binders.h"
#include "ipc/log_lines.h"
#include "support/process.h"

namespace {

using android::ITavoBinder;
using android::MemoryHeapBase;
using android::Parcel;
using android::sp;
using android::status_t;
using tavo::test::AllocationFault;
using tavo::test::ExpectedLine;
using tavo::test::FakeRemote;
using tavo::test::file_of;
using tavo::test::is_open;
using tavo::test::kBinderTag;
using tavo::test::library_lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::NoInput;

struct Operation {
    const char* name;
    uint32_t code;
    int empty;  // what an empty reply yields
    int (*call)(ITavoBinder& proxy, int key);
};

void PrintTo(const Operation& operation, std::ostream* out) { *out << operation.name; }

const Operation kIntOperations[] = {
    {"delete_shared_mem", 4, 0, [](ITavoBinder& proxy, int key) { return proxy.delete_shared_mem(key); }},
    {"create_message_queue", 5, 0, [](ITavoBinder& proxy, int key) { return proxy.create_message_queue(key); }},
    {"delete_message_queue", 6, 0, [](ITavoBinder& proxy, int key) { return proxy.delete_message_queue(key); }},
};
const Operation kDescriptorOperations[] = {
    {"get_write_fd", 7, -1, [](ITavoBinder& proxy, int key) { return proxy.get_write_fd(key); }},
    {"get_fd", 8, -1, [](ITavoBinder& proxy, int key) { return proxy.get_fd(key); }},
};

class BinderProxy : public testing::TestWithParam<Operation> {
protected:
    int call(int key) { return GetParam().call(*proxy_, key); }

    const sp<FakeRemote> remote_ = new FakeRemote;
    const sp<ITavoBinder> proxy_ = ITavoBinder::asInterface(remote_);
};

class BinderProxyInt : public BinderProxy {};
class BinderProxyDescriptor : public BinderProxy {
protected:
    BinderProxyDescriptor() { EXPECT_EQ(pipe2(ends_, O_CLOEXEC), 0); }
    ~BinderProxyDescriptor() override {
        close(ends_[0]);
        close(ends_[1]);
    }
    // The reply's descriptor is the reply's own, as one that came from another process is.
    void answer_with(int descriptor) {
        remote_->answer = [descriptor](Parcel* reply) { return reply->writeDupFileDescriptor(descriptor); };
    }

    int ends_[2] = {-1, -1};
};

// The policy word, the descriptor's length, its UTF-16 units with the terminator, and the arguments.
std::vector<uint8_t> request_bytes(int32_t policy, std::initializer_list<int32_t> arguments) {
    std::vector<uint8_t> bytes;
    const auto append = [&bytes](const void* data, size_t size) {
        const auto* begin = static_cast<const uint8_t*>(data);
        for (size_t i = 0; i < size; ++i) bytes.push_back(begin[i]);
    };
    const uint8_t descriptor[] = {7, 0, 0, 0, 't', 0, 'a', 0, 'v', 0, 'o', 0, '.', 0, 'm', 0, 'q', 0, 0, 0};
    append(&policy, sizeof policy);
    append(descriptor, sizeof descriptor);
    for (const int32_t argument : arguments) append(&argument, sizeof argument);
    return bytes;
}

constexpr int32_t kNoPolicy = 0x400000;  // the platform's own bit alone

// --- every operation

TEST_P(BinderProxy, SendsTheTokenAndTheKeyAndNothingElse) {
    for (const int key : {7, -7, 0, INT32_MAX, INT32_MIN}) {
        remote_->requests.clear();
        call(key);
        ASSERT_EQ(remote_->requests.size(), 1U);
        const FakeRemote::Request& request = remote_->requests[0];
        EXPECT_EQ(request.code, GetParam().code);
        EXPECT_EQ(request.flags, 0U);
        EXPECT_EQ(request.bytes, request_bytes(kNoPolicy, {key}));
        EXPECT_EQ(request.objects, 0U);
    }
}

TEST_P(BinderProxy, SendsTheThreadsPolicy) {
    android::IPCThreadState::self()->setStrictModePolicy(0x21);
    call(3);
    android::IPCThreadState::self()->setStrictModePolicy(0);
    ASSERT_EQ(remote_->requests.size(), 1U);
    EXPECT_EQ(remote_->requests[0].bytes, request_bytes(kNoPolicy | 0x21, {3}));
}

TEST_P(BinderProxy, TellsAFailedCallOnlyByWhatAnEmptyReplyYields) {
    for (const status_t status : {android::NO_ERROR, android::PERMISSION_DENIED, android::DEAD_OBJECT,
                                  android::FAILED_TRANSACTION, android::UNKNOWN_TRANSACTION}) {
        remote_->answer = [status](Parcel*) { return status; };
        EXPECT_EQ(call(7), GetParam().empty);
    }
}

TEST_P(BinderProxy, TakesMissingMemoryForAnEmptyReply) {
    remote_->answer = [](Parcel*) -> status_t { throw std::bad_alloc(); };
    EXPECT_EQ(call(7), GetParam().empty);
}

TEST_P(BinderProxy, TracesItsEntryAndExit) {
    const LogCapture log;
    call(7);
    std::vector<ExpectedLine> expected = {{6, kBinderTag, "++Entered\n"}, {6, kBinderTag, "--Exiting\n"}};
    if (GetParam().code == 4) {
        expected.insert(expected.begin() + 1, {3, kBinderTag, "Key received at get_shared_memory is 7"});
    }
    EXPECT_TRUE(logged_exactly(log.lines(), expected));
}

TEST_P(BinderProxy, HasLoggedItsExitBeforeItLooksAtTheReply) {
    // A reply that holds no object where one is expected makes the platform log.
    remote_->answer = [](Parcel* reply) { return reply->write(std::vector<uint8_t>(24, 1).data(), 24); };
    const LogCapture log;
    call(7);
    if (GetParam().empty == -1) {
        ASSERT_FALSE(log.lines().empty());
        EXPECT_TRUE(log.lines().back().by_print);
    }
    EXPECT_EQ(library_lines(log).back().message(), "--Exiting\n");
}

const auto kName = [](const auto& operation) { return std::string(operation.param.name); };
INSTANTIATE_TEST_SUITE_P(IntOperations, BinderProxy, testing::ValuesIn(kIntOperations), kName);
INSTANTIATE_TEST_SUITE_P(DescriptorOperations, BinderProxy, testing::ValuesIn(kDescriptorOperations), kName);

// --- numbers

TEST_P(BinderProxyInt, AnswersWithTheNumberInTheReply) {
    for (const int result : {0, 1, -1, 0x9001, INT32_MIN}) {
        remote_->answer = [result](Parcel* reply) { return reply->writeInt32(result); };
        EXPECT_EQ(call(7), result);
    }
}

TEST_P(BinderProxyInt, AnswersWithTheReplyWhateverTheStatus) {
    remote_->answer = [](Parcel* reply) {
        reply->writeInt32(12);
        return android::PERMISSION_DENIED;
    };
    EXPECT_EQ(call(7), 12);
}

INSTANTIATE_TEST_SUITE_P(Operations, BinderProxyInt, testing::ValuesIn(kIntOperations), kName);

// --- descriptors

TEST_P(BinderProxyDescriptor, AnswersWithADuplicateThatItsCallerOwns) {
    answer_with(ends_[0]);
    const size_t before = tavo::test::count_descriptors();
    const int first = call(7);
    const int second = call(7);
    EXPECT_NE(first, second);
    EXPECT_EQ(file_of(first), file_of(ends_[0]));
    EXPECT_EQ(file_of(second), file_of(ends_[0]));
    EXPECT_EQ(tavo::test::count_descriptors(), before + 2);  // the replies' own are closed
    close(first);
    close(second);
}

TEST_P(BinderProxyDescriptor, IsNotInheritedByOtherPrograms) {
    answer_with(ends_[1]);
    const int descriptor = call(7);
    EXPECT_EQ(fcntl(descriptor, F_GETFD), FD_CLOEXEC);
    close(descriptor);
}

TEST_P(BinderProxyDescriptor, IsNeverDescriptorZero) {
    remote_->answer = [this](Parcel* reply) { return reply->writeFileDescriptor(ends_[0]); };
    const NoInput input;
    const int descriptor = call(7);
    EXPECT_GT(descriptor, 0);
    EXPECT_FALSE(is_open(0));
    close(descriptor);
}

TEST_P(BinderProxyDescriptor, HasNoneWhenTheReplyHoldsNone) {
    remote_->answer = [](Parcel* reply) { return reply->writeInt32(1); };
    EXPECT_EQ(call(7), -1);
    remote_->answer = [](Parcel* reply) { return reply->writeFileDescriptor(-1); };
    EXPECT_EQ(call(7), -1);
    const sp<android::IBinder> other = new android::BBinder;
    remote_->answer = [&](Parcel* reply) { return reply->writeStrongBinder(other); };
    EXPECT_EQ(call(7), -1);
}

INSTANTIATE_TEST_SUITE_P(Operations, BinderProxyDescriptor, testing::ValuesIn(kDescriptorOperations), kName);

// --- shared memory

class BinderProxyHeap : public testing::Test {
protected:
    const sp<FakeRemote> remote_ = new FakeRemote;
    const sp<ITavoBinder> proxy_ = ITavoBinder::asInterface(remote_);
};

TEST_F(BinderProxyHeap, SendsTheKeyAndThenTheSize) {
    proxy_->get_shared_mem(-5, 70000);
    ASSERT_EQ(remote_->requests.size(), 1U);
    EXPECT_EQ(remote_->requests[0].code, 3U);
    EXPECT_EQ(remote_->requests[0].flags, 0U);
    EXPECT_EQ(remote_->requests[0].bytes, request_bytes(kNoPolicy, {-5, 70000}));
    EXPECT_EQ(remote_->requests[0].objects, 0U);
}

TEST_F(BinderProxyHeap, AnswersWithTheHeapInTheReply) {
    const sp<android::IMemoryHeap> heap = new MemoryHeapBase(100, 0, "heap");
    remote_->answer = [&](Parcel* reply) { return reply->writeStrongBinder(android::IInterface::asBinder(heap)); };
    const sp<android::IMemoryHeap> received = proxy_->get_shared_mem(5, 100);
    ASSERT_NE(received, nullptr);
    EXPECT_EQ(received->getBase(), heap->getBase());
}

TEST_F(BinderProxyHeap, IsNullWithoutABinderInTheReply) {
    EXPECT_EQ(proxy_->get_shared_mem(5, 100), nullptr);
    remote_->answer = [](Parcel*) { return android::DEAD_OBJECT; };
    EXPECT_EQ(proxy_->get_shared_mem(5, 100), nullptr);
    remote_->answer = [](Parcel* reply) { return reply->writeStrongBinder(nullptr); };
    EXPECT_EQ(proxy_->get_shared_mem(5, 100), nullptr);
    remote_->answer = [](Parcel* reply) { return reply->writeInt32(3); };
    EXPECT_EQ(proxy_->get_shared_mem(5, 100), nullptr);
    remote_->answer = [](Parcel*) -> status_t { throw std::bad_alloc(); };
    EXPECT_EQ(proxy_->get_shared_mem(5, 100), nullptr);
}

TEST_F(BinderProxyHeap, IsNullWithoutMemoryForItsProxy) {
    const sp<FakeRemote> elsewhere = new FakeRemote;
    std::optional<AllocationFault> fault;
    remote_->answer = [&](Parcel* reply) {
        const status_t status = reply->writeStrongBinder(elsewhere);
        fault.emplace(AllocationFault::kNew, 1, "libbinder.so");
        return status;
    };
    const LogCapture log;
    EXPECT_EQ(proxy_->get_shared_mem(5, 100), nullptr);
    fault.reset();
    EXPECT_EQ(tavo::test::g_allocations.size(), 1U);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kBinderTag, "++Entered\n"}, {6, kBinderTag, "--Exiting\n"}}));
}

TEST_F(BinderProxyHeap, TracesItsEntryAndExit) {
    const LogCapture log;
    proxy_->get_shared_mem(5, 100);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kBinderTag, "++Entered\n"}, {6, kBinderTag, "--Exiting\n"}}));
}

}  // namespace

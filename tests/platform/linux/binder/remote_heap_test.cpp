// Heaps, where they are used.
#include <binder/BpBinder.h>
#include <binder/MemoryHeapBase.h>
#include <binder/Parcel.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <new>
#include <thread>
#include <vector>

#include "support/log_capture.h"
#include "support/loopback_driver.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using namespace android;
using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::LogCapture;
using tavo::test::LoopbackDriver;
using tavo::test::PlatformHook;

const auto kPage = static_cast<size_t>(sysconf(_SC_PAGESIZE));

sp<IMemoryHeap> client_of(const sp<BBinder>& heap) {
    return interface_cast<IMemoryHeap>(LoopbackDriver::open().proxy(heap));
}

TEST(RemoteHeap, IsMappedByOneTransactionWhenItIsFirstUsed) {
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(2 * kPage, 0, "one-transaction");
    const sp<IMemoryHeap> client = client_of(heap);
    EXPECT_NE(client.get(), heap.get());
    EXPECT_EQ(driver.counts().transactions, 0);
    EXPECT_EQ(count_mappings(0, "one-transaction"), 1U);
    ASSERT_NE(client->getBase(), MAP_FAILED);
    EXPECT_NE(client->getBase(), heap->getBase());
    EXPECT_EQ(client->getSize(), 2 * kPage);
    EXPECT_EQ(client->getFlags(), 0U);
    EXPECT_EQ(client->getOffset(), 0U);
    EXPECT_EQ(driver.counts().transactions, 1);
    EXPECT_EQ(driver.counts().buffers, 0);
    EXPECT_EQ(count_mappings(0, "one-transaction"), 2U);
    strcpy(static_cast<char*>(client->getBase()), "written there");
    EXPECT_STREQ(static_cast<char*>(heap->getBase()), "written there");
}

TEST(RemoteHeap, HasADescriptorOfItsOwn) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IMemoryHeap> client = client_of(heap);
    const int fd = client->getHeapID();
    EXPECT_NE(fd, heap->getHeapID());
    EXPECT_NE(fcntl(fd, F_GETFD) & FD_CLOEXEC, 0);
}

TEST(RemoteHeap, HasOneMappingForAllItsReferences) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, "one-mapping");
    const size_t descriptors = count_descriptors();
    sp<IMemoryHeap> first = client_of(heap);
    sp<IMemoryHeap> second = client_of(heap);
    EXPECT_NE(first, second);
    void* base = first->getBase();
    EXPECT_EQ(second->getBase(), base);
    EXPECT_EQ(second->getHeapID(), first->getHeapID());
    first.clear();
    EXPECT_EQ(second->getBase(), base);
    EXPECT_EQ(client_of(heap)->getBase(), base);
    EXPECT_EQ(count_mappings(0, "one-mapping"), 2U);
    second.clear();
    EXPECT_EQ(count_mappings(0, "one-mapping"), 1U) << "the owner's";
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(LoopbackDriver::open().counts().references, 0);
}

TEST(RemoteHeap, StaysWhereItIsForAReferenceThatHasNotLookedYet) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    sp<IMemoryHeap> first = client_of(heap);
    const sp<IMemoryHeap> second = client_of(heap);
    void* base = first->getBase();
    first.clear();
    EXPECT_EQ(second->getBase(), base);
    EXPECT_EQ(LoopbackDriver::open().counts().transactions, 1);
}

TEST(RemoteHeap, IsMappedAgainAfterItsLastReferenceWent) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    strcpy(static_cast<char*>(heap->getBase()), "still");
    for (int i = 0; i < 3; ++i) EXPECT_STREQ(static_cast<char*>(client_of(heap)->getBase()), "still");
    EXPECT_EQ(LoopbackDriver::open().counts().transactions, 3);
}

TEST(RemoteHeap, OutlivesTheOwnersMapping) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IMemoryHeap> client = client_of(heap);
    strcpy(static_cast<char*>(client->getBase()), "kept");
    heap->dispose();
    EXPECT_STREQ(static_cast<char*>(client->getBase()), "kept");
}

TEST(RemoteHeap, IsMappedOnceWhenThreadsRaceForIt) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, "raced-for");
    for (int round = 0; round < 50; ++round) {
        const int before = LoopbackDriver::open().counts().transactions;
        const sp<IMemoryHeap> keeper = client_of(heap);
        std::vector<void*> bases(4);
        std::vector<std::thread> threads;
        for (void*& base : bases) {
            threads.emplace_back([&base, &heap] { base = client_of(heap)->getBase(); });
        }
        for (std::thread& thread : threads) thread.join();
        for (void* base : bases) EXPECT_EQ(base, keeper->getBase());
        EXPECT_EQ(LoopbackDriver::open().counts().transactions, before + 1);
    }
    EXPECT_EQ(count_mappings(0, "raced-for"), 1U);
}

TEST(RemoteHeap, ComesAndGoesOnManyThreads) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, "comes-and-goes");
    const size_t descriptors = count_descriptors();
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&heap] {
            for (int round = 0; round < 200; ++round) {
                const sp<IMemoryHeap> client = client_of(heap);
                EXPECT_NE(client->getBase(), MAP_FAILED);
                EXPECT_EQ(client->getBase(), client_of(heap)->getBase());
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(count_mappings(0, "comes-and-goes"), 1U);
    EXPECT_EQ(count_descriptors(), descriptors);
}

TEST(RemoteHeap, ThatIsReadOnlyIsMappedSo) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, MemoryHeapBase::READ_ONLY, "read-only");
    strcpy(static_cast<char*>(heap->getBase()), "look");
    const sp<IMemoryHeap> client = client_of(heap);
    EXPECT_EQ(client->getFlags(), uint32_t{IMemoryHeap::READ_ONLY});
    EXPECT_STREQ(static_cast<char*>(client->getBase()), "look");
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    EXPECT_EQ(write(ends[1], "x", 1), 1);
    EXPECT_EQ(read(ends[0], client->getBase(), 1), -1) << "the kernel cannot write there either";
    EXPECT_EQ(errno, EFAULT);
    close(ends[0]);
    close(ends[1]);
}

// A peer that answers as a test says.
class Peer : public BBinder {
public:
    explicit Peer(std::function<status_t(Parcel*)> answer) : answer_(std::move(answer)) {}
    status_t onTransact(uint32_t code, const Parcel&, Parcel* reply, uint32_t) override {
        EXPECT_EQ(code, uint32_t{IMemoryHeap::HEAP_ID});
        return answer_(reply);
    }

private:
    const std::function<status_t(Parcel*)> answer_;
};

void expect_refused(const std::function<status_t(Parcel*)>& answer) {
    const sp<IMemoryHeap> client = client_of(new Peer(answer));
    const size_t descriptors = count_descriptors();
    const LogCapture log;
    EXPECT_EQ(client->getBase(), MAP_FAILED);
    EXPECT_EQ(client->getHeapID(), -1);
    EXPECT_EQ(client->getSize(), 0U);
    EXPECT_EQ(log.lines("IMemory").size(), 3U) << "every call tries again";
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(count_mappings(0, "memfd:peer") + count_mappings(0, "/dev/zero"), 0U);
    EXPECT_EQ(LoopbackDriver::open().counts().buffers, 0);
}

int make_file(size_t size, int seals) {
    const int fd = memfd_create("peer", MFD_CLOEXEC | MFD_ALLOW_SEALING);
    EXPECT_EQ(ftruncate(fd, static_cast<off_t>(size)), 0);
    EXPECT_EQ(fcntl(fd, F_ADD_SEALS, seals), 0);
    return fd;
}

status_t answer_with(Parcel* reply, int fd, uint32_t size, uint32_t flags, uint32_t offset) {
    reply->writeFileDescriptor(fd, true);
    reply->writeUint32(size);
    reply->writeUint32(flags);
    return reply->writeUint32(offset);
}

TEST(HostileHeap, ThatCouldShrinkIsRefused) {
    expect_refused([](Parcel* reply) {
        return answer_with(reply, make_file(kPage, F_SEAL_GROW), static_cast<uint32_t>(kPage), 0, 0);
    });
}

TEST(HostileHeap, ThatIsShorterThanItSaysIsRefused) {
    const auto page = static_cast<uint32_t>(kPage);
    expect_refused([=](Parcel* reply) { return answer_with(reply, make_file(kPage, F_SEAL_SHRINK), page + 1, 0, 0); });
    expect_refused([=](Parcel* reply) { return answer_with(reply, make_file(kPage, F_SEAL_SHRINK), page, 0, page); });
    expect_refused(
        [=](Parcel* reply) { return answer_with(reply, make_file(kPage, F_SEAL_SHRINK), page, 0, 0U - page); });
    expect_refused(
        [=](Parcel* reply) { return answer_with(reply, make_file(kPage, F_SEAL_SHRINK), UINT32_MAX, 0, 0); });
}

TEST(HostileHeap, ThatCannotBeMappedIsRefused) {
    const auto page = static_cast<uint32_t>(kPage);
    expect_refused([=](Parcel* reply) { return answer_with(reply, make_file(kPage, F_SEAL_SHRINK), 0, 0, 0); });
    expect_refused([=](Parcel* reply) { return answer_with(reply, make_file(2 * kPage, F_SEAL_SHRINK), page, 0, 1); });
    expect_refused([=](Parcel* reply) {
        return answer_with(reply, make_file(kPage, F_SEAL_SHRINK | F_SEAL_FUTURE_WRITE), page, 0, 0);
    });
}

TEST(HostileHeap, ThatIsNoMemoryFileIsRefused) {
    expect_refused([](Parcel* reply) { return answer_with(reply, open("/dev/zero", O_RDWR | O_CLOEXEC), 16, 0, 0); });
    expect_refused([](Parcel* reply) {
        int ends[2];
        EXPECT_EQ(pipe2(ends, O_CLOEXEC), 0);
        close(ends[1]);
        return answer_with(reply, ends[0], 16, 0, 0);
    });
}

TEST(HostileHeap, ThatAnswersTooLittleIsRefused) {
    expect_refused([](Parcel*) { return NO_ERROR; });
    expect_refused([](Parcel* reply) { return reply->writeInt64(0x12345678); });
    expect_refused([](Parcel* reply) { return reply->writeFileDescriptor(make_file(kPage, F_SEAL_SHRINK), true); });
    expect_refused([](Parcel* reply) {
        reply->writeFileDescriptor(make_file(kPage, F_SEAL_SHRINK), true);
        return reply->writeInt64(16);
    });
}

TEST(HostileHeap, ThatFailsIsRefused) {
    expect_refused([](Parcel*) { return UNKNOWN_ERROR; });
    expect_refused([](Parcel* reply) { return answer_with(reply, -1, 16, 0, 0); });
}

TEST(RemoteHeap, WhoseMappingFailedIsTriedAgain) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IMemoryHeap> client = client_of(heap);
    const size_t descriptors = count_descriptors();
    {
        const LogCapture log;
        const PlatformHook hook(
            "libbinder.so", "mmap", +[](void*, size_t, int, int, int, off_t) -> void* {
                errno = ENOMEM;
                return MAP_FAILED;
            });
        EXPECT_EQ(client->getBase(), MAP_FAILED);
        ASSERT_EQ(log.lines("IMemory").size(), 1U);
        EXPECT_EQ(log.lines("IMemory")[0].text, "A heap of another process could not be mapped: -12");
    }
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_NE(client->getBase(), MAP_FAILED);
}

int refuse_control(int, int, ...) {
    errno = EMFILE;
    return -1;
}

TEST(RemoteHeap, WhoseDescriptorCannotBeDuplicatedIsNone) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IMemoryHeap> client = client_of(heap);
    const LogCapture log;
    const PlatformHook hook("libbinder.so", "fcntl", refuse_control);
    EXPECT_EQ(client->getBase(), MAP_FAILED);
    ASSERT_EQ(log.lines("IMemory").size(), 1U);
    EXPECT_EQ(log.lines("IMemory")[0].text, "A heap of another process could not be mapped: -24");
}

int g_allocations_left;

void* allocate_or_throw(size_t size) {
    if (--g_allocations_left < 0) throw std::bad_alloc();
    return operator new(size);
}

TEST(RemoteHeap, ThatCannotBeAllocatedIsThrownAndTheNextOneIsMade) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IBinder> proxy = LoopbackDriver::open().proxy(heap);
    sp<IMemoryHeap> client;
    int failures = 0;
    for (int allocations = 0; client == nullptr && allocations < 20; ++allocations) {
        g_allocations_left = allocations;
        const PlatformHook hook("libbinder.so", tavo::test::kOperatorNew, allocate_or_throw);
        try {
            client = interface_cast<IMemoryHeap>(proxy);
        } catch (const std::bad_alloc&) {
            ++failures;
        }
    }
    ASSERT_NE(client, nullptr);
    EXPECT_GE(failures, 3);  // the proxy, what its like share, and that one's place among all
    EXPECT_NE(client->getBase(), MAP_FAILED);
}

TEST(RemoteHeap, OfADeadProcessThatWasNeverMappedIsNone) {
    const LogCapture log;
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IMemoryHeap> client = client_of(heap);
    LoopbackDriver::open().kill(IInterface::asBinder(client)->remoteBinder()->handle());
    EXPECT_EQ(client->getBase(), MAP_FAILED);
}

TEST(RemoteHeap, OfADeadProcessThatWasMappedStays) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    const sp<IMemoryHeap> client = client_of(heap);
    strcpy(static_cast<char*>(client->getBase()), "kept");
    LoopbackDriver::open().kill(IInterface::asBinder(client)->remoteBinder()->handle());
    EXPECT_STREQ(static_cast<char*>(client->getBase()), "kept");
}

}  // namespace

// Heaps, where they are made.
#include <binder/MemoryHeapBase.h>
#include <binder/Parcel.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using namespace android;
using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::LogCapture;
using tavo::test::PlatformHook;

const auto kPage = static_cast<size_t>(sysconf(_SC_PAGESIZE));

off_t file_size(int fd) {
    struct stat status = {};
    return fstat(fd, &status) == 0 ? status.st_size : -1;
}

void expect_no_heap(const MemoryHeapBase& heap) {
    EXPECT_EQ(heap.getHeapID(), -1);
    EXPECT_EQ(heap.getBase(), MAP_FAILED);
    EXPECT_EQ(heap.getSize(), 0U);
}

TEST(MemoryHeap, IsZeroedMemoryOfWholePages) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage + 1, 0, "heap");
    EXPECT_EQ(heap->getSize(), 2 * kPage);
    EXPECT_EQ(heap->getOffset(), 0U);
    EXPECT_EQ(heap->getFlags(), 0U);
    ASSERT_NE(heap->getBase(), MAP_FAILED);
    auto* bytes = static_cast<uint8_t*>(heap->getBase());
    for (size_t i = 0; i < heap->getSize(); ++i) ASSERT_EQ(bytes[i], 0);
    memset(bytes, 0x5a, heap->getSize());
    EXPECT_EQ(file_size(heap->getHeapID()), static_cast<off_t>(2 * kPage));
    EXPECT_EQ(heap->heapID(), heap->getHeapID());
    EXPECT_EQ(heap->base(), heap->getBase());
    EXPECT_EQ(heap->virtualSize(), heap->getSize());
    EXPECT_EQ(sp<MemoryHeapBase>(new MemoryHeapBase(1))->getSize(), kPage);
    EXPECT_EQ(sp<MemoryHeapBase>(new MemoryHeapBase(kPage))->getSize(), kPage);
}

TEST(MemoryHeap, IsSeenThroughItsDescriptor) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(100);
    void* other = mmap(nullptr, kPage, PROT_READ | PROT_WRITE, MAP_SHARED, heap->getHeapID(), 0);
    ASSERT_NE(other, MAP_FAILED);
    memcpy(heap->getBase(), "shared", 7);
    EXPECT_STREQ(static_cast<char*>(other), "shared");
    munmap(other, kPage);
}

TEST(MemoryHeap, CannotChangeItsSizeAnyMore) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(2 * kPage);
    const int fd = heap->getHeapID();
    EXPECT_EQ(fcntl(fd, F_GET_SEALS), F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL);
    EXPECT_EQ(ftruncate(fd, static_cast<off_t>(kPage)), -1);
    EXPECT_EQ(errno, EPERM);
    EXPECT_EQ(ftruncate(fd, static_cast<off_t>(3 * kPage)), -1);
    EXPECT_EQ(fcntl(fd, F_ADD_SEALS, F_SEAL_WRITE), -1);
}

TEST(MemoryHeap, ThatIsReadOnlyIsWritableHereAlone) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, MemoryHeapBase::READ_ONLY);
    EXPECT_EQ(heap->getFlags(), uint32_t{IMemoryHeap::READ_ONLY});
    memcpy(heap->getBase(), "mine", 5);
    EXPECT_EQ(mmap(nullptr, kPage, PROT_READ | PROT_WRITE, MAP_SHARED, heap->getHeapID(), 0), MAP_FAILED);
    void* other = mmap(nullptr, kPage, PROT_READ, MAP_SHARED, heap->getHeapID(), 0);
    ASSERT_NE(other, MAP_FAILED);
    EXPECT_STREQ(static_cast<char*>(other), "mine");
    munmap(other, kPage);
}

TEST(MemoryHeap, ShowsItsNameInTheMappings) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, "SharedMemory_42\n");
    EXPECT_EQ(count_mappings(0, "memfd:SharedMemory_42\\012"), 1U);
    const sp<MemoryHeapBase> nameless = new MemoryHeapBase(kPage);
    EXPECT_EQ(count_mappings(0, "memfd:MemoryHeapBase"), 1U);
}

TEST(MemoryHeap, CutsANameThatIsTooLong) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, std::string(1000, 'n').c_str());
    ASSERT_NE(heap->getBase(), MAP_FAILED);
    EXPECT_EQ(count_mappings(0, "memfd:" + std::string(249, 'n') + " "), 1U);
}

TEST(MemoryHeap, GivesEverythingBack) {
    const size_t descriptors = count_descriptors();
    sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, "given-back");
    EXPECT_EQ(count_descriptors(), descriptors + 1);
    EXPECT_NE(fcntl(heap->getHeapID(), F_GETFD) & FD_CLOEXEC, 0);
    EXPECT_EQ(count_mappings(0, "given-back"), 1U);
    heap.clear();
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(count_mappings(0, "given-back"), 0U);
}

TEST(MemoryHeap, CanBeDisposedOfEarlyAndTwice) {
    const size_t descriptors = count_descriptors();
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, 0, "disposed");
    heap->dispose();
    expect_no_heap(*heap);
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(count_mappings(0, "disposed"), 0U);
    heap->dispose();
}

TEST(MemoryHeap, NeedNotBeMappedHere) {
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage, MemoryHeapBase::DONT_MAP_LOCALLY, "unmapped");
    EXPECT_EQ(heap->getBase(), nullptr);
    EXPECT_EQ(heap->getSize(), kPage);
    EXPECT_EQ(count_mappings(0, "unmapped"), 0U);
    EXPECT_EQ(file_size(heap->getHeapID()), static_cast<off_t>(kPage));
}

TEST(MemoryHeap, OfASizeThatCannotBeIsNoHeap) {
    const size_t descriptors = count_descriptors();
    for (const size_t size : {size_t{0}, SIZE_MAX, SIZE_MAX / 2, SIZE_MAX - kPage}) {
        const LogCapture log;
        expect_no_heap(*sp<MemoryHeapBase>(new MemoryHeapBase(size)));
        EXPECT_EQ(log.lines("MemoryHeapBase").size(), 1U) << size;
    }
    EXPECT_EQ(count_descriptors(), descriptors);
}

template <typename Result, typename... Arguments>
void expect_failure(const char* function, Result (*replacement)(Arguments...), const char* message) {
    const size_t descriptors = count_descriptors();
    const LogCapture log;
    const PlatformHook hook("libbinder.so", function, replacement);
    expect_no_heap(*sp<MemoryHeapBase>(new MemoryHeapBase(kPage, 0, "failed")));
    ASSERT_EQ(log.lines("MemoryHeapBase").size(), 1U);
    EXPECT_EQ(log.lines("MemoryHeapBase")[0].text, message);
    EXPECT_EQ(log.lines("MemoryHeapBase")[0].priority, 6);
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(count_mappings(0, "memfd:failed"), 0U);
}

TEST(MemoryHeap, ReportsAFailedFile) {
    expect_failure(
        "memfd_create",
        +[](const char*, unsigned) {
            errno = EMFILE;
            return -1;
        },
        "memfd_create failed: Too many open files");
}

TEST(MemoryHeap, ReportsAFailedSize) {
    expect_failure(
        "ftruncate",
        +[](int, off_t) {
            errno = ENOSPC;
            return -1;
        },
        "ftruncate failed: No space left on device");
}

TEST(MemoryHeap, ReportsAFailedMapping) {
    expect_failure(
        "mmap",
        +[](void*, size_t, int, int, int, off_t) -> void* {
            errno = ENOMEM;
            return MAP_FAILED;
        },
        "mmap failed: Cannot allocate memory");
}

int refuse_control(int, int, ...) {
    errno = EINVAL;
    return -1;
}

TEST(MemoryHeap, ReportsFailedSealsAndStaysUsableHere) {
    const LogCapture log;
    const PlatformHook hook("libbinder.so", "fcntl", refuse_control);
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    EXPECT_NE(heap->getBase(), MAP_FAILED);
    ASSERT_EQ(log.lines("MemoryHeapBase").size(), 1U);
    EXPECT_EQ(log.lines("MemoryHeapBase")[0].text, "F_ADD_SEALS failed: Invalid argument");
}

// A memory file of the test's own.
int make_file(size_t size) {
    const int fd = memfd_create("given", MFD_CLOEXEC | MFD_ALLOW_SEALING);
    EXPECT_EQ(ftruncate(fd, static_cast<off_t>(size)), 0);
    return fd;
}

TEST(MemoryHeapOnAFile, MapsAPartAndDuplicatesTheDescriptor) {
    const size_t descriptors = count_descriptors();
    const int fd = make_file(3 * kPage);
    EXPECT_EQ(pwrite(fd, "there", 6, static_cast<off_t>(kPage)), 6);
    {
        const sp<MemoryHeapBase> heap = new MemoryHeapBase(fd, kPage, 0, static_cast<uint32_t>(kPage));
        EXPECT_NE(heap->getHeapID(), fd);
        EXPECT_NE(fcntl(heap->getHeapID(), F_GETFD) & FD_CLOEXEC, 0);
        EXPECT_EQ(heap->getSize(), kPage);
        EXPECT_EQ(heap->getOffset(), kPage);
        EXPECT_STREQ(static_cast<char*>(heap->getBase()), "there");
        const sp<MemoryHeapBase> rest = new MemoryHeapBase(fd, 0, 0, static_cast<uint32_t>(kPage));
        EXPECT_EQ(rest->getSize(), 2 * kPage) << "up to the end";
    }
    EXPECT_EQ(file_size(fd), static_cast<off_t>(3 * kPage));
    close(fd);
    EXPECT_EQ(count_descriptors(), descriptors);
}

TEST(MemoryHeapOnAFile, ThatCannotBeMappedIsNoHeap) {
    const size_t descriptors = count_descriptors();
    const LogCapture log;
    expect_no_heap(*sp<MemoryHeapBase>(new MemoryHeapBase(-1, kPage)));
    const int fd = make_file(kPage);
    expect_no_heap(*sp<MemoryHeapBase>(new MemoryHeapBase(fd, kPage, 0, 1)));
    expect_no_heap(*sp<MemoryHeapBase>(new MemoryHeapBase(fd, 0, 0, static_cast<uint32_t>(kPage))));
    expect_no_heap(*sp<MemoryHeapBase>(new MemoryHeapBase(fd, 0, 0, 0xFFFFF000U)));
    close(fd);
    EXPECT_EQ(log.lines("MemoryHeapBase").size(), 4U);
    EXPECT_EQ(count_descriptors(), descriptors);
}

TEST(MemoryHeapStub, AnswersWithDescriptorSizeFlagsAndOffset) {
    const int fd = make_file(2 * kPage);
    const sp<MemoryHeapBase> heap =
        new MemoryHeapBase(fd, kPage, MemoryHeapBase::READ_ONLY, static_cast<uint32_t>(kPage));
    Parcel data, reply;
    data.writeInterfaceToken(String16("android.utils.IMemoryHeap"));
    EXPECT_EQ(heap->transact(IBinder::FIRST_CALL_TRANSACTION, data, &reply), NO_ERROR);
    EXPECT_EQ(reply.dataSize(), 24U + 12U);
    EXPECT_EQ(reply.readFileDescriptor(), heap->getHeapID());
    EXPECT_EQ(reply.readInt32(), static_cast<int32_t>(kPage));
    EXPECT_EQ(reply.readInt32(), IMemoryHeap::READ_ONLY);
    EXPECT_EQ(reply.readInt32(), static_cast<int32_t>(kPage));
    close(fd);
}

TEST(MemoryHeapStub, RefusesOtherInterfacesAndCodes) {
    const LogCapture log;
    const sp<MemoryHeapBase> heap = new MemoryHeapBase(kPage);
    Parcel data, reply;
    data.writeInterfaceToken(String16("other"));
    EXPECT_EQ(heap->transact(IMemoryHeap::HEAP_ID, data, &reply), PERMISSION_DENIED);
    EXPECT_EQ(heap->transact(2, data, &reply), UNKNOWN_TRANSACTION);
    EXPECT_EQ(heap->getInterfaceDescriptor(), String16("android.utils.IMemoryHeap"));
    EXPECT_EQ(interface_cast<IMemoryHeap>(heap).get(), heap.get());
}

TEST(MemoryHeapStub, RefusesASizeThatTheReplyCannotHold) {
    if (SIZE_MAX <= UINT32_MAX) GTEST_SKIP() << "there are no such sizes here";
    class Huge : public BnMemoryHeap {
        int getHeapID() const override { return -1; }
        void* getBase() const override { return MAP_FAILED; }
        size_t getSize() const override { return SIZE_MAX; }
        uint32_t getFlags() const override { return 0; }
        uint32_t getOffset() const override { return 0; }
    };
    Parcel data, reply;
    data.writeInterfaceToken(IMemoryHeap::descriptor);
    EXPECT_EQ(sp<BBinder>(new Huge)->transact(IMemoryHeap::HEAP_ID, data, &reply), BAD_VALUE);
}

}  // namespace

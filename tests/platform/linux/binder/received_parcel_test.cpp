// Parcels whose objects come from others: appended ones and received ones.
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <iterator>
#include <vector>

#include "parcel_support.h"
#include "support/log_capture.h"
#include "support/loopback_driver.h"
#include "support/process.h"

namespace {

using namespace android;
using tavo::test::count_descriptors;
using tavo::test::Counted;
using tavo::test::is_close_on_exec;
using tavo::test::is_open;
using tavo::test::is_same_file;
using tavo::test::LogCapture;
using tavo::test::LoopbackDriver;
using tavo::test::offsets_of;
using tavo::test::open_null;

// A parcel as a driver hands it over: the bytes and offsets of another one, which must outlive it. Release counts.
void receive(Parcel& parcel, const Parcel& from, int& releases) {
    parcel.ipcSetDataReference(
        from.data(), from.dataSize(), reinterpret_cast<const binder_size_t*>(from.ipcObjects()), from.ipcObjectsCount(),
        [](Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie) {
            ++*static_cast<int*>(cookie);
        },
        &releases);
}

TEST(ParcelAppend, TakesTheObjectsThatLieWhollyInThePart) {
    int alive = 0;
    Parcel source, target;
    source.writeStrongBinder(new Counted(alive));
    source.writeInt32(0);
    source.writeStrongBinder(new Counted(alive));
    target.writeInt32(0);
    EXPECT_EQ(target.appendFrom(&source, 20, 32), NO_ERROR);
    EXPECT_EQ(offsets_of(target), std::vector<binder_size_t>{12});
    source.freeData();
    EXPECT_EQ(alive, 1) << "the second one is the target's, too";
    target.setDataPosition(12);
    EXPECT_NE(target.readStrongBinder(), nullptr);
    target.freeData();
    EXPECT_EQ(alive, 0);

    source.writeStrongBinder(new Counted(alive));
    EXPECT_EQ(target.appendFrom(&source, 0, 23), NO_ERROR);
    EXPECT_EQ(target.objectsCount(), 0U) << "not wholly";
}

TEST(ParcelAppend, DuplicatesDescriptors) {
    const size_t before = count_descriptors();
    const int fd = open_null();
    Parcel source, target;
    source.writeFileDescriptor(fd);
    source.writeFileDescriptor(-1);
    EXPECT_EQ(target.appendFrom(&source, 0, source.dataSize()), NO_ERROR);
    target.setDataPosition(0);
    const int duplicate = target.readFileDescriptor();
    EXPECT_NE(duplicate, fd);
    EXPECT_TRUE(is_same_file(duplicate, fd));
    EXPECT_TRUE(is_close_on_exec(duplicate));
    EXPECT_EQ(target.readFileDescriptor(), -1);
    close(fd);
    target.freeData();
    EXPECT_EQ(count_descriptors(), before);
}

TEST(ParcelAppend, OfADescriptorThatCannotBeDuplicatedFailsTheParcel) {
    int releases = 0;
    const int fd = open_null();
    Parcel source, target, received;
    source.writeFileDescriptor(fd);
    close(fd);
    receive(received, source, releases);
    EXPECT_EQ(target.appendFrom(&source, 0, source.dataSize()), -EBADF);
    EXPECT_EQ(target.errorCheck(), -EBADF);
    EXPECT_EQ(received.writeInt32(1), -EBADF) << "nor can it be made the parcel's own";
    EXPECT_EQ(releases, 0);
}

TEST(ParcelAppend, KeepsRemoteBinders) {
    int alive = 0;
    LoopbackDriver& driver = LoopbackDriver::open();
    const int32_t handle = driver.publish(new Counted(alive));
    Parcel source, target;
    source.writeStrongBinder(ProcessState::self()->getStrongProxyForHandle(handle));
    target.appendFrom(&source, 0, source.dataSize());
    source.freeData();
    EXPECT_EQ(driver.references(handle), 1);
    target.freeData();
    EXPECT_EQ(driver.references(handle), 0);
}

TEST(ReceivedParcel, IsGivenBackOnceAndNothingElse) {
    const size_t before = count_descriptors();
    int alive = 0;
    int releases = 0;
    Parcel source;
    source.writeStrongBinder(new Counted(alive));
    source.writeFileDescriptor(open_null(), true);
    {
        Parcel parcel;
        receive(parcel, source, releases);
        EXPECT_EQ(parcel.dataSize(), 48U);
        EXPECT_EQ(parcel.dataPosition(), 0U);
        EXPECT_EQ(parcel.dataCapacity(), 48U);
        EXPECT_EQ(parcel.objectsCount(), 2U);
        EXPECT_TRUE(parcel.hasFileDescriptors());
        EXPECT_NE(parcel.readStrongBinder(), nullptr);
        EXPECT_TRUE(is_open(parcel.readFileDescriptor()));
        EXPECT_EQ(releases, 0);
    }
    EXPECT_EQ(releases, 1);
    EXPECT_EQ(alive, 1);
    EXPECT_EQ(count_descriptors(), before + 1) << "descriptors are the driver's to close";
}

TEST(ReceivedParcel, IsGivenBackWhenItIsReplaced) {
    int first = 0;
    int second = 0;
    Parcel source, parcel;
    source.writeInt32(5);
    receive(parcel, source, first);
    receive(parcel, source, second);
    EXPECT_EQ(first, 1);
    EXPECT_EQ(parcel.setData(parcel.data(), 4), NO_ERROR) << "its own bytes";
    EXPECT_EQ(second, 1);
    EXPECT_EQ(parcel.readInt32(), 5);
    receive(parcel, source, second);
    parcel.freeData();
    EXPECT_EQ(second, 2);
    EXPECT_EQ(parcel.dataSize(), 0U);
}

TEST(ReceivedParcel, CanBeEmptyAndWithoutAReleaseFunction) {
    int releases = 0;
    const Parcel nothing;
    Parcel parcel;
    receive(parcel, nothing, releases);
    EXPECT_EQ(parcel.readInt32(), 0);
    EXPECT_EQ(parcel.readStrongBinder(), nullptr);
    EXPECT_EQ(parcel.writeInt32(3), NO_ERROR);
    EXPECT_EQ(releases, 1);
    const uint8_t bytes[4] = {9, 0, 0, 0};
    parcel.ipcSetDataReference(bytes, 4, nullptr, 0, nullptr, nullptr);
    EXPECT_EQ(parcel.readInt32(), 9);
}

TEST(ReceivedParcel, BecomesTheWritersOwnWhenItIsWrittenTo) {
    const size_t before = count_descriptors();
    int alive = 0;
    int releases = 0;
    Parcel source, parcel;
    source.writeInt32(1);
    source.writeStrongBinder(new Counted(alive));
    source.writeFileDescriptor(open_null(), true);
    receive(parcel, source, releases);
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.writeInt32(2), NO_ERROR);
    EXPECT_EQ(releases, 1);
    EXPECT_EQ(parcel.dataSize(), source.dataSize());
    EXPECT_NE(parcel.data(), source.data());
    EXPECT_EQ(count_descriptors(), before + 2) << "a descriptor of its own";
    source.freeData();
    EXPECT_EQ(alive, 1) << "a reference of its own";
    EXPECT_NE(parcel.readStrongBinder(), nullptr);
    EXPECT_TRUE(is_open(parcel.readFileDescriptor()));
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readInt32(), 2);
    parcel.freeData();
    EXPECT_EQ(alive, 0);
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_EQ(releases, 1);
}

TEST(ReceivedParcel, BecomesTheWritersOwnWhenItsSizeOrCapacityIsSet) {
    int releases = 0;
    Parcel source, parcel;
    source.writeInt64(-1);
    receive(parcel, source, releases);
    EXPECT_EQ(parcel.setDataSize(4), NO_ERROR);
    EXPECT_EQ(releases, 1);
    receive(parcel, source, releases);
    EXPECT_EQ(parcel.setDataCapacity(100), NO_ERROR);
    EXPECT_EQ(releases, 2);
    EXPECT_EQ(parcel.readInt64(), -1);
}

TEST(ReceivedParcel, WithOffsetsOutsideItsBytesHoldsNothingThere) {
    int releases = 0;
    uint8_t bytes[40];
    memset(bytes, 0, sizeof bytes);
    const uint32_t type = BINDER_TYPE_FD;
    for (const size_t at : {size_t{0}, size_t{16}, size_t{20}, size_t{36}}) memcpy(bytes + at, &type, sizeof type);
    const binder_size_t offsets[] = {20, 36, 40, 41, 0x100000000, UINT64_MAX, UINT64_MAX - 23, 16};
    Parcel parcel;
    parcel.ipcSetDataReference(
        bytes, sizeof bytes, offsets, std::size(offsets),
        [](Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie) {
            ++*static_cast<int*>(cookie);
        },
        &releases);
    EXPECT_TRUE(parcel.hasFileDescriptors()) << "the one at 16";
    const LogCapture log;
    for (size_t position = 0; position < 64; ++position) {
        parcel.setDataPosition(position);
        EXPECT_EQ(parcel.readStrongBinder(), nullptr);
        parcel.setDataPosition(position);
        EXPECT_EQ(parcel.readFileDescriptor(), position == 16 ? 0 : BAD_TYPE) << position;
    }
    parcel.setDataPosition(40);
    EXPECT_EQ(parcel.writeInt32(0), NO_ERROR);
    EXPECT_EQ(parcel.objectsCount(), 1U);
    EXPECT_EQ(releases, 1);
}

TEST(ReceivedParcel, WithObjectsThatOverlapKeepsTheFirstWhenItIsWrittenTo) {
    const size_t before = count_descriptors();
    uint8_t bytes[48];
    memset(bytes, 0, sizeof bytes);
    const uint32_t type = BINDER_TYPE_FD;
    for (const size_t at : {size_t{0}, size_t{16}, size_t{24}}) memcpy(bytes + at, &type, sizeof type);
    const binder_size_t offsets[] = {0, 16, 24, 0};
    Parcel parcel;
    parcel.ipcSetDataReference(bytes, sizeof bytes, offsets, std::size(offsets), nullptr, nullptr);
    parcel.setDataPosition(48);
    EXPECT_EQ(parcel.writeInt32(0), NO_ERROR);
    EXPECT_EQ(offsets_of(parcel), (std::vector<binder_size_t>{0, 24}));
    EXPECT_EQ(count_descriptors(), before + 2);
}

}  // namespace

// Binders and descriptors in a parcel: their bytes, and who holds and closes them.
#include <binder/Binder.h>
#include <binder/BpBinder.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <vector>

#include "support/log_capture.h"
#include "support/loopback_driver.h"
#include "support/process.h"

namespace {

using namespace android;
using tavo::test::count_descriptors;
using tavo::test::LogCapture;
using tavo::test::LoopbackDriver;

constexpr uint32_t kFlags = 0x17f;

// Says when it is destroyed.
class Counted : public BBinder {
public:
    explicit Counted(int& alive) : alive_(alive) { ++alive_; }
    ~Counted() override { --alive_; }

private:
    int& alive_;
};

flat_binder_object object_at(const Parcel& parcel, size_t offset) {
    flat_binder_object object;
    memcpy(&object, parcel.data() + offset, sizeof object);
    return object;
}

std::vector<binder_size_t> offsets_of(const Parcel& parcel) {
    const auto* offsets = reinterpret_cast<const binder_size_t*>(parcel.ipcObjects());
    return {offsets, offsets + parcel.ipcObjectsCount()};
}

int open_null() { return open("/dev/null", O_RDWR | O_CLOEXEC); }
bool is_open(int fd) { return fcntl(fd, F_GETFD) >= 0; }
bool is_close_on_exec(int fd) { return (fcntl(fd, F_GETFD) & FD_CLOEXEC) != 0; }

bool is_same_file(int a, int b) {
    struct stat first = {}, second = {};
    return fstat(a, &first) == 0 && fstat(b, &second) == 0 && first.st_dev == second.st_dev &&
           first.st_ino == second.st_ino;
}

// A parcel as a driver hands it over: the bytes and offsets of another one, which must outlive it. Release counts.
void receive(Parcel& parcel, const Parcel& from, int& releases) {
    parcel.ipcSetDataReference(
        from.data(), from.dataSize(), reinterpret_cast<const binder_size_t*>(from.ipcObjects()), from.ipcObjectsCount(),
        [](Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie) {
            ++*static_cast<int*>(cookie);
        },
        &releases);
}

TEST(ParcelObjectLayout, ALocalBinderIsItsAddressAndItsReferences) {
    int alive = 0;
    const sp<BBinder> binder = new Counted(alive);
    Parcel parcel;
    parcel.writeInt32(1);
    EXPECT_EQ(parcel.writeStrongBinder(binder), NO_ERROR);
    ASSERT_EQ(parcel.dataSize(), 4U + 24U);
    const flat_binder_object object = object_at(parcel, 4);
    EXPECT_EQ(object.hdr.type, uint32_t{BINDER_TYPE_BINDER});
    EXPECT_EQ(object.hdr.type, 0x73622a85U);
    EXPECT_EQ(object.flags, kFlags);
    EXPECT_EQ(object.binder, reinterpret_cast<uintptr_t>(binder->getWeakRefs()));
    EXPECT_EQ(object.cookie, reinterpret_cast<uintptr_t>(binder.get()));
    EXPECT_EQ(offsets_of(parcel), std::vector<binder_size_t>{4});
}

TEST(ParcelObjectLayout, ARemoteBinderIsItsHandle) {
    int alive = 0;
    LoopbackDriver& driver = LoopbackDriver::open();
    const sp<BBinder> binder = new Counted(alive);
    const int32_t handle = driver.publish(binder);
    Parcel parcel;
    parcel.writeStrongBinder(driver.proxy(binder));
    const flat_binder_object object = object_at(parcel, 0);
    EXPECT_EQ(object.hdr.type, uint32_t{BINDER_TYPE_HANDLE});
    EXPECT_EQ(object.flags, kFlags);
    EXPECT_EQ(object.binder, static_cast<binder_uintptr_t>(handle)) << "the bytes behind the handle are zero";
    EXPECT_EQ(object.cookie, 0U);
    EXPECT_EQ(offsets_of(parcel), std::vector<binder_size_t>{0});
}

TEST(ParcelObjectLayout, ANullBinderIsZerosAndNotListed) {
    Parcel parcel;
    EXPECT_EQ(parcel.writeStrongBinder(nullptr), NO_ERROR);
    const flat_binder_object object = object_at(parcel, 0);
    EXPECT_EQ(parcel.dataSize(), 24U);
    EXPECT_EQ(object.hdr.type, uint32_t{BINDER_TYPE_BINDER});
    EXPECT_EQ(object.flags, kFlags);
    EXPECT_EQ(object.binder, 0U);
    EXPECT_EQ(object.cookie, 0U);
    EXPECT_EQ(parcel.objectsCount(), 0U);
}

TEST(ParcelObjectLayout, ADescriptorIsItsNumberAndWhoseItIs) {
    Parcel parcel;
    parcel.writeFileDescriptor(0x1234);
    parcel.writeFileDescriptor(-1);
    parcel.writeDupFileDescriptor(STDIN_FILENO);
    const flat_binder_object borrowed = object_at(parcel, 0);
    EXPECT_EQ(borrowed.hdr.type, uint32_t{BINDER_TYPE_FD});
    EXPECT_EQ(borrowed.flags, kFlags);
    EXPECT_EQ(borrowed.binder, 0x1234U);
    EXPECT_EQ(borrowed.cookie, 0U);
    EXPECT_EQ(object_at(parcel, 24).binder, 0xffffffffU) << "an invalid one can be written";
    EXPECT_EQ(object_at(parcel, 48).cookie, 1U);
    EXPECT_EQ(offsets_of(parcel), (std::vector<binder_size_t>{0, 24, 48}));
    EXPECT_TRUE(parcel.hasFileDescriptors());
}

TEST(ParcelObjects, AreReadBack) {
    int alive = 0;
    const sp<BBinder> binder = new Counted(alive);
    const sp<IBinder> proxy = LoopbackDriver::open().proxy(new Counted(alive));
    Parcel parcel;
    parcel.writeStrongBinder(binder);
    parcel.writeStrongBinder(nullptr);
    parcel.writeFileDescriptor(7);
    parcel.writeStrongBinder(proxy);
    EXPECT_EQ(parcel.objectsCount(), 3U);
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readStrongBinder(), binder);
    EXPECT_EQ(parcel.readStrongBinder(), nullptr);
    EXPECT_EQ(parcel.readFileDescriptor(), 7);
    EXPECT_EQ(parcel.readStrongBinder(), proxy);
    EXPECT_EQ(parcel.dataAvail(), 0U);
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readStrongBinder(), binder) << "and again, backwards in the list";
}

TEST(ParcelObjects, OfTheWrongKindAreLeftWhereTheyAre) {
    int alive = 0;
    Parcel parcel;
    parcel.writeFileDescriptor(7);
    parcel.writeStrongBinder(new Counted(alive));
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readStrongBinder(), nullptr);
    EXPECT_EQ(parcel.dataPosition(), 0U);
    EXPECT_EQ(parcel.readFileDescriptor(), 7);
    EXPECT_EQ(parcel.readFileDescriptor(), BAD_TYPE);
    EXPECT_NE(parcel.readStrongBinder(), nullptr);
    EXPECT_EQ(parcel.readStrongBinder(), nullptr) << "at the end";
    EXPECT_EQ(parcel.readFileDescriptor(), BAD_TYPE);
}

TEST(ParcelObjects, ThatAreNotListedAreRefusedAndLogged) {
    int alive = 0;
    const sp<BBinder> binder = new Counted(alive);
    Parcel genuine;
    genuine.writeStrongBinder(binder);
    genuine.writeFileDescriptor(STDIN_FILENO);
    Parcel forged;
    forged.setData(genuine.data(), genuine.dataSize());
    const LogCapture log;
    EXPECT_EQ(forged.readStrongBinder(), nullptr);
    forged.setDataPosition(24);
    EXPECT_EQ(forged.readFileDescriptor(), BAD_TYPE);
    genuine.setDataPosition(4);
    EXPECT_EQ(genuine.readStrongBinder(), nullptr);
    EXPECT_EQ(genuine.readFileDescriptor(), BAD_TYPE);
    ASSERT_EQ(log.lines("Parcel").size(), 4U);
    EXPECT_EQ(log.lines("Parcel")[1].text.rfind("There is no object at offset 24 of parcel ", 0), 0U);
}

TEST(ParcelObjects, OfUnknownTypesAreNeitherBindersNorDescriptors) {
    flat_binder_object object = {};
    object.hdr.type = BINDER_TYPE_WEAK_BINDER;
    object.binder = object.cookie = 0x1000;
    const binder_size_t offset = 0;
    Parcel parcel;
    parcel.ipcSetDataReference(reinterpret_cast<const uint8_t*>(&object), sizeof object, &offset, 1, nullptr, nullptr);
    EXPECT_EQ(parcel.readStrongBinder(), nullptr);
    EXPECT_EQ(parcel.readFileDescriptor(), BAD_TYPE);
    EXPECT_FALSE(parcel.hasFileDescriptors());
}

// Neither an object nor a proxy.
class Stray : public BBinder {
public:
    BBinder* localBinder() override { return nullptr; }
};

TEST(ParcelObjects, ABinderOfNoKindIsRefused) {
    const LogCapture log;
    Parcel parcel;
    EXPECT_EQ(parcel.writeStrongBinder(new Stray), BAD_TYPE);
    EXPECT_EQ(parcel.errorCheck(), BAD_TYPE);
    EXPECT_EQ(parcel.dataSize(), 0U);
    EXPECT_EQ(log.lines("Parcel").size(), 1U);
}

TEST(ParcelOwnership, ALocalBinderIsHeldUntilTheParcelIsFreed) {
    int alive = 0;
    Parcel parcel;
    parcel.writeStrongBinder(new Counted(alive));
    EXPECT_EQ(alive, 1);
    parcel.freeData();
    EXPECT_EQ(alive, 0);
    {
        Parcel scoped;
        scoped.writeStrongBinder(new Counted(alive));
        EXPECT_EQ(alive, 1);
    }
    EXPECT_EQ(alive, 0);
}

TEST(ParcelOwnership, ARemoteBinderIsHeldUntilTheParcelIsFreed) {
    int alive = 0;
    LoopbackDriver& driver = LoopbackDriver::open();
    const int32_t handle = driver.publish(new Counted(alive));
    Parcel parcel;
    parcel.writeStrongBinder(ProcessState::self()->getStrongProxyForHandle(handle));
    EXPECT_EQ(driver.references(handle), 1);
    parcel.freeData();
    EXPECT_EQ(driver.references(handle), 0);
}

TEST(ParcelOwnership, OnlyOwnedDescriptorsAreClosed) {
    const size_t before = count_descriptors();
    const int borrowed = open_null();
    const int owned = open_null();
    {
        Parcel parcel;
        parcel.writeFileDescriptor(borrowed);
        parcel.writeFileDescriptor(owned, true);
        parcel.writeFileDescriptor(-1, true);
        EXPECT_EQ(parcel.writeDupFileDescriptor(borrowed), NO_ERROR);
        EXPECT_EQ(count_descriptors(), before + 3);
        parcel.setDataPosition(72);
        const int duplicate = parcel.readFileDescriptor();
        EXPECT_NE(duplicate, borrowed);
        EXPECT_TRUE(is_same_file(duplicate, borrowed));
        EXPECT_TRUE(is_close_on_exec(duplicate));
    }
    EXPECT_TRUE(is_open(borrowed));
    EXPECT_FALSE(is_open(owned));
    close(borrowed);
    EXPECT_EQ(count_descriptors(), before);
}

TEST(ParcelOwnership, ADescriptorThatCannotBeDuplicatedFailsTheParcel) {
    Parcel parcel;
    EXPECT_EQ(parcel.writeDupFileDescriptor(-1), -EBADF);
    EXPECT_EQ(parcel.errorCheck(), -EBADF);
    EXPECT_EQ(parcel.objectsCount(), 0U);
}

TEST(ParcelOwnership, AFailedWriteDoesNotTakeADescriptor) {
    const size_t before = count_descriptors();
    const int fd = open_null();
    Parcel parcel;
    parcel.setError(BAD_VALUE);
    EXPECT_EQ(parcel.writeFileDescriptor(fd, true), BAD_VALUE);
    EXPECT_EQ(parcel.writeDupFileDescriptor(fd), BAD_VALUE);
    parcel.freeData();
    EXPECT_TRUE(is_open(fd));
    close(fd);
    EXPECT_EQ(count_descriptors(), before);
}

TEST(ParcelOwnership, OverwrittenAndCutObjectsAreForgotten) {
    const size_t before = count_descriptors();
    int alive = 0;
    Parcel parcel;
    parcel.writeFileDescriptor(open_null(), true);
    parcel.writeFileDescriptor(open_null(), true);
    parcel.writeStrongBinder(new Counted(alive));
    parcel.setDataPosition(20);  // the end of the first object, the beginning of the second
    parcel.writeInt64(0);
    EXPECT_EQ(offsets_of(parcel), std::vector<binder_size_t>{48});
    EXPECT_EQ(count_descriptors(), before);
    parcel.setDataSize(71);
    EXPECT_EQ(parcel.objectsCount(), 0U);
    EXPECT_EQ(alive, 1) << "held until the parcel is freed";
    parcel.setDataPosition(0);
    const LogCapture log;
    EXPECT_EQ(parcel.readFileDescriptor(), BAD_TYPE);
    parcel.freeData();
    EXPECT_EQ(alive, 0);
    EXPECT_EQ(count_descriptors(), before);
}

TEST(ParcelOwnership, AnObjectIsWrittenOverAnother) {
    const size_t before = count_descriptors();
    Parcel parcel;
    parcel.writeFileDescriptor(open_null(), true);
    parcel.setDataPosition(0);
    const int fd = open_null();
    parcel.writeFileDescriptor(fd, true);
    EXPECT_EQ(offsets_of(parcel), std::vector<binder_size_t>{0});
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readFileDescriptor(), fd);
    parcel.freeData();
    EXPECT_EQ(count_descriptors(), before);
}

TEST(ParcelOwnership, TheListAscendsWhateverTheOrderOfTheWrites) {
    int alive = 0;
    Parcel parcel;
    parcel.setDataSize(48);
    parcel.setDataPosition(24);
    parcel.writeStrongBinder(new Counted(alive));
    parcel.setDataPosition(0);
    parcel.writeStrongBinder(new Counted(alive));
    EXPECT_EQ(offsets_of(parcel), (std::vector<binder_size_t>{0, 24}));
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
    for (const size_t at : {0, 16, 20, 36}) memcpy(bytes + at, &type, sizeof type);
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
    for (const size_t at : {0, 16, 24}) memcpy(bytes + at, &type, sizeof type);
    const binder_size_t offsets[] = {0, 16, 24, 0};
    Parcel parcel;
    parcel.ipcSetDataReference(bytes, sizeof bytes, offsets, std::size(offsets), nullptr, nullptr);
    parcel.setDataPosition(48);
    EXPECT_EQ(parcel.writeInt32(0), NO_ERROR);
    EXPECT_EQ(offsets_of(parcel), (std::vector<binder_size_t>{0, 24}));
    EXPECT_EQ(count_descriptors(), before + 2);
}

}  // namespace

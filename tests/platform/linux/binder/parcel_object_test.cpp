// Binders and descriptors in a parcel: their bytes, and who holds and closes them.
#include <binder/Binder.h>
#include <binder/BpBinder.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
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

constexpr uint32_t kFlags = 0x17f;

flat_binder_object object_at(const Parcel& parcel, size_t offset) {
    flat_binder_object object;
    memcpy(&object, parcel.data() + offset, sizeof object);
    return object;
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

}  // namespace

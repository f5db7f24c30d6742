// A parcel's buffer: its size and position, its limits, and what it costs.
#include <binder/Parcel.h>
#include <binder/TextOutput.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <new>
#include <string>

#include "parcel_support.h"
#include "support/platform_fault.h"

namespace {

using namespace android;
using tavo::test::Bytes;
using tavo::test::bytes_of;
using tavo::test::PlatformHook;

constexpr size_t kTooLarge = size_t{INT32_MAX} + 1;

TEST(ParcelBuffer, StartsEmpty) {
    const Parcel parcel;
    EXPECT_EQ(parcel.dataSize(), 0U);
    EXPECT_EQ(parcel.dataAvail(), 0U);
    EXPECT_EQ(parcel.dataPosition(), 0U);
    EXPECT_EQ(parcel.dataCapacity(), 0U);
    EXPECT_EQ(parcel.objectsCount(), 0U);
    EXPECT_FALSE(parcel.hasFileDescriptors());
    EXPECT_EQ(parcel.errorCheck(), NO_ERROR);
}

TEST(ParcelBuffer, SizeAndPositionFollowTheWrites) {
    Parcel parcel;
    parcel.writeInt32(1);
    parcel.writeInt32(2);
    EXPECT_EQ(parcel.dataSize(), 8U);
    EXPECT_EQ(parcel.dataPosition(), 8U);
    parcel.setDataPosition(4);
    EXPECT_EQ(parcel.dataAvail(), 4U);
    parcel.writeInt32(3);
    EXPECT_EQ(parcel.dataSize(), 8U) << "overwriting does not grow";
    EXPECT_EQ(bytes_of(parcel), (Bytes{1, 0, 0, 0, 3, 0, 0, 0}));
}

TEST(ParcelBuffer, AWriteBehindTheEndFillsTheGapWithZeros) {
    Parcel parcel;
    parcel.writeInt32(-1);
    parcel.setDataSize(0);
    parcel.setDataPosition(8);
    EXPECT_EQ(parcel.dataAvail(), 0U);
    parcel.writeInt32(5);
    EXPECT_EQ(bytes_of(parcel), (Bytes{0, 0, 0, 0, 0, 0, 0, 0, 5, 0, 0, 0}));
}

TEST(ParcelBuffer, GrowsByZerosAndShrinksByCutting) {
    Parcel parcel;
    parcel.writeInt64(-1);
    EXPECT_EQ(parcel.setDataSize(4), NO_ERROR);
    EXPECT_EQ(parcel.dataPosition(), 4U);
    EXPECT_EQ(parcel.setDataSize(8), NO_ERROR);
    EXPECT_EQ(bytes_of(parcel), (Bytes{0xff, 0xff, 0xff, 0xff, 0, 0, 0, 0}));
    EXPECT_EQ(parcel.setDataSize(100000), NO_ERROR);
    EXPECT_EQ(parcel.dataSize(), 100000U);
    EXPECT_EQ(parcel.data()[99999], 0);
}

TEST(ParcelBuffer, CapacityIsAtLeastWhatWasAskedAndNeverShrinks) {
    Parcel parcel;
    EXPECT_EQ(parcel.setDataCapacity(1000), NO_ERROR);
    EXPECT_GE(parcel.dataCapacity(), 1000U);
    EXPECT_EQ(parcel.dataSize(), 0U);
    const size_t capacity = parcel.dataCapacity();
    EXPECT_EQ(parcel.setDataCapacity(10), NO_ERROR);
    EXPECT_EQ(parcel.dataCapacity(), capacity);
}

TEST(ParcelBuffer, SetDataCopiesTheBytes) {
    Bytes source{1, 2, 3, 4, 5};
    Parcel parcel;
    parcel.writeInt64(-1);
    EXPECT_EQ(parcel.setData(source.data(), source.size()), NO_ERROR);
    source[0] = 99;
    EXPECT_EQ(bytes_of(parcel), (Bytes{1, 2, 3, 4, 5}));
    EXPECT_EQ(parcel.dataPosition(), 0U);
    EXPECT_EQ(parcel.setData(parcel.data() + 1, 3), NO_ERROR) << "its own bytes";
    EXPECT_EQ(bytes_of(parcel), (Bytes{2, 3, 4}));
    EXPECT_EQ(parcel.setData(nullptr, 0), NO_ERROR);
    EXPECT_EQ(parcel.dataSize(), 0U);
    EXPECT_EQ(parcel.setData(source.data(), kTooLarge), BAD_VALUE);
}

TEST(ParcelBuffer, AppendsAPartOfAnotherParcel) {
    Parcel source, target;
    for (int32_t i = 1; i <= 4; ++i) source.writeInt32(i);
    target.writeInt32(9);
    EXPECT_EQ(target.appendFrom(&source, 4, 8), NO_ERROR);
    EXPECT_EQ(target.appendFrom(&target, 0, 4), NO_ERROR) << "from itself";
    EXPECT_EQ(target.appendFrom(&source, 16, 0), NO_ERROR);
    EXPECT_EQ(bytes_of(target), (Bytes{9, 0, 0, 0, 2, 0, 0, 0, 3, 0, 0, 0, 9, 0, 0, 0}));
    EXPECT_EQ(target.appendFrom(&source, 17, 0), BAD_VALUE);
    EXPECT_EQ(target.appendFrom(&source, 12, 5), BAD_VALUE);
    EXPECT_EQ(target.appendFrom(&source, 4, SIZE_MAX), BAD_VALUE);
    EXPECT_EQ(target.errorCheck(), NO_ERROR);
}

TEST(ParcelBuffer, ManyWritesKeepWhatWasWritten) {
    Parcel parcel;
    for (int32_t i = 0; i < 20000; ++i) ASSERT_EQ(parcel.writeInt32(i), NO_ERROR);
    parcel.setDataPosition(0);
    for (int32_t i = 0; i < 20000; ++i) ASSERT_EQ(parcel.readInt32(), i);
}

TEST(ParcelBuffer, AFreedParcelIsLikeANewOne) {
    Parcel parcel;
    parcel.writeInt32(1);
    parcel.setError(BAD_TYPE);
    parcel.freeData();
    EXPECT_EQ(parcel.dataSize(), 0U);
    EXPECT_EQ(parcel.dataPosition(), 0U);
    EXPECT_EQ(parcel.errorCheck(), NO_ERROR);
    parcel.writeInt32(2);
    EXPECT_EQ(bytes_of(parcel), (Bytes{2, 0, 0, 0}));
}

TEST(ParcelLimits, LengthsThatNoParcelHoldsAreRefused) {
    Parcel parcel;
    const uint8_t octet = 0;
    EXPECT_EQ(parcel.write(&octet, kTooLarge), BAD_VALUE);
    parcel.freeData();
    EXPECT_EQ(parcel.write(&octet, SIZE_MAX), BAD_VALUE);
    parcel.freeData();
    EXPECT_EQ(parcel.writeInplace(SIZE_MAX - 2), nullptr);
    EXPECT_EQ(parcel.errorCheck(), BAD_VALUE);
    parcel.freeData();
    EXPECT_EQ(parcel.writeString16(u"", SIZE_MAX / 2), BAD_VALUE);
    parcel.freeData();
    EXPECT_EQ(parcel.writeInt32Array(SIZE_MAX / 2, reinterpret_cast<const int32_t*>(&parcel)), BAD_VALUE);
    parcel.freeData();
    EXPECT_EQ(parcel.writeByteArray(kTooLarge, &octet), BAD_VALUE);
    parcel.freeData();
    EXPECT_EQ(parcel.setDataSize(kTooLarge), NO_MEMORY);
    parcel.freeData();
    EXPECT_EQ(parcel.setDataCapacity(kTooLarge), NO_MEMORY);
    parcel.freeData();
    EXPECT_EQ(parcel.dataSize(), 0U);
}

TEST(ParcelLimits, PositionsThatNoParcelReachesCannotBeWrittenAt) {
    Parcel parcel;
    parcel.setDataPosition(SIZE_MAX);
    EXPECT_EQ(parcel.dataPosition(), size_t{INT32_MAX});
    EXPECT_EQ(parcel.dataAvail(), 0U);
    EXPECT_EQ(parcel.readInt32(), 0);
    EXPECT_EQ(parcel.writeInt32(1), NO_MEMORY);
    EXPECT_EQ(parcel.dataSize(), 0U);
}

TEST(ParcelLimits, AFailedWriteFailsAllLaterOnesAndTheParcelStaysAsItWas) {
    Parcel parcel;
    parcel.writeInt32(1);
    EXPECT_EQ(parcel.write(&parcel, kTooLarge), BAD_VALUE);
    EXPECT_EQ(parcel.errorCheck(), BAD_VALUE);
    EXPECT_EQ(parcel.writeInt32(2), BAD_VALUE);
    EXPECT_EQ(parcel.writeString16(String16("x")), BAD_VALUE);
    EXPECT_EQ(parcel.writeString8(String8("x")), BAD_VALUE);
    EXPECT_EQ(parcel.writeStrongBinder(nullptr), BAD_VALUE);
    EXPECT_EQ(parcel.setDataSize(0), BAD_VALUE);
    EXPECT_EQ(parcel.setDataCapacity(4000), BAD_VALUE);
    EXPECT_EQ(parcel.writeInplace(0), nullptr);
    EXPECT_EQ(bytes_of(parcel), (Bytes{1, 0, 0, 0}));
}

TEST(ParcelLimits, AFailedAllocationIsNoMemory) {
    Parcel parcel;
    const PlatformHook hook(
        "libbinder.so", "realloc", +[](void*, size_t) -> void* { return nullptr; });
    EXPECT_EQ(parcel.writeInt32(1), NO_MEMORY);
    EXPECT_EQ(parcel.errorCheck(), NO_MEMORY);
    EXPECT_EQ(parcel.dataSize(), 0U);
    EXPECT_EQ(parcel.dataPosition(), 0U);
}

int g_allocations = 0;

TEST(ParcelSpeed, ASmallRequestTakesOneAllocationAndAReadNone) {
    const String16 descriptor("tavo.mq");
    g_allocations = 0;
    const PlatformHook blocks(
        "libbinder.so", "realloc", +[](void* block, size_t size) -> void* {
            ++g_allocations;
            return realloc(block, size);
        });
    const PlatformHook objects(
        "libbinder.so", tavo::test::kOperatorNew, +[](size_t size) -> void* {
            ++g_allocations;
            return ::operator new(size);
        });
    Parcel parcel;
    parcel.writeInterfaceToken(descriptor);
    parcel.writeInt32(1);
    parcel.writeInt32(2);
    EXPECT_EQ(g_allocations, 1);
    parcel.setDataPosition(0);
    EXPECT_TRUE(parcel.enforceInterface(descriptor));
    EXPECT_EQ(parcel.readInt32(), 1);
    EXPECT_EQ(parcel.readInt32(), 2);
    EXPECT_EQ(g_allocations, 1);
}

class TextCollector : public TextOutput {
public:
    status_t print(const char* txt, size_t len) override {
        text.append(txt, len);
        return NO_ERROR;
    }
    void moveIndent(int delta) override { indent += delta; }
    void pushBundle() override {}
    void popBundle() override {}

    std::string text;
    int indent = 0;
};

TEST(ParcelPrint, ShowsBytesAndObjects) {
    Parcel parcel;
    for (uint8_t i = 0; i < 5; ++i) parcel.writeInt32(i);
    parcel.writeFileDescriptor(-1);
    parcel.setDataSize(44);
    TextCollector out;
    parcel.print(out);
    EXPECT_EQ(out.text,
              "Parcel: 44 bytes, 1 objects, position 44, error 0\n"
              "00000000: 00 00 00 00 01 00 00 00 02 00 00 00 03 00 00 00\n"
              "00000010: 04 00 00 00 85 2a 64 66 7f 01 00 00 ff ff ff ff\n"
              "00000020: 00 00 00 00 00 00 00 00 00 00 00 00\n"
              "object at 14\n");
    EXPECT_EQ(out.indent, 0);
}

}  // namespace

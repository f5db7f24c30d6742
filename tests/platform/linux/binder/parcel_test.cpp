// A parcel's plain values, byte by byte, and its token.
#include <binder/Binder.h>
#include <binder/IPCThreadState.h>
#include <binder/Parcel.h>
#include <gtest/gtest.h>

#include <string>

#include "parcel_support.h"
#include "support/log_capture.h"

namespace {

using namespace android;
using tavo::test::Bytes;
using tavo::test::bytes_of;
using tavo::test::LogCapture;

// Unnamed objects of one interface.
class Named : public BBinder {
public:
    explicit Named(const char* descriptor) : descriptor_(descriptor) {}
    const String16& getInterfaceDescriptor() const override { return descriptor_; }

private:
    const String16 descriptor_;
};

TEST(ParcelLayout, NumbersAreInHostOrderAndKeepFourByteAlignment) {
    Parcel parcel;
    EXPECT_EQ(parcel.writeInt32(-2), NO_ERROR);
    EXPECT_EQ(parcel.writeInt64(0x0102030405060708), NO_ERROR);
    EXPECT_EQ(parcel.writeUint32(0xa0b0c0d0), NO_ERROR);
    EXPECT_EQ(parcel.writeUint64(0xf1f2f3f4f5f6f7f8), NO_ERROR);
    EXPECT_EQ(bytes_of(parcel), (Bytes{0xfe, 0xff, 0xff, 0xff, 8,    7,    6,    5,    4,    3,    2,    1,
                                       0xd0, 0xc0, 0xb0, 0xa0, 0xf8, 0xf7, 0xf6, 0xf5, 0xf4, 0xf3, 0xf2, 0xf1}));
}

TEST(ParcelLayout, FloatsAreTheirBits) {
    Parcel parcel;
    parcel.writeFloat(1.5F);
    parcel.writeDouble(-2.0);
    EXPECT_EQ(bytes_of(parcel), (Bytes{0, 0, 0xc0, 0x3f, 0, 0, 0, 0, 0, 0, 0, 0xc0}));
}

TEST(ParcelLayout, SmallValuesTakeOneWordEach) {
    Parcel parcel;
    parcel.writeBool(true);
    parcel.writeBool(false);
    parcel.writeChar(u'\u20ac');
    parcel.writeByte(-3);
    EXPECT_EQ(bytes_of(parcel), (Bytes{1, 0, 0, 0, 0, 0, 0, 0, 0xac, 0x20, 0, 0, 0xfd, 0xff, 0xff, 0xff}));
}

TEST(ParcelLayout, BlocksArePaddedWithZeros) {
    for (size_t length = 0; length <= 9; ++length) {
        Parcel parcel;
        parcel.writeInt32(-1);
        parcel.writeInt32(-1);
        parcel.writeInt32(-1);
        parcel.setDataPosition(0);  // what is overwritten must not show through
        const Bytes block(length, 0x5a);
        EXPECT_EQ(parcel.write(block.data(), length), NO_ERROR);
        EXPECT_EQ(parcel.dataPosition(), (length + 3) / 4 * 4);
        for (size_t i = 0; i < parcel.dataPosition(); ++i) EXPECT_EQ(parcel.data()[i], i < length ? 0x5a : 0);
    }
}

TEST(ParcelLayout, CStringsHaveATerminatorAndNoLength) {
    Parcel parcel;
    parcel.writeCString("abc");
    parcel.writeCString("abcd");
    parcel.writeCString("");
    EXPECT_EQ(bytes_of(parcel), (Bytes{'a', 'b', 'c', 0, 'a', 'b', 'c', 'd', 0, 0, 0, 0, 0, 0, 0, 0}));
}

TEST(ParcelLayout, String8HasALengthInBytesAndATerminatorUnlessEmpty) {
    Parcel parcel;
    parcel.writeString8(String8("ab"));
    parcel.writeString8(String8(""));
    parcel.writeString8(String8("abcd"));
    EXPECT_EQ(bytes_of(parcel), (Bytes{2, 0, 0, 0, 'a', 'b', 0,   0,  //
                                       0, 0, 0, 0,                    //
                                       4, 0, 0, 0, 'a', 'b', 'c', 'd', 0, 0, 0, 0}));
}

TEST(ParcelLayout, String16HasALengthInUnitsAndATerminator) {
    Parcel odd, even, empty;
    odd.writeString16(String16("abc"));
    even.writeString16(String16("ab"));
    empty.writeString16(String16());
    EXPECT_EQ(bytes_of(odd), (Bytes{3, 0, 0, 0, 'a', 0, 'b', 0, 'c', 0, 0, 0}));
    EXPECT_EQ(bytes_of(even), (Bytes{2, 0, 0, 0, 'a', 0, 'b', 0, 0, 0, 0, 0}));
    EXPECT_EQ(bytes_of(empty), (Bytes{0, 0, 0, 0, 0, 0, 0, 0}));
}

TEST(ParcelLayout, ANullString16IsLengthMinusOne) {
    Parcel parcel;
    parcel.writeString16(nullptr, 7);
    EXPECT_EQ(bytes_of(parcel), (Bytes{0xff, 0xff, 0xff, 0xff}));
}

TEST(ParcelLayout, ArraysHaveALengthAndANullArrayIsMinusOne) {
    const int32_t numbers[] = {1, 2};
    const uint8_t octets[] = {7, 8, 9};
    Parcel parcel;
    parcel.writeInt32Array(2, numbers);
    parcel.writeByteArray(3, octets);
    parcel.writeInt32Array(2, nullptr);
    parcel.writeByteArray(0, octets);
    EXPECT_EQ(bytes_of(parcel),
              (Bytes{2, 0, 0, 0, 1, 0, 0, 0, 2, 0, 0, 0, 3, 0, 0, 0, 7, 8, 9, 0, 0xff, 0xff, 0xff, 0xff, 0, 0, 0, 0}));
}

TEST(ParcelLayout, TheTokenIsTheStrictModePolicyAndTheDescriptor) {
    Parcel parcel;
    IPCThreadState::self()->setStrictModePolicy(0x21);
    parcel.writeInterfaceToken(String16("tavo.mq"));
    IPCThreadState::self()->setStrictModePolicy(0);
    EXPECT_EQ(bytes_of(parcel),
              (Bytes{0x21, 0, 0x40, 0, 7, 0, 0, 0, 't', 0, 'a', 0, 'v', 0, 'o', 0, '.', 0, 'm', 0, 'q', 0, 0, 0}));
}

TEST(ParcelLayout, NoExceptionIsZero) {
    Parcel parcel;
    parcel.writeNoException();
    EXPECT_EQ(bytes_of(parcel), (Bytes{0, 0, 0, 0}));
}

TEST(ParcelValues, AreReadAsTheyWereWritten) {
    Parcel parcel;
    parcel.writeInt32(INT32_MIN);
    parcel.writeUint32(UINT32_MAX);
    parcel.writeInt64(INT64_MIN);
    parcel.writeUint64(UINT64_MAX);
    parcel.writeFloat(0.25F);
    parcel.writeDouble(1e300);
    parcel.writeIntPtr(INTPTR_MIN);
    parcel.writeBool(true);
    parcel.writeChar(u'x');
    parcel.writeByte(-128);
    parcel.writeCString("text");
    parcel.writeString8(String8("eight"));
    parcel.writeString16(String16("sixteen"));
    parcel.writeString8(String8());
    parcel.writeString16(String16());
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readInt32(), INT32_MIN);
    EXPECT_EQ(parcel.readUint32(), UINT32_MAX);
    EXPECT_EQ(parcel.readInt64(), INT64_MIN);
    EXPECT_EQ(parcel.readUint64(), UINT64_MAX);
    EXPECT_EQ(parcel.readFloat(), 0.25F);
    EXPECT_EQ(parcel.readDouble(), 1e300);
    EXPECT_EQ(parcel.readIntPtr(), INTPTR_MIN);
    EXPECT_TRUE(parcel.readBool());
    EXPECT_EQ(parcel.readChar(), u'x');
    EXPECT_EQ(parcel.readByte(), -128);
    EXPECT_STREQ(parcel.readCString(), "text");
    EXPECT_EQ(parcel.readString8(), String8("eight"));
    EXPECT_EQ(parcel.readString16(), String16("sixteen"));
    EXPECT_EQ(parcel.readString8(), String8());
    EXPECT_EQ(parcel.readString16(), String16());
    EXPECT_EQ(parcel.dataAvail(), 0U);
}

TEST(ParcelValues, AreReadWithTheirStatus) {
    Parcel parcel;
    parcel.writeInt32(1);
    parcel.writeUint32(2);
    parcel.writeInt64(3);
    parcel.writeUint64(4);
    parcel.writeFloat(5);
    parcel.writeDouble(6);
    parcel.writeIntPtr(7);
    parcel.writeBool(true);
    parcel.writeChar(u'9');
    parcel.writeByte(10);
    parcel.setDataPosition(0);
    int32_t int32 = 0;
    uint32_t uint32 = 0;
    int64_t int64 = 0;
    uint64_t uint64 = 0;
    float single = 0;
    double twice = 0;
    intptr_t address = 0;
    bool boolean = false;
    char16_t character = 0;
    int8_t byte = 0;
    EXPECT_EQ(parcel.readInt32(&int32), NO_ERROR);
    EXPECT_EQ(parcel.readUint32(&uint32), NO_ERROR);
    EXPECT_EQ(parcel.readInt64(&int64), NO_ERROR);
    EXPECT_EQ(parcel.readUint64(&uint64), NO_ERROR);
    EXPECT_EQ(parcel.readFloat(&single), NO_ERROR);
    EXPECT_EQ(parcel.readDouble(&twice), NO_ERROR);
    EXPECT_EQ(parcel.readIntPtr(&address), NO_ERROR);
    EXPECT_EQ(parcel.readBool(&boolean), NO_ERROR);
    EXPECT_EQ(parcel.readChar(&character), NO_ERROR);
    EXPECT_EQ(parcel.readByte(&byte), NO_ERROR);
    EXPECT_EQ(int32, 1);
    EXPECT_EQ(uint32, 2U);
    EXPECT_EQ(int64, 3);
    EXPECT_EQ(uint64, 4U);
    EXPECT_EQ(single, 5);
    EXPECT_EQ(twice, 6);
    EXPECT_EQ(address, 7);
    EXPECT_TRUE(boolean);
    EXPECT_EQ(character, u'9');
    EXPECT_EQ(byte, 10);
    EXPECT_EQ(parcel.readInt32(&int32), NOT_ENOUGH_DATA);
    EXPECT_EQ(parcel.readBool(&boolean), NOT_ENOUGH_DATA);
    EXPECT_EQ(parcel.readChar(&character), NOT_ENOUGH_DATA);
    EXPECT_EQ(parcel.readByte(&byte), NOT_ENOUGH_DATA);
    EXPECT_TRUE(boolean);
}

TEST(ParcelToken, OfTheInterfaceIsAcceptedAndItsPolicyTakenOver) {
    Parcel parcel;
    IPCThreadState* thread = IPCThreadState::self();
    thread->setStrictModePolicy(0x5);
    parcel.writeInterfaceToken(String16("some.interface"));
    thread->setStrictModePolicy(0);
    parcel.setDataPosition(0);
    EXPECT_TRUE(parcel.enforceInterface(String16("some.interface")));
    EXPECT_EQ(thread->getStrictModePolicy(), 0x5 | 0x400000);
    EXPECT_EQ(parcel.dataAvail(), 0U);

    thread->setLastTransactionBinderFlags(IBinder::FLAG_ONEWAY);
    parcel.setDataPosition(0);
    EXPECT_TRUE(parcel.enforceInterface(String16("some.interface"), thread));
    EXPECT_EQ(thread->getStrictModePolicy(), 0) << "nobody waits for the violations of a oneway call";
    thread->setLastTransactionBinderFlags(0);
}

TEST(ParcelToken, OfAnotherInterfaceIsRefusedAndLogged) {
    const sp<IBinder> object = new Named("tavo.mq");
    for (const char* wrong : {"android.tavo.osal", "tavo.m", "tavo.mq2", "tavo.mQ", ""}) {
        Parcel parcel;
        parcel.writeInterfaceToken(String16(wrong));
        parcel.setDataPosition(0);
        const LogCapture log;
        EXPECT_FALSE(parcel.checkInterface(object.get())) << wrong;
        ASSERT_EQ(log.lines("Parcel").size(), 1U);
        EXPECT_EQ(log.lines("Parcel")[0].text,
                  std::string("Call for interface '") + wrong + "' reached an object of interface 'tavo.mq'");
    }
    Parcel right;
    right.writeInterfaceToken(String16("tavo.mq"));
    right.setDataPosition(0);
    EXPECT_TRUE(right.checkInterface(object.get()));
}

TEST(ParcelToken, OfNoInterfaceIsRefused) {
    const LogCapture log;
    Parcel empty, null_name;
    null_name.writeInt32(0);
    null_name.writeString16(nullptr, 0);
    null_name.setDataPosition(0);
    EXPECT_FALSE(empty.enforceInterface(String16("any")));
    EXPECT_FALSE(empty.enforceInterface(String16()));
    EXPECT_FALSE(null_name.enforceInterface(String16()));
}

TEST(ParcelException, CodesAreReadAndReplyHeadersSkipped) {
    Parcel parcel;
    parcel.writeInt32(-3);
    parcel.writeInt32(-128);
    parcel.writeInt32(12);  // the header: this word and two more
    parcel.writeInt64(-1);
    parcel.writeInt32(77);
    parcel.setDataPosition(0);
    EXPECT_EQ(parcel.readExceptionCode(), -3);
    EXPECT_EQ(parcel.readExceptionCode(), 0);
    EXPECT_EQ(parcel.readInt32(), 77);
    EXPECT_EQ(parcel.readExceptionCode(), 0) << "an empty reply carries no exception";
}

TEST(ParcelException, HeadersThatReachBeyondTheEndAreRefused) {
    for (const int32_t size : {-1, 9, INT32_MAX, INT32_MIN}) {
        Parcel parcel;
        parcel.writeInt32(-128);
        parcel.writeInt32(size);
        parcel.writeInt32(0);
        parcel.setDataPosition(0);
        EXPECT_EQ(parcel.readExceptionCode(), BAD_VALUE) << size;
        EXPECT_EQ(parcel.dataPosition(), 0U);
    }
}

}  // namespace

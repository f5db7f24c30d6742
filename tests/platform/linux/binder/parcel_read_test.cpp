// A parcel read by somebody who was sent nonsense.
#include <binder/Parcel.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <memory>
#include <random>
#include <vector>

#include "support/log_capture.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace {

using namespace android;

// The bytes in a block of exactly their size, so that AddressSanitizer sees every step beyond it.
class Received {
public:
    explicit Received(const std::vector<uint8_t>& bytes) : bytes_(new uint8_t[bytes.size()]) {
        std::copy(bytes.begin(), bytes.end(), bytes_.get());
        parcel_.ipcSetDataReference(bytes_.get(), bytes.size(), nullptr, 0, nullptr, nullptr);
    }
    const Parcel* operator->() const { return &parcel_; }

private:
    const std::unique_ptr<uint8_t[]> bytes_;
    Parcel parcel_;
};

std::vector<uint8_t> words(std::initializer_list<int32_t> values) {
    std::vector<uint8_t> bytes(values.size() * 4);
    memcpy(bytes.data(), values.begin(), bytes.size());
    return bytes;
}

TEST(ParcelRead, AtTheEndGivesZeroOrNothing) {
    const Received parcel({});
    EXPECT_EQ(parcel->readInt32(), 0);
    EXPECT_EQ(parcel->readUint32(), 0U);
    EXPECT_EQ(parcel->readInt64(), 0);
    EXPECT_EQ(parcel->readUint64(), 0U);
    EXPECT_EQ(parcel->readFloat(), 0);
    EXPECT_EQ(parcel->readDouble(), 0);
    EXPECT_EQ(parcel->readIntPtr(), 0);
    EXPECT_FALSE(parcel->readBool());
    EXPECT_EQ(parcel->readChar(), 0);
    EXPECT_EQ(parcel->readByte(), 0);
    EXPECT_EQ(parcel->readCString(), nullptr);
    EXPECT_EQ(parcel->readString8(), String8());
    EXPECT_EQ(parcel->readString16(), String16());
    EXPECT_EQ(parcel->readStrongBinder(), nullptr);
    EXPECT_EQ(parcel->readFileDescriptor(), BAD_TYPE);
    EXPECT_EQ(parcel->readInplace(1), nullptr);
    EXPECT_EQ(parcel->dataPosition(), 0U);
}

TEST(ParcelRead, OfANumberThatIsCutShortFailsAndStays) {
    for (size_t size = 1; size < 8; ++size) {
        const Received parcel(std::vector<uint8_t>(size, 0xff));
        EXPECT_EQ(parcel->readInt64(), 0);
        EXPECT_EQ(parcel->dataPosition(), 0U);
        EXPECT_EQ(parcel->readInt32(), size >= 4 ? -1 : 0);
        EXPECT_EQ(parcel->readStrongBinder(), nullptr);
    }
}

TEST(ParcelRead, OfABlockBeyondTheEndFailsAndStays) {
    const Received parcel(words({1, 2, 3}));
    uint8_t block[16] = {};
    for (const size_t size :
         {size_t{13}, size_t{16}, size_t{INT32_MAX}, size_t{INT32_MAX} + 1, SIZE_MAX - 2, SIZE_MAX}) {
        EXPECT_EQ(parcel->readInplace(size), nullptr) << size;
        EXPECT_EQ(parcel->read(block, size), NOT_ENOUGH_DATA) << size;
    }
    EXPECT_EQ(parcel->dataPosition(), 0U);
    EXPECT_EQ(parcel->read(block, 9), NO_ERROR);
    EXPECT_EQ(parcel->dataPosition(), 12U);
    EXPECT_EQ(block[4], 2);
    EXPECT_EQ(parcel->read(nullptr, 0), NO_ERROR);
}

TEST(ParcelRead, BehindTheEndFindsNothing) {
    Parcel parcel;
    parcel.setDataPosition(INT32_MAX);
    EXPECT_EQ(parcel.readInplace(0), nullptr);
    EXPECT_EQ(parcel.read(nullptr, 0), NO_ERROR);
    EXPECT_EQ(parcel.readInt32(), 0);
    EXPECT_EQ(parcel.readCString(), nullptr);
    EXPECT_EQ(parcel.readString16(), String16());
    EXPECT_EQ(parcel.readStrongBinder(), nullptr);
}

TEST(ParcelRead, OfABlockWhosePaddingIsMissingFails) {
    const Received parcel({1, 2, 3, 4, 5});
    uint8_t block[5];
    EXPECT_EQ(parcel->read(block, 5), NOT_ENOUGH_DATA);
    EXPECT_EQ(parcel->read(block, 4), NO_ERROR);
}

TEST(ParcelRead, OfAString16WithALengthThatCannotBeFailsAndStays) {
    for (const int32_t length : {-2, INT32_MIN, INT32_MAX, INT32_MAX - 1, 0x7ffffff, 2, 3, 4}) {
        const Received parcel(words({length, 0x00420041}));  // "AB", or one unit and no terminator
        size_t got = 99;
        EXPECT_EQ(parcel->readString16Inplace(&got), nullptr) << length;
        EXPECT_EQ(got, 0U);
        EXPECT_EQ(parcel->dataPosition(), 0U);
        EXPECT_EQ(parcel->readString16(), String16());
    }
}

TEST(ParcelRead, OfAString16WithoutItsTerminatorFailsAndStays) {
    const Received parcel(words({1, 0x00420041}));
    size_t length = 0;
    EXPECT_EQ(parcel->readString16Inplace(&length), nullptr);
    EXPECT_EQ(parcel->dataPosition(), 0U);
    const Received whole(words({1, 0x00000041}));
    EXPECT_EQ(whole->readString16(), String16("A"));
}

TEST(ParcelRead, OfANullString16MovesOn) {
    const Received parcel(words({-1, 5}));
    size_t length = 99;
    EXPECT_EQ(parcel->readString16Inplace(&length), nullptr);
    EXPECT_EQ(length, 0U);
    EXPECT_EQ(parcel->readInt32(), 5);
}

TEST(ParcelRead, OfAString16TellsItsStatus) {
    const Received parcel(words({1, 0x00000041, -1, 1, 0x00420041}));
    String16 text;
    EXPECT_EQ(parcel->readString16(&text), NO_ERROR);
    EXPECT_EQ(text, String16("A"));
    EXPECT_EQ(parcel->readString16(&text), UNEXPECTED_NULL);
    EXPECT_EQ(parcel->readString16(&text), NOT_ENOUGH_DATA);
    EXPECT_EQ(text, String16("A"));
    EXPECT_EQ(parcel->dataPosition(), 12U);
}

TEST(ParcelRead, OfAString16AtAnOddAddressFails) {
    const Received parcel({0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0});
    parcel->setDataPosition(1);
    size_t length = 0;
    EXPECT_EQ(parcel->readString16Inplace(&length), nullptr);
    EXPECT_EQ(parcel->dataPosition(), 1U);
}

TEST(ParcelRead, OfAString8WithALengthThatCannotBeFailsAndStays) {
    for (const int32_t length : {-1, INT32_MIN, INT32_MAX, INT32_MAX - 4, 4, 5, 8}) {
        const Received parcel(words({length, 0x44434241}));
        EXPECT_EQ(parcel->readString8(), String8()) << length;
        EXPECT_EQ(parcel->dataPosition(), 0U);
    }
    const Received unterminated(words({3, 0x44434241}));
    EXPECT_EQ(unterminated->readString8(), String8());
    EXPECT_EQ(unterminated->dataPosition(), 0U);
    const Received whole(words({3, 0x00434241}));
    EXPECT_EQ(whole->readString8(), String8("ABC"));
}

TEST(ParcelRead, OfACStringWithoutAnEndFailsAndStays) {
    const Received parcel(words({0x44434241, 0x48474645}));
    EXPECT_EQ(parcel->readCString(), nullptr);
    EXPECT_EQ(parcel->dataPosition(), 0U);
    const Received cut({'a', 'b', 0});
    EXPECT_EQ(cut->readCString(), nullptr) << "its padding is missing";
}

// Scripts that reach every operation, and some that once were the interesting ones to think of.
TEST(ParcelFuzz, SurvivesItsCorpus) {
    const tavo::test::LogCapture log;
    for (uint8_t operation = 0; operation < 24; ++operation) {
        for (uint8_t type = 0; type < 5; ++type) {
            // Two objects, one over the end of the other, then the operation three times over.
            std::vector<uint8_t> script{2, 0, 0, type, 1, 0, 0, 0, 20, 0, type, 2, 0, 0, 0, 3};
            for (int i = 0; i < 3; ++i) script.insert(script.end(), {operation, 24, 0, 0, 0});
            script.resize(script.size() + 48, 1);
            LLVMFuzzerTestOneInput(script.data(), script.size());
        }
    }
    LLVMFuzzerTestOneInput(nullptr, 0);
}

TEST(ParcelFuzz, SurvivesRandomScripts) {
    const tavo::test::LogCapture log;
    std::mt19937 random(20240607);
    for (int round = 0; round < 4000; ++round) {
        std::vector<uint8_t> script(random() % 512);
        // Half of the bytes small: lengths and offsets that almost fit find more than those that never do.
        for (uint8_t& byte : script) byte = static_cast<uint8_t>(random() % 2 != 0 ? random() : random() % 8);
        LLVMFuzzerTestOneInput(script.data(), script.size());
    }
}

}  // namespace

// A parcel's numbers, strings, byte blocks and interface token.
#include <android/log.h>
#include <binder/IPCThreadState.h>
#include <binder/Parcel.h>

#include <cstring>
#include <limits>

namespace android {
namespace {

constexpr char kTag[] = "Parcel";
constexpr size_t kMaxSize = INT32_MAX;
// What a caller's policy word says on top of the policy: collect violations for the caller.
constexpr int32_t kStrictModePenaltyGather = 0x40 << 16;
// An exception code that is none: a header with a size of its own precedes the reply.
constexpr int32_t kHasReplyHeader = -128;

constexpr size_t padded(size_t len) { return (len + 3) & ~static_cast<size_t>(3); }

}  // namespace

template <typename T>
status_t Parcel::writeAligned(T value) {
    static_assert(sizeof(T) % 4 == 0, "values keep the position aligned");
    uint8_t* bytes = place(sizeof value);
    if (bytes == nullptr) return mError;
    memcpy(bytes, &value, sizeof value);
    return NO_ERROR;
}

template <typename T>
status_t Parcel::readAligned(T* value) const {
    if (dataAvail() < sizeof *value) return NOT_ENOUGH_DATA;
    memcpy(value, mData + mDataPos, sizeof *value);
    mDataPos += sizeof *value;
    return NO_ERROR;
}

template <typename T>
T Parcel::readOrZero() const {
    T value{};
    return readAligned(&value) == NO_ERROR ? value : T{};
}

status_t Parcel::writeInterfaceToken(const String16& interface) {
    writeInt32(IPCThreadState::self()->getStrictModePolicy() | kStrictModePenaltyGather);
    return writeString16(interface);
}

bool Parcel::enforceInterface(const String16& interface, IPCThreadState* threadState) const {
    const int32_t policy = readInt32();
    size_t length = 0;
    const char16_t* sent = readString16Inplace(&length);
    if (threadState == nullptr) threadState = IPCThreadState::self();
    // Nobody waits for a oneway call's violations.
    const bool oneway = (threadState->getLastTransactionBinderFlags() & IBinder::FLAG_ONEWAY) != 0;
    threadState->setStrictModePolicy(oneway ? 0 : policy);

    if (sent != nullptr && length == interface.size() && memcmp(sent, interface.string(), length * sizeof *sent) == 0) {
        return true;
    }
    const String8 expected(interface);
    const String8 got(sent != nullptr ? String8(sent, length) : String8());
    __android_log_print(ANDROID_LOG_WARN, kTag, "Call for interface '%s' reached an object of interface '%s'",
                        got.string(), expected.string());
    return false;
}

bool Parcel::checkInterface(IBinder* binder) const { return enforceInterface(binder->getInterfaceDescriptor()); }

status_t Parcel::write(const void* data, size_t len) {
    void* bytes = writeInplace(len);
    if (bytes == nullptr) return mError;
    if (len != 0) memcpy(bytes, data, len);
    return NO_ERROR;
}

void* Parcel::writeInplace(size_t len) {
    if (len > kMaxSize) {
        fail(BAD_VALUE);
        return nullptr;
    }
    const size_t size = padded(len);
    uint8_t* bytes = place(size);
    if (bytes == nullptr) return nullptr;
    memset(bytes + len, 0, size - len);
    return bytes;
}

status_t Parcel::writeInt32(int32_t val) { return writeAligned(val); }
status_t Parcel::writeUint32(uint32_t val) { return writeAligned(val); }
status_t Parcel::writeInt64(int64_t val) { return writeAligned(val); }
status_t Parcel::writeUint64(uint64_t val) { return writeAligned(val); }
status_t Parcel::writeFloat(float val) { return writeAligned(val); }
status_t Parcel::writeDouble(double val) { return writeAligned(val); }
status_t Parcel::writeIntPtr(intptr_t val) { return writeAligned(val); }
status_t Parcel::writeBool(bool val) { return writeAligned<int32_t>(val ? 1 : 0); }
status_t Parcel::writeChar(char16_t val) { return writeAligned<int32_t>(val); }
status_t Parcel::writeByte(int8_t val) { return writeAligned<int32_t>(val); }
status_t Parcel::writeCString(const char* str) { return write(str, strlen(str) + 1); }
status_t Parcel::writeNoException() { return writeInt32(0); }

status_t Parcel::writeString8(const String8& str) {
    const size_t length = str.length();
    if (length >= kMaxSize) return fail(BAD_VALUE);
    writeInt32(static_cast<int32_t>(length));
    // An empty one is its length alone, unlike an empty String16.
    return length == 0 ? mError : write(str.string(), length + 1);
}

status_t Parcel::writeString16(const String16& str) { return writeString16(str.string(), str.size()); }

status_t Parcel::writeString16(const char16_t* str, size_t len) {
    if (str == nullptr) return writeInt32(-1);
    if (len >= kMaxSize / sizeof *str) return fail(BAD_VALUE);
    writeInt32(static_cast<int32_t>(len));
    const size_t size = len * sizeof *str;
    auto* bytes = static_cast<uint8_t*>(writeInplace(size + sizeof *str));
    if (bytes == nullptr) return mError;
    memcpy(bytes, str, size);
    memset(bytes + size, 0, sizeof *str);
    return NO_ERROR;
}

// A null array is written as length -1.
status_t Parcel::writeArray(size_t len, const void* values, size_t size) {
    if (values == nullptr) return writeInt32(-1);
    if (len > kMaxSize / size) return fail(BAD_VALUE);
    writeInt32(static_cast<int32_t>(len));
    return write(values, len * size);
}

status_t Parcel::writeInt32Array(size_t len, const int32_t* val) { return writeArray(len, val, sizeof *val); }
status_t Parcel::writeByteArray(size_t len, const uint8_t* val) { return writeArray(len, val, sizeof *val); }

status_t Parcel::read(void* outData, size_t len) const {
    if (len == 0) return NO_ERROR;
    const void* bytes = readInplace(len);
    if (bytes == nullptr) return NOT_ENOUGH_DATA;
    memcpy(outData, bytes, len);
    return NO_ERROR;
}

const void* Parcel::readInplace(size_t len) const {
    if (mDataPos > mDataSize || len > kMaxSize || padded(len) > dataAvail()) return nullptr;
    const void* bytes = mData + mDataPos;
    mDataPos += padded(len);
    return bytes;
}

status_t Parcel::readInt32(int32_t* pArg) const { return readAligned(pArg); }
status_t Parcel::readUint32(uint32_t* pArg) const { return readAligned(pArg); }
status_t Parcel::readInt64(int64_t* pArg) const { return readAligned(pArg); }
status_t Parcel::readUint64(uint64_t* pArg) const { return readAligned(pArg); }
status_t Parcel::readFloat(float* pArg) const { return readAligned(pArg); }
status_t Parcel::readDouble(double* pArg) const { return readAligned(pArg); }
status_t Parcel::readIntPtr(intptr_t* pArg) const { return readAligned(pArg); }

status_t Parcel::readBool(bool* pArg) const {
    int32_t value = 0;
    const status_t status = readAligned(&value);
    if (status == NO_ERROR) *pArg = value != 0;
    return status;
}

status_t Parcel::readChar(char16_t* pArg) const {
    int32_t value = 0;
    const status_t status = readAligned(&value);
    if (status == NO_ERROR) *pArg = static_cast<char16_t>(value);
    return status;
}

status_t Parcel::readByte(int8_t* pArg) const {
    int32_t value = 0;
    const status_t status = readAligned(&value);
    if (status == NO_ERROR) *pArg = static_cast<int8_t>(value);
    return status;
}

int32_t Parcel::readInt32() const { return readOrZero<int32_t>(); }
uint32_t Parcel::readUint32() const { return readOrZero<uint32_t>(); }
int64_t Parcel::readInt64() const { return readOrZero<int64_t>(); }
uint64_t Parcel::readUint64() const { return readOrZero<uint64_t>(); }
float Parcel::readFloat() const { return readOrZero<float>(); }
double Parcel::readDouble() const { return readOrZero<double>(); }
intptr_t Parcel::readIntPtr() const { return readOrZero<intptr_t>(); }
bool Parcel::readBool() const { return readInt32() != 0; }
char16_t Parcel::readChar() const { return static_cast<char16_t>(readInt32()); }
int8_t Parcel::readByte() const { return static_cast<int8_t>(readInt32()); }

const char* Parcel::readCString() const {
    const size_t avail = dataAvail();
    if (avail == 0) return nullptr;
    const uint8_t* start = mData + mDataPos;
    const void* end = memchr(start, 0, avail);
    if (end == nullptr) return nullptr;
    return static_cast<const char*>(readInplace(static_cast<size_t>(static_cast<const uint8_t*>(end) - start) + 1));
}

// The next units and, behind them, a zero unit that is read, too.
const void* Parcel::readTerminated(size_t units, size_t unitSize) const {
    static constexpr uint8_t kZero[sizeof(char16_t)] = {};
    const size_t position = mDataPos;
    if (units > kMaxSize / unitSize - 1) return nullptr;
    const auto* bytes = static_cast<const uint8_t*>(readInplace((units + 1) * unitSize));
    if (bytes == nullptr) return nullptr;
    const bool aligned = reinterpret_cast<uintptr_t>(bytes) % unitSize == 0;
    if (aligned && memcmp(bytes + units * unitSize, kZero, unitSize) == 0) return bytes;
    mDataPos = position;
    return nullptr;
}

String8 Parcel::readString8() const {
    const size_t position = mDataPos;
    const int32_t length = readInt32();
    if (length == 0) return String8();
    const void* text = length > 0 ? readTerminated(static_cast<size_t>(length), 1) : nullptr;
    if (text != nullptr) return String8(static_cast<const char*>(text), static_cast<size_t>(length));
    mDataPos = position;
    return String8();
}

String16 Parcel::readString16() const {
    size_t length = 0;
    const char16_t* text = readString16Inplace(&length);
    return text != nullptr ? String16(text, length) : String16();
}

status_t Parcel::readString16(String16* pArg) const {
    const size_t position = mDataPos;
    size_t length = 0;
    const char16_t* text = readString16Inplace(&length);
    if (text != nullptr) return pArg->setTo(text, length);
    return mDataPos != position ? UNEXPECTED_NULL : NOT_ENOUGH_DATA;
}

const char16_t* Parcel::readString16Inplace(size_t* outLen) const {
    const size_t position = mDataPos;
    *outLen = 0;
    int32_t length = 0;
    if (readAligned(&length) != NO_ERROR || length == -1) return nullptr;
    const void* text = length >= 0 ? readTerminated(static_cast<size_t>(length), sizeof(char16_t)) : nullptr;
    if (text == nullptr) {
        mDataPos = position;
        return nullptr;
    }
    *outLen = static_cast<size_t>(length);
    return static_cast<const char16_t*>(text);
}

int32_t Parcel::readExceptionCode() const {
    const size_t position = mDataPos;
    const int32_t code = readInt32();
    if (code != kHasReplyHeader) return code;
    // The header's size counts its own word. Replies with a header carry no exception.
    const size_t header = mDataPos;
    const int32_t size = readInt32();
    if (size < 0 || static_cast<size_t>(size) > mDataSize - header) {
        mDataPos = position;
        return BAD_VALUE;
    }
    mDataPos = header + static_cast<size_t>(size);
    return NO_ERROR;
}

}  // namespace android

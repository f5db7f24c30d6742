// The contents of one transaction: values, strings, binder objects and file descriptors.
//
// The bytes are the platform's: every value starts at a multiple of four and is padded with zeros, numbers are
// in host order, objects are flat_binder_object records whose offsets are listed beside the data.
//
// A parcel is either written here or received. One that is written holds a strong reference to every binder
// in it, and owns the descriptors it was told to own, until it is freed. One that is received belongs to
// the driver: freeing it calls the driver's release function, which gives everything back. Writing to a
// received parcel makes it a written one first, with references and descriptors of its own.
//
// Reading takes any bytes: it gives a value or fails, and an object is taken only from a place that
// the list of offsets names. A failed read does not move the position. A failed write makes all later ones fail with
// the same status, which errorCheck() tells and transact() returns, so that no half-written parcel is sent.
//
// A parcel may be used by one thread at a time; reading moves the position of a const parcel, too.
#pragma once

#include <binder/IBinder.h>
#include <linux/android/binder.h>
#include <utils/String8.h>

#include <cstddef>
#include <cstdint>
#include <vector>

namespace android {

class IPCThreadState;
class TextOutput;

static_assert(sizeof(binder_uintptr_t) == 8, "parcels have one layout on every target");

class LIBBINDER_EXPORT Parcel {
public:
    Parcel() = default;
    ~Parcel();
    Parcel(const Parcel&) = delete;
    Parcel& operator=(const Parcel&) = delete;

    const uint8_t* data() const { return mData; }
    size_t dataSize() const { return mDataSize; }
    // Bytes from the position to the end.
    size_t dataAvail() const { return mDataPos < mDataSize ? mDataSize - mDataPos : 0; }
    size_t dataPosition() const { return mDataPos; }
    size_t dataCapacity() const { return mRelease != nullptr ? mDataSize : mCapacity; }

    // New bytes are zero. Objects that no longer fit in are dropped.
    status_t setDataSize(size_t size);
    // May lie behind the end: a write fills the gap with zeros.
    void setDataPosition(size_t pos) const;
    status_t setDataCapacity(size_t size);
    // Replaces everything by a copy of these bytes, which hold no objects.
    status_t setData(const uint8_t* buffer, size_t len);
    // Adds a part of another parcel at the position, with the objects that lie wholly in it; descriptors are
    // duplicated.
    status_t appendFrom(const Parcel* parcel, size_t start, size_t len);

    bool hasFileDescriptors() const;
    status_t errorCheck() const { return mError; }
    void setError(status_t err) { mError = err; }
    // Back to an empty parcel, without error.
    void freeData();

    // What a stub checks before anything else: the strict-mode policy of the caller, then the interface's descriptor.
    status_t writeInterfaceToken(const String16& interface);
    // Whether the token is this interface's. Takes the caller's strict-mode policy over to the thread.
    bool enforceInterface(const String16& interface, IPCThreadState* threadState = nullptr) const;
    bool checkInterface(IBinder* binder) const;

    status_t write(const void* data, size_t len);
    // Room for len bytes, to be filled before the parcel is written to again; null on failure.
    void* writeInplace(size_t len);
    status_t writeInt32(int32_t val);
    status_t writeUint32(uint32_t val);
    status_t writeInt64(int64_t val);
    status_t writeUint64(uint64_t val);
    status_t writeFloat(float val);
    status_t writeDouble(double val);
    status_t writeIntPtr(intptr_t val);
    status_t writeBool(bool val);
    status_t writeChar(char16_t val);
    status_t writeByte(int8_t val);
    // With its terminator, without its length.
    status_t writeCString(const char* str);
    status_t writeString8(const String8& str);
    status_t writeString16(const String16& str);
    // A null string is written as one and read as an empty one.
    status_t writeString16(const char16_t* str, size_t len);
    status_t writeInt32Array(size_t len, const int32_t* val);
    status_t writeByteArray(size_t len, const uint8_t* val);
    status_t writeStrongBinder(const sp<IBinder>& val);
    // The descriptor must stay open until the parcel was sent; with takeOwnership the parcel closes it, unless
    // the write failed. An invalid one can be written, but not sent.
    status_t writeFileDescriptor(int fd, bool takeOwnership = false);
    // Writes a duplicate, close-on-exec, that the parcel closes.
    status_t writeDupFileDescriptor(int fd);
    status_t writeNoException();

    status_t read(void* outData, size_t len) const;
    // The next len bytes where they are, valid until the parcel changes; null on failure.
    const void* readInplace(size_t len) const;
    // The value, or 0 on failure.
    int32_t readInt32() const;
    uint32_t readUint32() const;
    int64_t readInt64() const;
    uint64_t readUint64() const;
    float readFloat() const;
    double readDouble() const;
    intptr_t readIntPtr() const;
    bool readBool() const;
    char16_t readChar() const;
    int8_t readByte() const;
    status_t readInt32(int32_t* pArg) const;
    status_t readUint32(uint32_t* pArg) const;
    status_t readInt64(int64_t* pArg) const;
    status_t readUint64(uint64_t* pArg) const;
    status_t readFloat(float* pArg) const;
    status_t readDouble(double* pArg) const;
    status_t readIntPtr(intptr_t* pArg) const;
    status_t readBool(bool* pArg) const;
    status_t readChar(char16_t* pArg) const;
    status_t readByte(int8_t* pArg) const;
    // Null on failure.
    const char* readCString() const;
    // Empty on failure.
    String8 readString8() const;
    String16 readString16() const;
    // UNEXPECTED_NULL for a null string.
    status_t readString16(String16* pArg) const;
    // Terminated; null for a null string and on failure.
    const char16_t* readString16Inplace(size_t* outLen) const;
    // Null on failure.
    sp<IBinder> readStrongBinder() const;
    // The descriptor, which stays the parcel's, or BAD_TYPE.
    int readFileDescriptor() const;
    // 0 for no exception, also behind a reply header, which is skipped.
    int32_t readExceptionCode() const;

    // A dump of the bytes and of the objects.
    void print(TextOutput& to, uint32_t flags = 0) const;

    // What follows is for the driver.

    typedef void (*release_func)(Parcel* parcel, const uint8_t* data, size_t dataSize, const binder_size_t* objects,
                                 size_t objectsSize, void* cookie);

    uintptr_t ipcData() const { return reinterpret_cast<uintptr_t>(mData); }
    size_t ipcDataSize() const { return mDataSize; }
    uintptr_t ipcObjects() const { return reinterpret_cast<uintptr_t>(objects()); }
    size_t ipcObjectsCount() const { return objectsCount(); }
    size_t objectsCount() const { return mRelease != nullptr ? mReceivedCount : mOffsets.size(); }
    // Makes this a received parcel. Objects are this process's own words: see Driver.h.
    void ipcSetDataReference(const uint8_t* data, size_t dataSize, const binder_size_t* objects, size_t objectsCount,
                             release_func relFunc, void* relCookie);

private:
    const binder_size_t* objects() const { return mRelease != nullptr ? mReceived : mOffsets.data(); }

    // Parcel.cpp: the buffer.
    status_t fail(status_t status);
    uint8_t* place(size_t len);
    bool makeRoom(size_t end);
    status_t reserve(size_t capacity);
    status_t makeOwn();

    // ParcelValues.cpp
    template <typename T>
    status_t writeAligned(T value);
    template <typename T>
    status_t readAligned(T* value) const;
    template <typename T>
    T readOrZero() const;
    status_t writeArray(size_t len, const void* values, size_t size);
    const void* readTerminated(size_t units, size_t unitSize) const;

    // ParcelObjects.cpp
    status_t writeObject(const flat_binder_object& object);
    void listObject(size_t offset);
    status_t adoptObjects(const Parcel& from, size_t start, size_t len, size_t to);
    bool readObject(flat_binder_object* object) const;
    bool isListed(size_t offset) const;
    flat_binder_object objectAt(size_t offset) const;
    void dropObjects(size_t start, size_t end);

    uint8_t* mData = nullptr;
    size_t mDataSize = 0;
    // Of the parcel's own buffer; 0 for a received one.
    size_t mCapacity = 0;
    mutable size_t mDataPos = 0;
    status_t mError = NO_ERROR;
    // Where in mOffsets the next object to be read most likely is.
    mutable size_t mNextObject = 0;

    // A written parcel's objects.
    std::vector<binder_size_t> mOffsets;
    std::vector<sp<IBinder>> mHeld;

    // A received parcel's.
    const binder_size_t* mReceived = nullptr;
    size_t mReceivedCount = 0;
    release_func mRelease = nullptr;
    void* mReleaseCookie = nullptr;
};

}  // namespace android

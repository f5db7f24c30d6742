// A parcel's buffer: whose it is, where in it the next bytes go, and what becomes of it.
#include <binder/Parcel.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

namespace android {
namespace {

// Positions and lengths are signed 32-bit numbers in the data, and on the platform.
constexpr size_t kMaxSize = INT32_MAX;
// Holds a token and a few values, so that a small request takes one allocation.
constexpr size_t kFirstCapacity = 256;

void releaseNothing(Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void*) {}

}  // namespace

Parcel::~Parcel() { freeData(); }

status_t Parcel::fail(status_t status) {
    if (mError == NO_ERROR) mError = status;
    return mError;
}

// The place for len bytes at the position, which moves behind them; null, and the parcel in error, on failure.
uint8_t* Parcel::place(size_t len) {
    const size_t position = mDataPos;
    if (len > kMaxSize || position > kMaxSize - len) {
        fail(len > kMaxSize ? BAD_VALUE : NO_MEMORY);
        return nullptr;
    }
    const size_t end = position + len;
    const bool appends = position == mDataSize && end <= mCapacity && mCapacity != 0 && mError == NO_ERROR;
    if (!appends && !makeRoom(end)) return nullptr;
    mDataPos = end;
    if (end > mDataSize) mDataSize = end;
    return mData + position;
}

// What a write other than into free space at the end takes.
bool Parcel::makeRoom(size_t end) {
    if (mError != NO_ERROR) return false;
    if (mRelease != nullptr && makeOwn() != NO_ERROR) return false;
    if (end > mCapacity || mCapacity == 0) {
        const size_t wanted = std::min(end / 2 + end, kMaxSize);
        if (reserve(std::max(wanted, kFirstCapacity)) != NO_ERROR) return false;
    }
    if (mDataPos < mDataSize) {
        dropObjects(mDataPos, end);
    } else {
        memset(mData + mDataSize, 0, mDataPos - mDataSize);
    }
    return true;
}

// Only for a parcel with a buffer of its own.
status_t Parcel::reserve(size_t capacity) {
    if (capacity <= mCapacity) return NO_ERROR;
    if (capacity > kMaxSize) return fail(NO_MEMORY);
    auto* data = static_cast<uint8_t*>(realloc(mData, capacity));
    if (data == nullptr) return fail(NO_MEMORY);
    mData = data;
    mCapacity = capacity;
    return NO_ERROR;
}

// Makes a received parcel a written one of the same contents.
status_t Parcel::makeOwn() {
    if (mRelease == nullptr) return NO_ERROR;
    Parcel own;
    const status_t status = own.appendFrom(this, 0, mDataSize);
    if (status != NO_ERROR) return fail(status);
    mRelease(this, mData, mDataSize, mReceived, mReceivedCount, mReleaseCookie);
    mRelease = nullptr;
    mData = own.mData;
    mCapacity = own.mCapacity;
    own.mData = nullptr;
    own.mCapacity = own.mDataSize = own.mDataPos = 0;
    mOffsets.swap(own.mOffsets);
    mHeld.swap(own.mHeld);
    return NO_ERROR;
}

void Parcel::freeData() {
    if (mRelease != nullptr) {
        const release_func release = mRelease;
        mRelease = nullptr;
        release(this, mData, mDataSize, mReceived, mReceivedCount, mReleaseCookie);
    } else if (mData != nullptr) {
        dropObjects(0, mDataSize);
        free(mData);
        mHeld.clear();
    }
    mData = nullptr;
    mDataSize = mCapacity = mDataPos = 0;
    mError = NO_ERROR;
}

void Parcel::ipcSetDataReference(const uint8_t* data, size_t dataSize, const binder_size_t* objects,
                                 size_t objectsCount, release_func relFunc, void* relCookie) {
    freeData();
    mData = const_cast<uint8_t*>(data);
    mDataSize = dataSize;
    mReceived = objects;
    mReceivedCount = objectsCount;
    mRelease = relFunc != nullptr ? relFunc : releaseNothing;
    mReleaseCookie = relCookie;
}

status_t Parcel::setDataSize(size_t size) {
    if (mError != NO_ERROR) return mError;
    if (size > kMaxSize) return fail(NO_MEMORY);
    if (makeOwn() != NO_ERROR || reserve(size) != NO_ERROR) return mError;
    if (size < mDataSize) {
        dropObjects(size, mDataSize);
    } else if (size > mDataSize) {
        memset(mData + mDataSize, 0, size - mDataSize);
    }
    mDataSize = size;
    mDataPos = std::min(mDataPos, size);
    return NO_ERROR;
}

void Parcel::setDataPosition(size_t pos) const { mDataPos = std::min(pos, kMaxSize); }

status_t Parcel::setDataCapacity(size_t size) {
    if (mError != NO_ERROR) return mError;
    if (makeOwn() != NO_ERROR) return mError;
    return reserve(size);
}

status_t Parcel::setData(const uint8_t* buffer, size_t len) {
    if (len > kMaxSize) return BAD_VALUE;
    Parcel old;  // the bytes may be this parcel's own
    std::swap(mData, old.mData);
    std::swap(mDataSize, old.mDataSize);
    std::swap(mCapacity, old.mCapacity);
    std::swap(mRelease, old.mRelease);
    old.mReceived = mReceived;
    old.mReceivedCount = mReceivedCount;
    old.mReleaseCookie = mReleaseCookie;
    mOffsets.swap(old.mOffsets);
    mHeld.swap(old.mHeld);
    mDataPos = 0;
    mError = NO_ERROR;
    if (len == 0) return NO_ERROR;
    uint8_t* bytes = place(len);
    if (bytes == nullptr) return mError;
    memcpy(bytes, buffer, len);
    mDataPos = 0;
    return NO_ERROR;
}

status_t Parcel::appendFrom(const Parcel* parcel, size_t start, size_t len) {
    if (start > parcel->mDataSize || len > parcel->mDataSize - start) return BAD_VALUE;
    if (len == 0) return mError;
    if (parcel == this) {
        Parcel part;
        const status_t status = part.appendFrom(this, start, len);
        return status != NO_ERROR ? fail(status) : appendFrom(&part, 0, len);
    }
    const size_t to = mDataPos;
    uint8_t* bytes = place(len);
    if (bytes == nullptr) return mError;
    memcpy(bytes, parcel->mData + start, len);
    return adoptObjects(*parcel, start, len, to);
}

}  // namespace android

// A parcel's binder objects and file descriptors.
#include <android/log.h>
#include <binder/Binder.h>
#include <binder/BpBinder.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace android {
namespace {

constexpr char kTag[] = "Parcel";
// The lowest scheduling priority, and that the object takes descriptors: the platform's, on every object.
constexpr uint32_t kObjectFlags = 0x7f | FLAT_BINDER_FLAG_ACCEPTS_FDS;

flat_binder_object makeObject(uint32_t type) {
    flat_binder_object object = {};
    object.hdr.type = type;
    object.flags = kObjectFlags;
    return object;
}

BBinder* localObject(const flat_binder_object& object) {
    return reinterpret_cast<BBinder*>(static_cast<uintptr_t>(object.cookie));
}

int descriptorOf(const flat_binder_object& object) { return static_cast<int>(object.handle); }

// A null binder takes no part in the list of offsets.
bool isNullBinder(const flat_binder_object& object) {
    return object.hdr.type == BINDER_TYPE_BINDER && object.binder == 0 && object.cookie == 0;
}

sp<IBinder> binderOf(const flat_binder_object& object) {
    switch (object.hdr.type) {
        case BINDER_TYPE_BINDER: return localObject(object);
        case BINDER_TYPE_HANDLE:
            return ProcessState::self()->getStrongProxyForHandle(static_cast<int32_t>(object.handle));
        default: return nullptr;
    }
}

// Whether an object at offset lies wholly within the bytes.
bool fits(binder_size_t offset, size_t start, size_t end) {
    return offset >= start && offset <= end && end - offset >= sizeof(flat_binder_object);
}

}  // namespace

flat_binder_object Parcel::objectAt(size_t offset) const {
    flat_binder_object object;
    memcpy(&object, mData + offset, sizeof object);
    return object;
}

// Writes and lists an object. What it stands for is held or owned by the caller's doing.
status_t Parcel::writeObject(const flat_binder_object& object) {
    const size_t offset = mDataPos;
    uint8_t* bytes = place(sizeof object);
    if (bytes == nullptr) return mError;
    memcpy(bytes, &object, sizeof object);
    if (!isNullBinder(object)) listObject(offset);
    return NO_ERROR;
}

// The list ascends, also when objects are written out of order: drivers refuse any other.
void Parcel::listObject(size_t offset) {
    mOffsets.insert(std::upper_bound(mOffsets.begin(), mOffsets.end(), offset), offset);
}

status_t Parcel::writeStrongBinder(const sp<IBinder>& val) {
    if (val == nullptr) return writeObject(makeObject(BINDER_TYPE_BINDER));
    flat_binder_object object = {};
    if (BBinder* local = val->localBinder()) {
        object = makeObject(BINDER_TYPE_BINDER);
        object.binder = reinterpret_cast<uintptr_t>(local->getWeakRefs());
        object.cookie = reinterpret_cast<uintptr_t>(local);
    } else if (BpBinder* proxy = val->remoteBinder()) {
        object = makeObject(BINDER_TYPE_HANDLE);
        object.handle = static_cast<uint32_t>(proxy->handle());
    } else {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "A binder that is neither an object nor a proxy was written");
        return fail(BAD_TYPE);
    }
    const status_t status = writeObject(object);
    if (status == NO_ERROR) mHeld.push_back(val);
    return status;
}

status_t Parcel::writeFileDescriptor(int fd, bool takeOwnership) {
    flat_binder_object object = makeObject(BINDER_TYPE_FD);
    object.handle = static_cast<uint32_t>(fd);
    object.cookie = takeOwnership ? 1 : 0;
    return writeObject(object);
}

status_t Parcel::writeDupFileDescriptor(int fd) {
    const int duplicate = fcntl(fd, F_DUPFD_CLOEXEC, 0);
    if (duplicate < 0) return fail(-errno);
    const status_t status = writeFileDescriptor(duplicate, true);
    if (status != NO_ERROR) close(duplicate);
    return status;
}

// Takes over the objects that lie wholly in a part of another parcel, whose bytes were copied here.
status_t Parcel::adoptObjects(const Parcel& from, size_t start, size_t len, size_t to) {
    const binder_size_t* offsets = from.objects();
    size_t lowest = start;
    for (size_t i = 0; i < from.objectsCount(); ++i) {
        // No object may reach into the one before it: putting a new descriptor in the one would change the other.
        if (!fits(offsets[i], lowest, start + len)) continue;
        lowest = static_cast<size_t>(offsets[i]) + sizeof(flat_binder_object);
        const size_t offset = static_cast<size_t>(offsets[i]) - start + to;
        flat_binder_object object = objectAt(offset);
        if (object.hdr.type == BINDER_TYPE_FD) {
            const int fd = descriptorOf(object);
            const int duplicate = fd >= 0 ? fcntl(fd, F_DUPFD_CLOEXEC, 0) : fd;
            if (fd >= 0 && duplicate < 0) return fail(-errno);
            object.handle = static_cast<uint32_t>(duplicate);
            object.cookie = 1;
            memcpy(mData + offset, &object, sizeof object);
        } else {
            mHeld.push_back(binderOf(object));
        }
        listObject(offset);
    }
    return NO_ERROR;
}

bool Parcel::hasFileDescriptors() const {
    const binder_size_t* offsets = objects();
    return std::any_of(offsets, offsets + objectsCount(), [this](binder_size_t offset) {
        return fits(offset, 0, mDataSize) && objectAt(static_cast<size_t>(offset)).hdr.type == BINDER_TYPE_FD;
    });
}

// Objects are mostly read in the order of the list, so the search starts where the last one ended.
bool Parcel::isListed(size_t offset) const {
    const binder_size_t* offsets = objects();
    const size_t count = objectsCount();
    if (mNextObject > count) mNextObject = 0;
    for (size_t i = 0; i < count; ++i) {
        const size_t index = (mNextObject + i) % count;
        if (offsets[index] != offset) continue;
        mNextObject = index + 1;
        return true;
    }
    return false;
}

// The object at the position; the caller moves on when it is of the type he wants.
bool Parcel::readObject(flat_binder_object* object) const {
    if (dataAvail() < sizeof *object) return false;
    *object = objectAt(mDataPos);
    if (isNullBinder(*object) || isListed(mDataPos)) return true;
    __android_log_print(ANDROID_LOG_ERROR, kTag, "There is no object at offset %zu of parcel %p", mDataPos,
                        static_cast<const void*>(this));
    return false;
}

sp<IBinder> Parcel::readStrongBinder() const {
    flat_binder_object object;
    if (!readObject(&object)) return nullptr;
    sp<IBinder> binder = binderOf(object);
    if (binder != nullptr || isNullBinder(object)) mDataPos += sizeof object;
    return binder;
}

int Parcel::readFileDescriptor() const {
    flat_binder_object object;
    if (!readObject(&object) || object.hdr.type != BINDER_TYPE_FD) return BAD_TYPE;
    mDataPos += sizeof object;
    return descriptorOf(object);
}

// Forgets the written objects that reach into some bytes. Binders stay held until the parcel is freed.
void Parcel::dropObjects(size_t start, size_t end) {
    const auto reachesInto = [this, start, end](binder_size_t offset) {
        if (offset >= end || offset + sizeof(flat_binder_object) <= start) return false;
        const flat_binder_object object = objectAt(static_cast<size_t>(offset));
        const int fd = descriptorOf(object);
        if (object.hdr.type == BINDER_TYPE_FD && object.cookie != 0 && fd >= 0) close(fd);
        return true;
    };
    mOffsets.erase(std::remove_if(mOffsets.begin(), mOffsets.end(), reachesInto), mOffsets.end());
}

}  // namespace android

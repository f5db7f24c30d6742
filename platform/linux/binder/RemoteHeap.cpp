#include "RemoteHeap.h"

#include <android/log.h>
#include <binder/IMemory.h>
#include <binder/Parcel.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <map>

namespace android {
namespace {

constexpr char kTag[] = "IMemory";
const RemoteHeap::Mapping kNoMapping;

struct Cache {
    std::mutex lock;
    std::map<IBinder*, std::weak_ptr<RemoteHeap>> heaps;
};

// Never destroyed: heaps may be held by static objects of any library.
Cache& cache() {
    static Cache& instance = *new Cache;
    return instance;
}

// Whether no owner of the file can take these bytes away again, which would kill whoever touches them.
bool staysLargeEnough(int fd, uint64_t end) {
    const int seals = fcntl(fd, F_GET_SEALS);
    if (seals < 0 || (seals & F_SEAL_SHRINK) == 0) return false;
    struct stat status = {};
    return fstat(fd, &status) == 0 && status.st_size >= 0 && static_cast<uint64_t>(status.st_size) >= end;
}

}  // namespace

std::shared_ptr<RemoteHeap> RemoteHeap::of(const sp<IBinder>& binder) {
    // Declared first and made in one piece: when memory runs out, no heap may go while the lock is held.
    std::shared_ptr<RemoteHeap> heap;
    const std::lock_guard<std::mutex> lock(cache().lock);
    const auto entry = cache().heaps.find(binder.get());
    if (entry != cache().heaps.end()) heap = entry->second.lock();
    if (heap == nullptr) {
        heap = std::make_shared<RemoteHeap>(Key(), binder);
        cache().heaps[binder.get()] = heap;
    }
    return heap;
}

RemoteHeap::~RemoteHeap() {
    if (mMapping.base != MAP_FAILED) munmap(mMapping.base, mMapping.size);
    if (mMapping.fd >= 0) close(mMapping.fd);
    const std::lock_guard<std::mutex> lock(cache().lock);
    const auto entry = cache().heaps.find(mBinder.get());
    // A successor may have taken the place meanwhile.
    if (entry != cache().heaps.end() && entry->second.expired()) cache().heaps.erase(entry);
}

const RemoteHeap::Mapping& RemoteHeap::mapping() {
    if (mMapped.load(std::memory_order_acquire)) return mMapping;
    const std::lock_guard<std::mutex> lock(mLock);
    if (mMapped.load(std::memory_order_relaxed)) return mMapping;
    Mapping mapping;
    const status_t status = ask(&mapping);
    if (status != NO_ERROR) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "A heap of another process could not be mapped: %d", status);
        if (mapping.fd >= 0) close(mapping.fd);
        return kNoMapping;
    }
    mMapping = mapping;
    mMapped.store(true, std::memory_order_release);
    return mMapping;
}

status_t RemoteHeap::ask(Mapping* mapping) {
    Parcel data, reply;
    data.writeInterfaceToken(IMemoryHeap::descriptor);
    const status_t status = mBinder->transact(IMemoryHeap::HEAP_ID, data, &reply);
    if (status != NO_ERROR) return status;

    const int fd = reply.readFileDescriptor();
    uint32_t size = 0;
    if (fd < 0 || reply.readUint32(&size) != NO_ERROR || reply.readUint32(&mapping->flags) != NO_ERROR ||
        reply.readUint32(&mapping->offset) != NO_ERROR) {
        return BAD_VALUE;
    }
    mapping->size = size;
    mapping->fd = fcntl(fd, F_DUPFD_CLOEXEC, 0);
    if (mapping->fd < 0) return -errno;
    if (!staysLargeEnough(mapping->fd, uint64_t{mapping->offset} + size)) return PERMISSION_DENIED;

    const int access = (mapping->flags & IMemoryHeap::READ_ONLY) != 0 ? PROT_READ : PROT_READ | PROT_WRITE;
    mapping->base = mmap(nullptr, mapping->size, access, MAP_SHARED, mapping->fd, static_cast<off_t>(mapping->offset));
    return mapping->base != MAP_FAILED ? NO_ERROR : -errno;
}

}  // namespace android

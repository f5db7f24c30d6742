// A heap of another process, mapped once for all its proxies.
#pragma once

#include <binder/IBinder.h>
#include <sys/mman.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>

namespace android {

class RemoteHeap {
    // Only of() has one.
    struct Key {};

public:
    // What every proxy for the same object shares. Nothing is mapped yet.
    static std::shared_ptr<RemoteHeap> of(const sp<IBinder>& binder);

    RemoteHeap(Key, const sp<IBinder>& binder) : mBinder(binder) {}
    ~RemoteHeap();
    RemoteHeap(const RemoteHeap&) = delete;
    RemoteHeap& operator=(const RemoteHeap&) = delete;

    struct Mapping {
        int fd = -1;
        void* base = MAP_FAILED;
        size_t size = 0;
        uint32_t flags = 0;
        uint32_t offset = 0;
    };

    // The mapping, made now if it is not there. A failed attempt leaves nothing behind, and the next call tries again.
    const Mapping& mapping();

private:
    status_t ask(Mapping* mapping);

    const sp<IBinder> mBinder;
    std::mutex mLock;
    std::atomic<bool> mMapped{false};
    Mapping mMapping;
};

}  // namespace android

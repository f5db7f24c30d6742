// Tells ThreadSanitizer what the counts of shared buffers order: the copies of a String16, a String8 or a Vector share
// one, and whoever lets go of it last frees it after all the others have read it.
//
// The counting and the freeing are one function of libutils, so the releases of one buffer are made to follow one
// another here; the sanitizer is told that, but not of the lock, which would order unrelated buffers, too.
#include <binder/Export.h>
#include <sanitizer/tsan_interface.h>
#include <sched.h>

#include <cstdint>

#include "tsan/NextFunction.h"

namespace {

bool g_locked = false;

[[gnu::no_sanitize("thread")]] void lock() {
    while (__atomic_test_and_set(&g_locked, __ATOMIC_ACQUIRE)) sched_yield();
}

[[gnu::no_sanitize("thread")]] void unlock() { __atomic_clear(&g_locked, __ATOMIC_RELEASE); }

}  // namespace

namespace android {

// Only what is needed of it; its header is libutils' own.
class SharedBuffer {
public:
    LIBBINDER_EXPORT int32_t release(uint32_t flags) const;
};

int32_t SharedBuffer::release(uint32_t flags) const {
    using Function = int32_t (*)(const void* self, uint32_t flags);
    static const auto original = nextFunction<Function>("_ZNK7android12SharedBuffer7releaseEj");
    lock();
    __tsan_acquire(const_cast<SharedBuffer*>(this));
    __tsan_release(const_cast<SharedBuffer*>(this));
    const int32_t before = original(this, flags);
    unlock();
    return before;
}

}  // namespace android

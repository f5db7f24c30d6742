// Tells ThreadSanitizer what RefBase's counts order.
//
// libutils comes without instrumentation, so the sanitizer does not see that a count's last decrement comes after all
// the others: every thread's work on an object before it lets go of it happens before the object's destruction.
// These two functions stand in front of libutils' own and say exactly that.
#include <binder/Export.h>
#include <sanitizer/tsan_interface.h>
#include <utils/RefBase.h>

#include "tsan/NextFunction.h"

namespace android {

using Function = void (*)(const void* self, const void* id);

LIBBINDER_EXPORT void RefBase::decStrong(const void* id) const {
    static const auto original = nextFunction<Function>("_ZNK7android7RefBase9decStrongEPKv");
    __tsan_release(const_cast<RefBase*>(this));
    original(this, id);
}

LIBBINDER_EXPORT void RefBase::onLastStrongRef(const void* id) {
    static const auto original = nextFunction<Function>("_ZN7android7RefBase15onLastStrongRefEPKv");
    __tsan_acquire(this);
    original(this, id);
}

}  // namespace android

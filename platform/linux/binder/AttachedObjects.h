// What programs attach to a binder, by id.
#pragma once

#include <binder/IBinder.h>

#include <map>
#include <mutex>

namespace android {

class AttachedObjects {
public:
    AttachedObjects() = default;
    // Cleans up everything that is still attached.
    ~AttachedObjects();
    AttachedObjects(const AttachedObjects&) = delete;
    AttachedObjects& operator=(const AttachedObjects&) = delete;

    void attach(const void* id, void* object, void* cookie, IBinder::object_cleanup_func cleanup);
    void* find(const void* id) const;
    void detach(const void* id);

private:
    struct Entry {
        void* object;
        void* cookie;
        IBinder::object_cleanup_func cleanup;
    };
    mutable std::mutex mLock;
    std::map<const void*, Entry> mEntries;
};

}  // namespace android

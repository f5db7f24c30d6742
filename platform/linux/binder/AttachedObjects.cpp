#include "AttachedObjects.h"

#include <android/log.h>

namespace android {

AttachedObjects::~AttachedObjects() {
    for (const auto& [id, entry] : mEntries) {
        if (entry.cleanup != nullptr) entry.cleanup(id, entry.object, entry.cookie);
    }
}

void AttachedObjects::attach(const void* id, void* object, void* cookie, IBinder::object_cleanup_func cleanup) {
    const std::lock_guard<std::mutex> lock(mLock);
    const bool added = mEntries.try_emplace(id, Entry{object, cookie, cleanup}).second;
    if (!added) __android_log_print(ANDROID_LOG_ERROR, "IBinder", "An object is already attached for id %p", id);
}

void* AttachedObjects::find(const void* id) const {
    const std::lock_guard<std::mutex> lock(mLock);
    const auto entry = mEntries.find(id);
    return entry != mEntries.end() ? entry->second.object : nullptr;
}

void AttachedObjects::detach(const void* id) {
    const std::lock_guard<std::mutex> lock(mLock);
    mEntries.erase(id);
}

}  // namespace android

#include "Handles.h"

#include <utility>

namespace android::kernel_driver {

bool Handles::acquire(int32_t handle) {
    const std::lock_guard<std::mutex> lock(mutex_);
    return handles_[handle].users++ == 0;
}

Handles::Released Handles::release(int32_t number) {
    Handle dropped;
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end() || --handle->second.users > 0) return {};
    dropped = std::move(handle->second);
    handles_.erase(handle);
    mourned_.erase(dropped.cookie);
    return {true, dropped.cookie};
}

bool Handles::isKnown(int32_t handle) {
    const std::lock_guard<std::mutex> lock(mutex_);
    return handles_.count(handle) != 0;
}

void Handles::markDead(int32_t number) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle != handles_.end()) handle->second.isDead = true;
}

status_t Handles::mourn(int32_t number, const wp<BpBinder>& proxy, uint64_t& cookie) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return BAD_TYPE;
    if (handle->second.isDead) return DEAD_OBJECT;
    handle->second.mourner = proxy;
    if (handle->second.cookie != kNone) return OK;
    cookie = handle->second.cookie = ++lastCookie_;
    mourned_[cookie] = number;
    return OK;
}

uint64_t Handles::forget(int32_t number) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto handle = handles_.find(number);
    if (handle == handles_.end()) return kNone;
    mourned_.erase(handle->second.cookie);
    return std::exchange(handle->second.cookie, kNone);
}

bool Handles::died(uint64_t cookie, Death& death) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto mourned = mourned_.find(cookie);
    if (mourned == mourned_.end()) return false;
    Handle& handle = handles_[mourned->second];
    death = {mourned->second, handle.mourner};
    // Another manager may take the first one's place.
    handle.isDead = death.handle != 0;
    handle.cookie = kNone;
    mourned_.erase(mourned);
    return true;
}

}  // namespace android::kernel_driver

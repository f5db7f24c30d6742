// The objects of other processes that this one uses, and whose death it wants to hear of.
#pragma once

#include <binder/BpBinder.h>

#include <cstddef>
#include <cstdint>
#include <mutex>
#include <unordered_map>

namespace android::kernel_driver {

// The kernel counts references of a process, this counts its users: what changes for the kernel is returned, to be said
// by the caller. A death notification has a cookie of its own, never used again, so that one that was
// taken back while it was on its way means nobody.
class Handles {
public:
    static constexpr uint64_t kNone = 0;

    // True for the first user.
    bool acquire(int32_t handle);
    struct Released {
        bool isLast = false;
        uint64_t cookie = kNone;  // of a notification that is to be taken back first
    };
    Released release(int32_t handle);
    bool isKnown(int32_t handle);
    // A call has found out.
    void markDead(int32_t handle);

    // Sets cookie unless the kernel has been asked already.
    status_t mourn(int32_t handle, const wp<BpBinder>& proxy, uint64_t& cookie);
    // The cookie of the notification that is to be taken back, or kNone.
    uint64_t forget(int32_t handle);
    struct Death {
        int32_t handle = 0;
        wp<BpBinder> mourner;
    };
    // False when nobody wants to hear of it any more.
    bool died(uint64_t cookie, Death& death);

private:
    struct Handle {
        size_t users = 0;
        bool isDead = false;
        uint64_t cookie = kNone;
        wp<BpBinder> mourner;
    };

    std::mutex mutex_;
    std::unordered_map<int32_t, Handle> handles_;
    std::unordered_map<uint64_t, int32_t> mourned_;
    uint64_t lastCookie_ = kNone;
};

}  // namespace android::kernel_driver

// Parcels as a driver hands them over, with objects of any kind at any offsets.
#pragma once

#include <binder/Binder.h>
#include <binder/Parcel.h>
#include <fcntl.h>
#include <linux/android/binder.h>

#include <cstring>
#include <utility>
#include <vector>

#include "fuzz/script.h"

namespace tavo::fuzz {

struct ObjectPlan {
    binder_size_t offset;
    uint8_t type;
    uint32_t number;
};

inline std::vector<ObjectPlan> take_objects(Script& script) {
    std::vector<ObjectPlan> plans;
    for (int count = script.take<uint8_t>() % 8; count > 0; --count) {
        const auto offset = script.take<uint16_t>();
        // Mostly near the beginning, where the bytes are, but sometimes anywhere at all.
        const binder_size_t anywhere = offset % 16 == 15 ? ~binder_size_t{0} - offset / 16 : offset % 256;
        plans.push_back({anywhere, script.take<uint8_t>(), script.take<uint32_t>()});
    }
    return plans;
}

// Where what is written to a received descriptor goes.
inline uint32_t some_descriptor() {
    static const int descriptor = open("/dev/null", O_RDWR | O_CLOEXEC);
    return static_cast<uint32_t>(descriptor);
}

inline flat_binder_object make_object(const ObjectPlan& plan, const android::sp<android::BBinder>& local) {
    constexpr uint32_t kTypes[] = {BINDER_TYPE_BINDER, BINDER_TYPE_HANDLE, BINDER_TYPE_FD, BINDER_TYPE_WEAK_BINDER, 0};
    flat_binder_object object = {};
    object.hdr.type = kTypes[plan.type % (sizeof kTypes / sizeof kTypes[0])];
    object.handle = plan.number;
    if (object.hdr.type == BINDER_TYPE_BINDER) {
        object.binder = reinterpret_cast<uintptr_t>(local->getWeakRefs());
        object.cookie = reinterpret_cast<uintptr_t>(local.get());
    } else if (object.hdr.type == BINDER_TYPE_FD) {
        object.handle = plan.number % 4 == 0 ? UINT32_MAX : some_descriptor();
    }
    return object;
}

// Attaches the bytes, which the parcel gives back. Objects are put in as a driver would, so that only binders of this
// process come with an address, and what a driver could never hand over is taken off the list.
inline void receive(android::Parcel& parcel, std::vector<uint8_t> bytes, const std::vector<ObjectPlan>& plans,
                    const android::sp<android::BBinder>& local) {
    struct Buffer {
        std::vector<uint8_t> bytes;
        std::vector<binder_size_t> offsets;
        bool holds(binder_size_t offset) const {
            return offset <= bytes.size() && bytes.size() - offset >= sizeof(flat_binder_object);
        }
    };
    auto* buffer = new Buffer{std::move(bytes), {}};
    for (const ObjectPlan& plan : plans) {
        if (!buffer->holds(plan.offset)) continue;
        const flat_binder_object object = make_object(plan, local);
        memcpy(buffer->bytes.data() + plan.offset, &object, sizeof object);
    }
    for (const ObjectPlan& plan : plans) {
        if (buffer->holds(plan.offset)) {
            // An object that overlaps another one may have come to claim an address that no driver would.
            flat_binder_object object;
            memcpy(&object, buffer->bytes.data() + plan.offset, sizeof object);
            const auto address = reinterpret_cast<uintptr_t>(local.get());
            if (object.hdr.type == BINDER_TYPE_BINDER && object.cookie != address) continue;
        }
        buffer->offsets.push_back(plan.offset);
    }
    parcel.ipcSetDataReference(
        buffer->bytes.data(), buffer->bytes.size(), buffer->offsets.data(), buffer->offsets.size(),
        [](android::Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie) {
            delete static_cast<Buffer*>(cookie);
        },
        buffer);
}

}  // namespace tavo::fuzz

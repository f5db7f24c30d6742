#include "ObjectTranslator.h"

#include <sys/socket.h>

#include <cstring>
#include <utility>

namespace android::socket_driver {
namespace {

constexpr uint32_t typeOf(WireObject type) { return static_cast<uint32_t>(type); }

// An object whose fields are all that the receiver needs to know.
flat_binder_object wireObject(WireObject type, uint32_t flags) {
    flat_binder_object object{};
    object.hdr.type = typeOf(type);
    object.flags = flags;
    return object;
}

// Whether objects lie where they may: inside the data, aligned, in order and apart from each other.
bool areOffsetsValid(const uint64_t* offsets, size_t count, size_t dataSize) {
    size_t end = 0;
    for (size_t i = 0; i < count; ++i) {
        if (dataSize < sizeof(flat_binder_object) || offsets[i] > dataSize - sizeof(flat_binder_object)) return false;
        if (offsets[i] < end || offsets[i] % sizeof(uint32_t) != 0) return false;
        end = static_cast<size_t>(offsets[i]) + sizeof(flat_binder_object);
    }
    return true;
}

}  // namespace

status_t ObjectTranslator::pack(const Parcel& parcel, Link& link, OutgoingParcel& out) {
    const size_t size = parcel.ipcDataSize();
    const size_t count = parcel.ipcObjectsCount();
    if (size > Driver::kParcelLimit || count > size / sizeof(flat_binder_object)) return FAILED_TRANSACTION;

    OutgoingFrame& frame = out.frame;
    frame.header.magic = kMagic;
    frame.header.dataSize = static_cast<uint32_t>(size);
    frame.header.objectCount = static_cast<uint32_t>(count);
    frame.data = reinterpret_cast<const uint8_t*>(parcel.ipcData());
    if (count == 0) return OK;

    // The parcel stays as it is: objects are rewritten in a copy.
    const auto* offsets = reinterpret_cast<const uint64_t*>(parcel.ipcObjects());
    if (!areOffsetsValid(offsets, count, size)) return FAILED_TRANSACTION;
    out.rewritten.reset(static_cast<uint8_t*>(malloc(size)));
    if (out.rewritten == nullptr) return NO_MEMORY;
    memcpy(out.rewritten.get(), frame.data, size);
    frame.data = out.rewritten.get();
    frame.offsets = offsets;
    for (size_t i = 0; i < count; ++i) {
        flat_binder_object object;
        memcpy(&object, out.rewritten.get() + offsets[i], sizeof object);
        const status_t status = packObject(object, link, out);
        if (status != OK) {
            takeBack(link, out);
            return status;
        }
        memcpy(out.rewritten.get() + offsets[i], &object, sizeof object);
    }
    if (frame.descriptors.size() > kMaxDescriptors) {
        takeBack(link, out);
        return FAILED_TRANSACTION;
    }
    frame.header.descriptorCount = static_cast<uint32_t>(frame.descriptors.size());
    return OK;
}

status_t ObjectTranslator::packObject(flat_binder_object& object, Link& link, OutgoingParcel& out) {
    flat_binder_object wire{};
    switch (object.hdr.type) {
        case BINDER_TYPE_BINDER: {
            const sp<BBinder> local = reinterpret_cast<BBinder*>(static_cast<uintptr_t>(object.cookie));
            if (local == nullptr) {
                wire = wireObject(WireObject::kNull, object.flags);
                break;
            }
            wire = wireObject(WireObject::kSendersNode, object.flags);
            wire.binder = references_.give(link, local);
            if (wire.binder == 0) return DEAD_OBJECT;
            out.given.push_back(wire.binder);
            break;
        }
        case BINDER_TYPE_HANDLE: {
            wire.flags = object.flags;
            const status_t status = packProxy(static_cast<int32_t>(object.handle), wire, link, out);
            if (status != OK) return status;
            break;
        }
        case BINDER_TYPE_FD:
            if (static_cast<int32_t>(object.handle) < 0) return FAILED_TRANSACTION;
            wire = wireObject(WireObject::kDescriptor, object.flags);
            wire.handle = static_cast<uint32_t>(out.frame.descriptors.size());
            out.frame.descriptors.push_back(static_cast<int32_t>(object.handle));
            break;
        default:  // weak references among them: this driver does not carry them
            return FAILED_TRANSACTION;
    }
    object = wire;
    return OK;
}

status_t ObjectTranslator::packProxy(int32_t handle, flat_binder_object& wire, Link& link, OutgoingParcel& out) {
    if (const uint64_t node = references_.acquireFrom(link, handle); node != 0) {
        wire = wireObject(WireObject::kReceiversNode, wire.flags);
        wire.binder = node;
        // The owner must not hear of its being released before it has heard of this.
        out.handles.take(references_, handle);
        return OK;
    }
    References::Route route;
    UniqueFd control;
    if (!references_.route(handle, route)) return FAILED_TRANSACTION;
    const status_t status = introducer_.introduce(route, control);
    if (status != OK) return status;
    wire = wireObject(WireObject::kIntroduction, wire.flags);
    wire.cookie = out.frame.descriptors.size();
    out.frame.descriptors.push_back(control.get());
    out.introductions.push_back(std::move(control));
    return OK;
}

void ObjectTranslator::takeBack(Link& link, OutgoingParcel& out) {
    for (const uint64_t node : out.given) references_.takeBack(link, node, 1);
    out.given.clear();
}

// What came in with a parcel and goes with it.
struct ObjectTranslator::Received {
    UsedHandles handles;
    std::vector<sp<BBinder>> objects;
    std::vector<UniqueFd> descriptors;
};

status_t ObjectTranslator::unpack(Frame& frame, const std::shared_ptr<Link>& link, Parcel& parcel, bool* speaksOfOwn) {
    const size_t size = frame.header.dataSize;
    const size_t count = frame.header.objectCount;
    if (!areOffsetsValid(frame.offsets(), count, size)) return BAD_VALUE;

    std::unique_ptr<Received> received;
    if (count > 0) received = std::make_unique<Received>();
    for (size_t i = 0; i < count; ++i) {
        uint8_t* place = frame.payload.get() + frame.offsets()[i];
        flat_binder_object object;
        memcpy(&object, place, sizeof object);
        // Without its descriptors the frame is of no use, but the references in it must be given back.
        if (!unpackObject(object, frame, link, *received) && !frame.descriptorsLost) return BAD_VALUE;
        memcpy(place, &object, sizeof object);
    }
    for (const UniqueFd& descriptor : frame.descriptors) {
        if (descriptor.valid() && !frame.descriptorsLost) return BAD_VALUE;  // no object speaks of it
    }
    if (speaksOfOwn != nullptr) *speaksOfOwn = received != nullptr && !received->objects.empty();
    if (frame.descriptorsLost) return FAILED_TRANSACTION;
    if (size == 0) return OK;
    const auto* objects = reinterpret_cast<const binder_size_t*>(frame.offsets());
    parcel.ipcSetDataReference(frame.payload.release(), size, objects, count, releaseReceived, received.release());
    return OK;
}

bool ObjectTranslator::unpackObject(flat_binder_object& object, Frame& frame, const std::shared_ptr<Link>& link,
                                    Received& received) {
    flat_binder_object local{};
    local.flags = object.flags;
    const auto setOwn = [&](const sp<BBinder>& own) {
        local.hdr.type = BINDER_TYPE_BINDER;
        local.binder = reinterpret_cast<uintptr_t>(own->getWeakRefs());
        local.cookie = reinterpret_cast<uintptr_t>(own.get());
        received.objects.push_back(own);
    };
    const auto setHandle = [&](int32_t handle) {
        local.hdr.type = BINDER_TYPE_HANDLE;
        local.handle = static_cast<uint32_t>(handle);
        received.handles.take(references_, handle);
    };

    switch (static_cast<WireObject>(object.hdr.type)) {
        case WireObject::kNull: local.hdr.type = BINDER_TYPE_BINDER; break;
        case WireObject::kSendersNode: setHandle(references_.adopt(link, object.binder)); break;
        case WireObject::kReceiversNode: {
            const sp<BBinder> own = references_.find(*link, object.binder);
            if (own == nullptr) return false;
            setOwn(own);
            break;
        }
        case WireObject::kDescriptor: {
            UniqueFd descriptor;
            if (!takeDescriptor(object.handle, frame, descriptor)) return false;
            local.hdr.type = BINDER_TYPE_FD;
            local.handle = static_cast<uint32_t>(descriptor.get());
            local.cookie = 1;  // the parcel's to close
            received.descriptors.push_back(std::move(descriptor));
            break;
        }
        case WireObject::kIntroduction: {
            UniqueFd control;
            sp<BBinder> own;
            int32_t handle = 0;
            if (!takeDescriptor(object.cookie, frame, control)) return false;
            if (!introducer_.meet(std::move(control), own, handle)) return false;
            if (own != nullptr) {
                setOwn(own);
            } else {
                setHandle(handle);
            }
            break;
        }
        default: return false;
    }
    object = local;
    return true;
}

bool ObjectTranslator::takeDescriptor(uint64_t index, Frame& frame, UniqueFd& descriptor) {
    if (index >= frame.descriptors.size()) return false;
    descriptor = std::move(frame.descriptors[static_cast<size_t>(index)]);
    return descriptor.valid();
}

void ObjectTranslator::releaseReceived(Parcel*, const uint8_t* data, size_t, const binder_size_t*, size_t,
                                       void* cookie) {
    delete static_cast<Received*>(cookie);
    free(const_cast<uint8_t*>(data));
}

}  // namespace android::socket_driver

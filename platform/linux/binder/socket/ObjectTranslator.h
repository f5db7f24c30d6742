// Turns the flat objects of parcels into what crosses a link, and back.
#pragma once

#include <binder/Parcel.h>

#include <memory>
#include <vector>

#include "Frame.h"
#include "References.h"

namespace android::socket_driver {

// Makes the acquaintance of processes that only know of each other through a third.
class Introducer {
public:
    // A control connection to the process behind the route, to be passed on: whoever gets it has one reference.
    virtual status_t introduce(const References::Route& route, UniqueFd& control) = 0;
    // What is at the other end of such a connection: an object of this process's own, or a handle in use once more.
    // False when the connection is not what it should be.
    virtual bool meet(UniqueFd control, sp<BBinder>& own, int32_t& handle) = 0;

protected:
    ~Introducer() = default;
};

// A parcel in the receiver's terms. Borrows from the parcel it was made of.
struct OutgoingParcel {
    OutgoingFrame frame;

    Bytes rewritten;                      // data, when the parcel holds objects
    std::vector<UniqueFd> introductions;  // connections passed on with the frame
    std::vector<uint64_t> given;          // nodes the receiver gets a reference to
    UsedHandles handles;                  // that the frame speaks of
};

class ObjectTranslator {
public:
    ObjectTranslator(References& references, Introducer& introducer)
        : references_(references), introducer_(introducer) {}

    // FAILED_TRANSACTION when the parcel cannot be carried. Nothing stays given then.
    status_t pack(const Parcel& parcel, Link& link, OutgoingParcel& out);
    // For a frame that never left, or not wholly.
    void takeBack(Link& link, OutgoingParcel& out);

    // Hands the frame's contents over to an empty parcel. FAILED_TRANSACTION when the kernel could not hand over the
    // descriptors, BAD_VALUE when no well-meaning peer sends such a frame. `speaksOfOwn` tells whether this
    // process's nodes are in it, so that a reply wants a receipt.
    status_t unpack(Frame& frame, const std::shared_ptr<Link>& link, Parcel& parcel, bool* speaksOfOwn = nullptr);

private:
    struct Received;

    status_t packObject(flat_binder_object& object, Link& link, OutgoingParcel& out);
    status_t packProxy(int32_t handle, flat_binder_object& wire, Link& link, OutgoingParcel& out);
    bool unpackObject(flat_binder_object& object, Frame& frame, const std::shared_ptr<Link>& link, Received& received);
    static bool takeDescriptor(uint64_t index, Frame& frame, UniqueFd& descriptor);
    static void releaseReceived(Parcel* parcel, const uint8_t* data, size_t dataSize, const binder_size_t* objects,
                                size_t objectsSize, void* cookie);

    References& references_;
    Introducer& introducer_;
};

}  // namespace android::socket_driver

// What the socket driver's processes say to each other.
//
// Two processes are joined by a link. A link is one control connection (SOCK_SEQPACKET: one message per
// packet) and any number of channels (SOCK_STREAM). On a channel one side calls and the other serves, one
// transaction at a time: a transaction frame, then its reply frame. A side that serves may, before it replies,
// send a transaction of its own along the same channel, which the waiting caller serves: so a call back finds
// the thread that is waiting for it.
//
//   control    server -> client   Welcome, once, when a client connects
//              either way         Channel, with one end of a new channel that the sender will call on
//              either way         Release: the sender gave up references to the receiver's objects
//   channel    Transaction, Reply
//
// All integers are in the byte order of the machine, since both ends are on it.
#pragma once

#include <cstddef>
#include <cstdint>

namespace android::socket_driver {

constexpr uint32_t kMagic = 0x314b5342;  // "BSK1"

enum class FrameType : uint32_t { kTransaction = 1, kReply = 2 };

// A frame is this header, `dataSize` bytes of parcel data padded with zeros to a multiple of 8, and
// `objectCount` 64-bit offsets of flat objects in the data. The frame's descriptors travel with its first byte.
struct FrameHeader {
    uint32_t magic;
    FrameType type;
    uint32_t code;    // of a transaction; the status in a reply
    uint32_t flags;   // of a transaction
    uint64_t target;  // of a transaction: the receiver's node, or kDirectoryNode
    uint32_t dataSize;
    uint32_t objectCount;
    uint32_t descriptorCount;
    uint32_t reserved;  // 0
};
static_assert(sizeof(FrameHeader) == 40);

constexpr size_t padded(size_t size) { return (size + 7) & ~size_t{7}; }

// Types of flat objects on the wire, in flat_binder_object's place and layout. Nodes are numbered by the
// process that owns the object.
enum class WireObject : uint32_t {
    kNull = 1,           // no object
    kSendersNode = 2,    // binder: a node of the sender, with one more reference given to the receiver
    kReceiversNode = 3,  // binder: a node of the receiver that the sender has a reference to
    kDescriptor = 4,     // handle: index among the frame's descriptors
    kIntroduction = 5,   // binder: a node of a third process, with one reference; cookie: index of the
                         // descriptor that is the control connection of a new link to that process
};

// The node that every process serves without having given it away: its directory.
constexpr uint64_t kDirectoryNode = 0;
enum DirectoryCode : uint32_t {
    kLookUp = 1,     // String16 name -> strong binder, or a null one
    kIntroduce = 2,  // int64 node that the caller has a reference to -> descriptor of a control connection to pass on
};

enum class ControlType : uint32_t { kWelcome = 1, kChannel = 2, kRelease = 3 };

struct ControlHeader {
    uint32_t magic;
    ControlType type;
};

struct Welcome {
    ControlHeader header;
    uint64_t instance;  // tells two processes apart that had the same pid
};

struct ReleasedReference {
    uint64_t node;
    uint64_t count;
};

// At most this many references in one Release.
constexpr size_t kReleaseBatch = 64;

// What the kernel passes in one message (SCM_MAX_FD).
constexpr size_t kMaxDescriptors = 253;

}  // namespace android::socket_driver

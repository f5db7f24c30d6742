// What the socket driver's processes say to each other.
//
// Two processes are joined by a link. A link is one control connection (SOCK_SEQPACKET: one message per
// packet) and any number of channels (SOCK_STREAM). On a channel one side calls and the other serves, one
// transaction at a time: a transaction frame, then its reply frame. A side that serves may, before it replies,
// send a transaction of its own along the same channel, which the waiting caller serves: so a call back finds
// the thread that is waiting for it.
//
//   control    Greeting, first and once in either direction: a Welcome from the side that was connected to, or that
//              made the connection for a third process; then a Hello from the side that keeps it
//              Channel, with one end of a new channel that the sender will call on
//              Refusal: there was no room for a channel that the receiver has offered
//              Release: the sender gave up references to the receiver's objects
//   channel    Transaction, Reply, Receipt
//
// All integers are in the byte order of the machine, since both ends are on it.
#pragma once

#include <cstddef>
#include <cstdint>

namespace android::socket_driver {

constexpr uint32_t kMagic = 0x314b5342;  // "BSK1"

enum class FrameType : uint32_t {
    kTransaction = 1,
    kReply = 2,
    // A header alone: the last reply is unpacked. Follows only a reply that speaks of the receiver's own nodes, which
    // its sender must hold on to until then.
    kReceipt = 3,
};

// A frame is this header, `dataSize` bytes of parcel data padded with zeros to a multiple of 8, and `objectCount`
// 64-bit offsets of flat objects in the data. Descriptors travel with the frame's last bytes, so that nobody
// can leave any with a receiver that still waits for the rest.
struct FrameHeader {
    uint32_t magic;
    FrameType type;
    uint32_t code;    // of a transaction; the status in a reply
    uint32_t flags;   // of a transaction
    uint64_t target;  // of a transaction: the receiver's node, or kDirectoryNode
    uint64_t chain;   // of a transaction: the same for a call and all calls made on its behalf, wherever they run
    uint32_t dataSize;
    uint32_t objectCount;
    uint32_t descriptorCount;
    uint32_t reserved;  // 0
};
static_assert(sizeof(FrameHeader) == 48);

constexpr size_t padded(size_t size) { return (size + 7) & ~size_t{7}; }

// Types of flat objects on the wire, in flat_binder_object's place and layout. Nodes are numbered by the
// process that owns the object.
enum class WireObject : uint32_t {
    kNull = 1,           // no object
    kSendersNode = 2,    // binder: a node of the sender, with one more reference given to the receiver
    kReceiversNode = 3,  // binder: a node of the receiver that the sender has a reference to
    kDescriptor = 4,     // handle: index among the frame's descriptors
    kIntroduction = 5,   // cookie: index of the descriptor that is the control connection of a new link to a
                         // third process, whose Welcome names the node that comes with one reference
};

// Every process serves its directory, without having given it away, on channels that are for nothing else: it answers
// even when all threads that run programs' code are busy.
enum class Purpose : uint32_t { kCalls = 0, kDirectory = 1 };
constexpr size_t kPurposes = 2;
constexpr uint64_t kDirectoryNode = 0;
enum DirectoryCode : uint32_t {
    kLookUp = 1,     // String16 name -> strong binder, or a null one
    kIntroduce = 2,  // int64 node that the caller has a reference to -> descriptor of a control connection to pass on
};

enum class ControlType : uint32_t { kWelcome = 1, kHello = 2, kChannel = 3, kRefusal = 4, kRelease = 5 };

struct ControlHeader {
    uint32_t magic;
    ControlType type;
};

struct Greeting {
    ControlHeader header;
    uint64_t instance;     // tells two processes apart that had the same pid
    uint64_t link;         // the sender's number for this link
    uint64_t node;         // of a Welcome to a third process: what it is introduced to
    uint32_t maxChannels;  // how many channels for calls the sender serves here at a time
    uint32_t reserved;     // 0
};

struct ChannelOffer {
    ControlHeader header;
    Purpose purpose;
    uint32_t reserved;  // 0
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

#include "Frame.h"

#include <fcntl.h>
#include <linux/android/binder.h>
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

#include "../Driver.h"

namespace android::socket_driver {
namespace {

constexpr uint8_t kPadding[8] = {};

// Of what follows a header, this much comes with the same system call: a frame that is not larger comes whole.
constexpr size_t kScratchSize = 4096;

// What a larger frame's descriptors travel with. One packet of the kernel's always holds it.
constexpr size_t kTailSize = 8;

// SCM_PIDFD, which headers may lack. Who made a socket can have the kernel send one along with every message, and
// whoever does not expect it keeps a descriptor each time.
constexpr int kScmPidfd = 0x04;

// The parts of a frame between two of its bytes.
struct Segments {
    iovec parts[4];
    size_t count = 0;
    size_t skip;
    size_t left;

    Segments(const OutgoingFrame& frame, size_t from, size_t to) : skip(from), left(to - from) {
        const size_t dataSize = frame.header.dataSize;
        add(&frame.header, sizeof frame.header);
        add(frame.data, dataSize);
        add(kPadding, padded(dataSize) - dataSize);
        add(frame.offsets, frame.header.objectCount * sizeof(uint64_t));
    }

    void add(const void* start, size_t size) {
        const size_t skipped = std::min(skip, size);
        const size_t taken = std::min(size - skipped, left);
        skip -= skipped;
        left -= taken;
        if (taken == 0) return;
        parts[count++] = {static_cast<uint8_t*>(const_cast<void*>(start)) + skipped, taken};
    }
};

ssize_t sendMessage(int fd, iovec* parts, size_t count, const std::vector<int>& descriptors, int flags) {
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMaxDescriptors)];
    msghdr message{};
    message.msg_iov = parts;
    message.msg_iovlen = count;
    if (!descriptors.empty()) {
        const size_t size = sizeof(int) * descriptors.size();
        message.msg_control = control;
        message.msg_controllen = CMSG_SPACE(size);
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(size);
        memcpy(CMSG_DATA(header), descriptors.data(), size);
    }
    ssize_t sent = -1;
    do {
        sent = sendmsg(fd, &message, flags | MSG_NOSIGNAL);
    } while (sent < 0 && errno == EINTR);
    return sent;
}

// Errors that have nothing to do with what is sent.
bool isOfTheConnection(int error) { return error == EAGAIN || error == EPIPE || error == ECONNRESET; }

// Without the memory to note them, they are closed, as they would be nobody's.
void keepDescriptors(const unsigned char* data, size_t count, std::vector<UniqueFd>& descriptors) {
    const auto descriptorAt = [data](size_t i) {
        int descriptor = -1;
        memcpy(&descriptor, data + i * sizeof descriptor, sizeof descriptor);
        return descriptor;
    };
    try {
        descriptors.reserve(descriptors.size() + count);
    } catch (const std::bad_alloc&) {
        for (size_t i = 0; i < count; ++i) close(descriptorAt(i));
        throw;
    }
    for (size_t i = 0; i < count; ++i) descriptors.emplace_back(descriptorAt(i));
}

}  // namespace

ssize_t receive(int fd, iovec* buffers, size_t bufferCount, int flags, std::vector<UniqueFd>& descriptors, bool& lost,
                ucred* sender) {
    // Not zeroed: this is on the path of every transaction, and the kernel says how much it wrote.
    alignas(cmsghdr) char
        control[CMSG_SPACE(sizeof(int) * kMaxDescriptors) + CMSG_SPACE(sizeof(ucred)) + CMSG_SPACE(sizeof(int))];
    msghdr message{};
    message.msg_iov = buffers;
    message.msg_iovlen = bufferCount;
    message.msg_control = control;
    message.msg_controllen = sizeof control;
    ssize_t count = -1;
    do {
        count = recvmsg(fd, &message, flags | MSG_CMSG_CLOEXEC);
    } while (count < 0 && errno == EINTR);
    if (count < 0) return count;

    if ((message.msg_flags & MSG_CTRUNC) != 0) lost = true;
    for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
        if (part->cmsg_level != SOL_SOCKET) continue;
        if (part->cmsg_type == SCM_RIGHTS) {
            keepDescriptors(CMSG_DATA(part), (part->cmsg_len - CMSG_LEN(0)) / sizeof(int), descriptors);
        } else if (part->cmsg_type == kScmPidfd) {
            int process = -1;
            memcpy(&process, CMSG_DATA(part), sizeof process);
            UniqueFd unwanted(process);
        } else if (part->cmsg_type == SCM_CREDENTIALS && sender != nullptr) {
            memcpy(sender, CMSG_DATA(part), sizeof *sender);
        }
    }
    return count;
}

void limitWaits(int fd) {
    const timeval limit{5, 0};
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
}

ssize_t sendBytes(int fd, const void* bytes, size_t size, const std::vector<int>& descriptors, int flags) {
    iovec part{const_cast<void*>(bytes), size};
    return sendMessage(fd, &part, 1, descriptors, flags);
}

FrameReader::Result FrameReader::read(int fd, int flags, Frame& frame) {
    uint8_t scratch[kScratchSize];
    for (;;) {
        iovec buffers[2];
        size_t bufferCount = 1;
        const bool inHeader = headerReceived_ < sizeof(FrameHeader);
        if (inHeader) {
            buffers[0] = {reinterpret_cast<uint8_t*>(&current_.header) + headerReceived_,
                          sizeof(FrameHeader) - headerReceived_};
            buffers[1] = {scratch, sizeof scratch};
            bufferCount = 2;
        } else {
            buffers[0] = {current_.payload.get() + payloadReceived_, payloadSize_ - payloadReceived_};
        }
        const ssize_t received =
            receive(fd, buffers, bufferCount, flags, current_.descriptors, current_.descriptorsLost);
        if (received < 0) return errno == EAGAIN || errno == EWOULDBLOCK ? Result::kAgain : Result::kClosed;
        if (received == 0) return Result::kClosed;

        auto count = static_cast<size_t>(received);
        bool receipt = false;
        if (inHeader) {
            const size_t taken = std::min(count, buffers[0].iov_len);
            const uint8_t* behind = scratch;
            headerReceived_ += taken;
            count -= taken;
            receipt = skipReceipts(behind, count);
            if (headerReceived_ == sizeof(FrameHeader)) {
                const Result result = takeHeader(behind, count);
                if (result != Result::kFrame) return result;
            }
        } else {
            payloadReceived_ += count;
        }
        if (headerReceived_ == sizeof(FrameHeader) && payloadReceived_ == payloadSize_) return finish(frame);
        if (!current_.descriptors.empty() || current_.descriptorsLost) return Result::kViolation;
        if (receipt) return Result::kReceipt;
    }
}

// Drops receipts, behind which the next frame may have come already.
bool FrameReader::skipReceipts(const uint8_t*& behind, size_t& count) {
    bool skipped = false;
    const FrameHeader& header = current_.header;
    while (headerReceived_ == sizeof header && header.magic == kMagic && header.type == FrameType::kReceipt &&
           (header.dataSize | header.objectCount | header.descriptorCount) == 0) {
        skipped = true;
        headerReceived_ = std::min(count, sizeof header);
        memcpy(&current_.header, behind, headerReceived_);
        behind += headerReceived_;
        count -= headerReceived_;
    }
    return skipped;
}

FrameReader::Result FrameReader::takeHeader(const uint8_t* behind, size_t count) {
    const FrameHeader& header = current_.header;
    const bool known = header.type == FrameType::kTransaction || header.type == FrameType::kReply;
    if (header.magic != kMagic || !known || header.reserved != 0) return Result::kViolation;
    // Objects lie apart from each other, which also limits what the offsets take.
    if (header.dataSize > Driver::kParcelLimit || header.descriptorCount > kMaxDescriptors ||
        header.objectCount > header.dataSize / sizeof(flat_binder_object)) {
        return Result::kViolation;
    }
    payloadSize_ = padded(header.dataSize) + header.objectCount * sizeof(uint64_t);
    payloadReceived_ = count;
    if (count > payloadSize_) return Result::kViolation;
    if (payloadSize_ != 0) {
        current_.payload.reset(static_cast<uint8_t*>(malloc(payloadSize_)));
        if (current_.payload == nullptr) return Result::kNoMemory;
        memcpy(current_.payload.get(), behind, count);
    }
    return Result::kFrame;
}

FrameReader::Result FrameReader::finish(Frame& frame) {
    const size_t expected = current_.header.descriptorCount;
    if (current_.descriptors.size() > expected) return Result::kViolation;
    if (current_.descriptors.size() < expected) current_.descriptorsLost = true;
    frame = std::exchange(current_, Frame{});
    headerReceived_ = payloadReceived_ = payloadSize_ = 0;
    return Result::kFrame;
}

size_t OutgoingFrame::descriptorsAt() const { return size() <= kScratchSize ? 0 : size() - kTailSize; }

int sendFrame(int fd, const OutgoingFrame& frame, size_t& sent, int flags) {
    static const std::vector<int>& kNone = *new std::vector<int>;
    const size_t size = frame.size();
    const size_t descriptorsAt = frame.descriptors.empty() ? 0 : frame.descriptorsAt();
    bool withDescriptors = !frame.descriptors.empty();
    while (sent < size) {
        const bool here = withDescriptors && sent == descriptorsAt;
        Segments segments(frame, sent, sent < descriptorsAt ? descriptorsAt : size);
        const ssize_t count = sendMessage(fd, segments.parts, segments.count, here ? frame.descriptors : kNone, flags);
        if (count >= 0) {
            sent += static_cast<size_t>(count);
        } else if (here && sent > 0 && !isOfTheConnection(errno)) {
            withDescriptors = false;
        } else {
            return errno;
        }
    }
    return 0;
}

std::unique_ptr<UnsentFrame> UnsentFrame::copy(const OutgoingFrame& frame, size_t sent) {
    auto unsent = std::make_unique<UnsentFrame>();
    OutgoingFrame& own = unsent->frame_;
    own.header = frame.header;
    unsent->sent_ = sent;
    const size_t dataSize = frame.header.dataSize;
    const size_t offsetsSize = frame.header.objectCount * sizeof(uint64_t);
    if (dataSize != 0) {
        unsent->payload_.reset(static_cast<uint8_t*>(malloc(padded(dataSize) + offsetsSize)));
        uint8_t* payload = unsent->payload_.get();
        if (payload == nullptr) return nullptr;
        memcpy(payload, frame.data, dataSize);
        if (offsetsSize != 0) memcpy(payload + padded(dataSize), frame.offsets, offsetsSize);
        own.data = payload;
        own.offsets = reinterpret_cast<const uint64_t*>(payload + padded(dataSize));
    }
    if (sent > frame.descriptorsAt()) return unsent;  // the descriptors are on their way
    for (const int descriptor : frame.descriptors) {
        UniqueFd duplicate(fcntl(descriptor, F_DUPFD_CLOEXEC, 0));
        if (!duplicate.valid() && sent == 0) return nullptr;
        if (!duplicate.valid()) {
            own.descriptors.clear();
            break;
        }
        own.descriptors.push_back(duplicate.get());
        unsent->descriptors_.push_back(std::move(duplicate));
    }
    return unsent;
}

}  // namespace android::socket_driver

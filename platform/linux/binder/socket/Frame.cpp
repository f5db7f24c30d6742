#include "Frame.h"

#include <binder/IBinder.h>

#include <cerrno>
#include <cstring>

#include "../Driver.h"

namespace android::socket_driver {
namespace {

constexpr uint8_t kPadding[8] = {};

struct Segments {
    iovec parts[4];
    size_t count = 0;

    void add(const void* start, size_t size, size_t& skip) {
        if (skip >= size) {
            skip -= size;
            return;
        }
        parts[count].iov_base = static_cast<uint8_t*>(const_cast<void*>(start)) + skip;
        parts[count].iov_len = size - skip;
        skip = 0;
        ++count;
    }
};

Segments segmentsOf(const OutgoingFrame& frame, size_t skip) {
    Segments segments;
    const size_t dataSize = frame.header.dataSize;
    segments.add(&frame.header, sizeof frame.header, skip);
    segments.add(frame.data, dataSize, skip);
    segments.add(kPadding, padded(dataSize) - dataSize, skip);
    segments.add(frame.offsets, frame.header.objectCount * sizeof(uint64_t), skip);
    return segments;
}

ssize_t sendMessage(int fd, msghdr& message, const std::vector<int>& descriptors, int flags) {
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMaxDescriptors)];
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

}  // namespace

ssize_t receive(int fd, iovec* buffers, size_t bufferCount, int flags, std::vector<UniqueFd>& descriptors, bool& lost,
                ucred* sender) {
    // Not zeroed: this is on the path of every transaction, and the kernel says how much it wrote.
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMaxDescriptors) + CMSG_SPACE(sizeof(ucred))];
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
            const size_t received = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
            for (size_t i = 0; i < received; ++i) {
                int descriptor = -1;
                memcpy(&descriptor, CMSG_DATA(part) + i * sizeof(int), sizeof(int));
                descriptors.emplace_back(descriptor);
            }
        } else if (part->cmsg_type == SCM_CREDENTIALS && sender != nullptr) {
            memcpy(sender, CMSG_DATA(part), sizeof *sender);
        }
    }
    return count;
}

ssize_t sendBytes(int fd, const void* bytes, size_t size, const std::vector<int>& descriptors, int flags) {
    iovec part{const_cast<void*>(bytes), size};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    return sendMessage(fd, message, descriptors, flags);
}

FrameReader::Result FrameReader::read(int fd, int flags, Frame& frame) {
    // A small frame comes whole with one call: its payload lands behind the header, in the scratch buffer.
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
        if (current_.descriptors.size() > kMaxDescriptors) return Result::kViolation;

        auto count = static_cast<size_t>(received);
        if (inHeader) {
            const size_t taken = count < buffers[0].iov_len ? count : buffers[0].iov_len;
            headerReceived_ += taken;
            if (headerReceived_ < sizeof(FrameHeader)) continue;
            const Result result = takeHeader(scratch, count - taken);
            if (result != Result::kFrame) return result;
        } else {
            payloadReceived_ += count;
        }
        if (payloadReceived_ == payloadSize_) return finish(frame);
    }
}

FrameReader::Result FrameReader::takeHeader(const uint8_t* behind, size_t count) {
    const FrameHeader& header = current_.header;
    const bool known = header.type == FrameType::kTransaction || header.type == FrameType::kReply;
    if (header.magic != kMagic || !known || header.reserved != 0) return Result::kViolation;
    if (header.dataSize > Driver::kParcelLimit || header.descriptorCount > kMaxDescriptors ||
        header.objectCount > Driver::kParcelLimit / sizeof(uint64_t)) {
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
    const size_t arrived = current_.descriptors.size();
    if (arrived != expected && !(current_.descriptorsLost && arrived < expected)) return Result::kViolation;
    frame = std::move(current_);
    current_ = Frame{};
    headerReceived_ = payloadReceived_ = payloadSize_ = 0;
    return Result::kFrame;
}

std::vector<uint8_t> OutgoingFrame::rest(size_t sent) const {
    std::vector<uint8_t> bytes;
    bytes.reserve(size() - sent);
    const Segments segments = segmentsOf(*this, sent);
    for (size_t i = 0; i < segments.count; ++i) {
        const auto* start = static_cast<const uint8_t*>(segments.parts[i].iov_base);
        bytes.insert(bytes.end(), start, start + segments.parts[i].iov_len);
    }
    return bytes;
}

int sendFrame(int fd, const OutgoingFrame& frame, size_t& sent, int flags) {
    const size_t size = frame.size();
    while (sent < size) {
        Segments segments = segmentsOf(frame, sent);
        msghdr message{};
        message.msg_iov = segments.parts;
        message.msg_iovlen = segments.count;
        const ssize_t count = sendMessage(fd, message, sent == 0 ? frame.descriptors : std::vector<int>(), flags);
        if (count < 0) return errno;
        sent += static_cast<size_t>(count);
    }
    return 0;
}

}  // namespace android::socket_driver

#include "soak/message.h"

#include <algorithm>
#include <cstring>

#include "soak/random.h"

namespace tavo::soak {
namespace {

constexpr uint64_t kMagic = 0x6b616f735f6f7661U;
constexpr uint64_t kStep = 0x9e3779b97f4a7c15U;
constexpr size_t kPage = 4096;
constexpr size_t kLength = sizeof(uint32_t);

uint64_t check_of(const Header& header) {
    uint64_t words[sizeof(Header) / sizeof(uint64_t)];
    memcpy(words, &header, sizeof words);
    uint64_t check = kMagic;
    for (size_t i = 0; i + 1 < std::size(words); ++i) check = mixed(check ^ words[i]) + kStep;
    return check;
}

// A pipe takes first what is over whole pages. Where that is a part of the length only, nobody could tell what the
// rest of a torn message is.
uint32_t without_torn_length(uint32_t size) {
    const size_t over = (kLength + size) % kPage;
    return over > 0 && over < kLength ? size + kLength : size;
}

}  // namespace

void fill(uint64_t seed, unsigned char* bytes, size_t size) {
    for (size_t i = 0; i < size; i += sizeof(uint64_t)) {
        const uint64_t word = mixed(seed += kStep);
        memcpy(bytes + i, &word, std::min(sizeof word, size - i));
    }
}

size_t first_difference(uint64_t seed, const unsigned char* bytes, size_t size) {
    for (size_t i = 0; i < size; i += sizeof(uint64_t)) {
        const uint64_t word = mixed(seed += kStep);
        const size_t count = std::min(sizeof word, size - i);
        if (memcmp(bytes + i, &word, count) == 0) continue;
        const auto* expected = reinterpret_cast<const unsigned char*>(&word);
        return i + static_cast<size_t>(std::mismatch(expected, expected + count, bytes + i).first - expected);
    }
    return size;
}

Bytes message_of(Header header) {
    header.magic = kMagic;
    header.check = check_of(header);
    Bytes message(header.size);
    memcpy(message.data(), &header, sizeof header);
    fill(header.check, message.data() + sizeof header, message.size() - sizeof header);
    return message;
}

bool read_header(const unsigned char* bytes, size_t size, Header& header) {
    if (size < sizeof header || memcmp(bytes, &kMagic, sizeof kMagic) != 0) return false;
    memcpy(&header, bytes, sizeof header);
    return header.size >= sizeof header && header.check == check_of(header);
}

bool body_is_right(const unsigned char* message, const Header& header) {
    const size_t size = header.size - sizeof header;
    return first_difference(header.check, message + sizeof header, size) == size;
}

Header stream_header(uint32_t serial, unsigned slot, uint32_t incarnation, uint32_t link, uint64_t number) {
    Header header;
    header.serial = serial;
    header.slot = slot;
    header.incarnation = incarnation;
    header.link = link;
    header.number = number;
    Random random(mixed(serial) ^ number);
    // Few large ones, so that bytes do not keep all other operations from their turn.
    constexpr unsigned kMost[] = {200, 200, 4092, 4092, 4092, 20000, 70000, 409600 - kLength};
    header.size = without_torn_length(random.between(kLeastMessage, kMost[random.below(std::size(kMost))]));
    return header;
}

Header retire_header(uint32_t serial) {
    Header header;
    header.serial = serial;
    header.kind = Kind::kRetire;
    header.slot = UINT32_MAX;
    header.size = sizeof header;
    return header;
}

Bytes frame_of(const Header& header) {
    const Bytes message = message_of(header);
    Bytes frame(kLength + message.size());
    memcpy(frame.data(), &header.size, kLength);
    memcpy(frame.data() + kLength, message.data(), message.size());
    return frame;
}

}  // namespace tavo::soak

// Messages that say who sent them, as which one of how many, and whose every byte follows from that.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tavo::soak {

// Bytes that follow from a seed.
void fill(uint64_t seed, unsigned char* bytes, size_t size);
// Where they first differ from that; `size` when nowhere.
size_t first_difference(uint64_t seed, const unsigned char* bytes, size_t size);

using Bytes = std::vector<unsigned char>;

enum class Kind : uint32_t { kLetter, kBye /* of an orderly end */, kRetire /* wakes those who have to leave */ };

struct Header {
    uint64_t magic = 0;
    uint32_t serial = 0;  // the channel's
    uint32_t slot = 0;
    uint32_t incarnation = 0;
    uint32_t link = 0;
    Kind kind = Kind::kLetter;
    uint32_t size = 0;  // of the whole message
    uint64_t number = 0;
    uint64_t check = 0;  // of all that
};
static_assert(sizeof(Header) == 48);

constexpr size_t kLeastMessage = sizeof(Header);
constexpr size_t kMostInOnePiece = 4092;

// Fills in the rest of the header.
Bytes message_of(Header header);
// Only a header that is right is one.
bool read_header(const unsigned char* bytes, size_t size, Header& header);
bool body_is_right(const unsigned char* message, const Header& header);

// A stream's messages follow from their number, so that parts of one can be recognised.
Header stream_header(uint32_t serial, unsigned slot, uint32_t incarnation, uint32_t link, uint64_t number);
Header retire_header(uint32_t serial);
// With its length in front, as it is in the pipe.
Bytes frame_of(const Header& header);

}  // namespace tavo::soak

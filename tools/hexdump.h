// Bytes for people to look at.
#pragma once

#include <cstddef>
#include <cstdint>

namespace tavo::tool {

// Writes lines of sixteen bytes, with the offset they have in the whole in front and as characters behind, to standard
// output. Lines that equal the one before are shown as one "*". False, and errno, when that failed.
bool write_hexdump(const char* data, uint64_t offset, uint64_t size);

}  // namespace tavo::tool

// Bytes for people to look at.
#pragma once

#include <cstddef>

namespace tavo::tool {

// Writes lines of sixteen bytes, with the offset they have in the whole in front and as characters behind, to standard
// output. Lines that equal the one before are shown as one "*". False, and errno, when that failed.
bool write_hexdump(const char* data, size_t offset, size_t size);

}  // namespace tavo::tool

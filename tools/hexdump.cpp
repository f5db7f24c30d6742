#include "tools/hexdump.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>

#include "tools/files.h"

namespace tavo::tool {
namespace {

constexpr size_t kWidth = 16;
constexpr size_t kBlock = 65536;

std::string line_of(const unsigned char* data, size_t offset, size_t count) {
    char piece[32];
    snprintf(piece, sizeof piece, "%08zx ", offset);
    std::string line = piece;
    for (size_t i = 0; i < kWidth; ++i) {
        if (i % 8 == 0) line += ' ';
        if (i < count) {
            snprintf(piece, sizeof piece, "%02x ", data[i]);
            line += piece;
        } else {
            line += "   ";
        }
    }
    line += " |";
    for (size_t i = 0; i < count; ++i) line += data[i] >= ' ' && data[i] <= '~' ? static_cast<char>(data[i]) : '.';
    return line + "|\n";
}

}  // namespace

bool write_hexdump(const char* data, size_t offset, size_t size) {
    std::string text;
    bool repeats = false;
    // Copied, because others may write to the block meanwhile.
    unsigned char now[kWidth], before[kWidth];
    for (size_t done = 0; done < size; done += kWidth) {
        const size_t count = std::min(kWidth, size - done);
        memcpy(now, data + done, count);
        const bool same = done > 0 && count == kWidth && memcmp(now, before, kWidth) == 0;
        if (!same) text += line_of(now, offset + done, count);
        if (same && !repeats) text += "*\n";
        repeats = same;
        memcpy(before, now, count);
        if (text.size() >= kBlock) {
            if (!write_all(STDOUT_FILENO, text.data(), text.size())) return false;
            text.clear();
        }
    }
    char end[32];
    snprintf(end, sizeof end, "%08zx\n", offset + size);
    text += end;
    return write_all(STDOUT_FILENO, text.data(), text.size());
}

}  // namespace tavo::tool

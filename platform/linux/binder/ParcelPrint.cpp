// A parcel as text.
#include <binder/Parcel.h>
#include <binder/TextOutput.h>

#include <cinttypes>
#include <cstdarg>
#include <cstdio>

namespace android {
namespace {

constexpr size_t kBytesPerLine = 16;

[[gnu::format(printf, 2, 3)]] void printLine(TextOutput& to, const char* format, ...) {
    char line[128];
    va_list values;
    va_start(values, format);
    const int length = vsnprintf(line, sizeof line, format, values);
    va_end(values);
    if (length > 0) to.print(line, static_cast<size_t>(length));
}

void printBytes(TextOutput& to, const uint8_t* bytes, size_t count, size_t offset) {
    char text[3 * kBytesPerLine + 1] = {};
    for (size_t i = 0; i < count; ++i) snprintf(text + 3 * i, 4, " %02x", bytes[i]);
    printLine(to, "%08zx:%s\n", offset, text);
}

}  // namespace

TextOutput::TextOutput() = default;
TextOutput::~TextOutput() = default;

void Parcel::print(TextOutput& to, uint32_t) const {
    printLine(to, "Parcel: %zu bytes, %zu objects, position %zu, error %d\n", mDataSize, objectsCount(), mDataPos,
              mError);
    to.moveIndent(1);
    for (size_t offset = 0; offset < mDataSize; offset += kBytesPerLine) {
        const size_t left = mDataSize - offset;
        printBytes(to, mData + offset, left < kBytesPerLine ? left : kBytesPerLine, offset);
    }
    for (size_t i = 0; i < objectsCount(); ++i) printLine(to, "object at %" PRIx64 "\n", uint64_t{objects()[i]});
    to.moveIndent(-1);
}

}  // namespace android

// What the fuzz targets share: an input that is read as a script, and what an input must not bring about.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace tavo::fuzz {

// Ends the process, which is a find, when the condition does not hold.
inline void require(bool condition, const char* what) {
    if (condition) return;
    fprintf(stderr, "does not hold: %s\n", what);
    abort();
}

// Values off an input's beginning. An input that has ended goes on with zeros, so that every input is a script.
class Script {
public:
    Script(const uint8_t* data, size_t size) : next_(data), end_(data + size) {}

    bool ended() const { return next_ == end_; }

    template <typename T>
    T take() {
        T value{};
        const size_t size = std::min(left(), sizeof value);
        if (size != 0) memcpy(&value, next_, size);
        next_ += size;
        return value;
    }

    // So many bytes, or fewer at the end.
    std::vector<uint8_t> take_bytes(size_t count) {
        const size_t size = std::min(left(), count);
        std::vector<uint8_t> bytes(next_, next_ + size);
        next_ += size;
        return bytes;
    }

    std::vector<uint8_t> rest() { return take_bytes(left()); }

private:
    size_t left() const { return static_cast<size_t>(end_ - next_); }

    const uint8_t* next_;
    const uint8_t* end_;
};

// A block of exactly a text's size, beside which nothing may be read. A zero in the input ends the text early.
inline std::vector<char> text_of(const std::vector<uint8_t>& bytes) {
    std::vector<char> text(bytes.size() + 1, '\0');
    std::copy(bytes.begin(), bytes.end(), text.begin());
    return text;
}

}  // namespace tavo::fuzz

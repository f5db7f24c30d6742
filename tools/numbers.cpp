#include "tools/numbers.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "tools/command.h"

namespace tavo::tool {
namespace {

// The whole text as one number between the two.
bool parse(const std::string& text, long long smallest, long long largest, long long& number) {
    const size_t first = text.find_first_of("0123456789");
    const bool begins_well = first == 0 || (first == 1 && text[0] == '-');
    const int base = begins_well && text.compare(first, 2, "0x") == 0 ? 16 : 10;
    char* end = nullptr;
    errno = 0;
    number = strtoll(text.c_str(), &end, base);
    return begins_well && errno == 0 && *end == '\0' && number >= smallest && number <= largest;
}

}  // namespace

int32_t parse_key(const std::string& text) {
    long long key = 0;
    if (!parse(text, INT32_MIN, UINT32_MAX, key)) {
        throw Misuse("'" + text + "' is no key: keys are whole numbers of 32 bits, such as 7, -5 or 0x1f");
    }
    if (key == 0) throw Misuse("0 is no key: choose any other number");
    return static_cast<int32_t>(static_cast<uint32_t>(key));
}

uint32_t parse_semaphore_key(const std::string& text) {
    long long key = 0;
    if (!parse(text, 0, UINT32_MAX, key)) {
        throw Misuse("'" + text + "' is no key of a semaphore: these are whole numbers from 0 to 4294967295");
    }
    return static_cast<uint32_t>(key);
}

uint64_t parse_size(const std::string& text) {
    constexpr char kUnits[] = {'K', 'M', 'G'};
    std::string digits = text;
    int shift = 0;
    for (int i = 0; i < 3 && !text.empty(); ++i) {
        if (text.back() != kUnits[i]) continue;
        shift = 10 * (i + 1);
        digits.pop_back();
    }
    long long size = 0;
    if (!parse(digits, 0, INT64_MAX >> shift, size)) {
        throw Misuse("'" + text + "' is no size: sizes are bytes, such as 4096, 64K or 16M");
    }
    return static_cast<uint64_t>(size) << shift;
}

std::chrono::milliseconds milliseconds_of(double seconds) {
    constexpr double kDay = 86400;
    const bool is_limit = seconds >= 0;
    return std::chrono::milliseconds(is_limit ? static_cast<long>(std::min(seconds, kDay) * 1000) : -1);
}

std::string short_number(double value) {
    constexpr const char* kUnits[] = {"", "K", "M", "G", "T"};
    size_t unit = 0;
    for (; (value >= 1024 || value <= -1024) && unit < 4; ++unit) value /= 1024;
    const bool is_whole = value == static_cast<double>(static_cast<long long>(value)) || unit == 0;
    char text[32];
    snprintf(text, sizeof text, is_whole ? "%.0f%s" : "%.1f%s", value, kUnits[unit]);
    return text;
}

}  // namespace tavo::tool

// Converts texts to numbers and compares them with a model: strtol() where long has 32 bits.
#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "fuzz/script.h"
#include "tavo_osal/log.h"
#include "tavo_osal/string.h"

namespace {

using tavo::fuzz::require;
using tavo::fuzz::Script;

struct Converted {
    int64_t number;
    const char* end;
    bool out_of_range;
};

int digit_of(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'z') return c - 'a' + 10;
    if (c >= 'A' && c <= 'Z') return c - 'A' + 10;
    return 99;
}

Converted convert(const char* text, int base) {
    if (base < 0 || base == 1 || base > 36) return {0, text, false};
    const char* at = text;
    while (*at == ' ' || (*at >= '\t' && *at <= '\r')) ++at;
    const bool negative = *at == '-';
    if (*at == '+' || *at == '-') ++at;
    const bool hexadecimal = at[0] == '0' && (at[1] == 'x' || at[1] == 'X') && digit_of(at[2]) < 16;
    if (hexadecimal && (base == 0 || base == 16)) {
        at += 2;
        base = 16;
    } else if (base == 0) {
        base = *at == '0' ? 8 : 10;
    }
    const char* const digits = at;
    const int64_t limit = negative ? int64_t{INT32_MAX} + 1 : INT32_MAX;
    int64_t value = 0;
    bool out_of_range = false;
    for (; digit_of(*at) < base; ++at) {
        value = value * base + digit_of(*at);
        if (value > limit) out_of_range = true;
        value = std::min(value, limit);
    }
    return {negative ? -value : value, at == digits ? text : at, out_of_range};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // Almost every text is refused: written out, the reasons would be all a fuzzer has time for.
    g_uiMxEnabledLogLevel = 0;
    Script script(data, size);
    // The bases there are, some that there are not, and any number.
    const auto choice = script.take<uint8_t>();
    const int base = choice < 250 ? choice % 40 : script.take<int32_t>();
    const bool stale_error = script.take<uint8_t>() % 2 != 0;
    const std::vector<char> text = tavo::fuzz::text_of(script.rest());

    const Converted expected = convert(text.data(), base);
    errno = stale_error ? ERANGE : 0;
    // An unknown base is an error of its own, which replaces a stale one.
    const bool known_base = base == 0 || (base >= 2 && base <= 36);
    const bool at_limit = expected.number == INT32_MAX || expected.number == INT32_MIN;
    TAVO_Status status = TAVO_SUCCESS;
    if (known_base && at_limit && (expected.out_of_range || stale_error)) {
        status = TAVO_OUT_OF_RANGE;
    } else if (*expected.end != '\0') {
        status = TAVO_INVALID_PARAM;
    }
    long long number = 4711;
    const TAVO_Status result = tavo_osal_convert_string_to_num(text.data(), base, &number);
    require(result == status, "the status is the model's");
    require(number == (status == TAVO_SUCCESS ? expected.number : 0), "the number is the model's");
    return 0;
}

#include "tavo_osal/string.h"

#include <strings.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "log/cancel_shield.h"
#include "log/module_log.h"

namespace {

constexpr char kTag[] = "OSAL_STRING";

// The shape of the functions that refuse null texts: a null is logged and answered with null or 0, everything
// else with what the C library answers.
template <typename Call>
auto when_given(bool given, Call call, int line = __builtin_LINE()) -> decltype(call()) {
    if (given) return call();
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Invalid parameter\n");
    return {};
}

// The shape of the comparisons: a null text is logged and compares like an empty one. The other text's first byte
// counts as it is, also where the comparison would have ignored its case; callers depend on it.
template <typename Compare>
int compare(const char* a, const char* b, Compare compare_texts, int line = __builtin_LINE()) {
    if (a != nullptr && b != nullptr) return compare_texts(a, b);
    if (a == nullptr && b == nullptr) {
        TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Invalid parameters\n");
        return 0;
    }
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "Invalid parameter\n");
    return a != nullptr ? static_cast<unsigned char>(*a) : -static_cast<unsigned char>(*b);
}

// strdup(); a thread that ended within the allocator would keep its lock from the rest of the process.
char* duplicate(const char* text) {
    const tavo::CancelShield shield;
    return strdup(text);
}

// strtol() as where long has 32 bits.
long strtol_32(const char* text, const char*& end, int base) {
    char* stopped = nullptr;
    const long number = strtol(text, &stopped, base);
    // For a base it refuses, a C library may leave the end unset.
    const bool known_base = base == 0 || (base >= 2 && base <= 36);
    end = known_base ? stopped : text;
    const long limited = std::clamp<long>(number, INT32_MIN, INT32_MAX);
    if (limited != number) errno = ERANGE;
    return limited;
}

}  // namespace

char* tavo_osal_string_copy(char* pcDst, const char* pcSrc) {
    return when_given(pcDst && pcSrc, [=] { return strcpy(pcDst, pcSrc); });
}

char* tavo_osal_string_num_copy(char* pcDst, const char* pcSrc, unsigned int uiCount) {
    return when_given(pcDst && pcSrc, [=] { return strncpy(pcDst, pcSrc, uiCount); });
}

char* tavo_osal_string_concatenate(char* pcDst, const char* pcSrc) {
    return when_given(pcDst && pcSrc, [=] { return strcat(pcDst, pcSrc); });
}

char* tavo_osal_string_num_concatenate(char* pcDst, const char* pcSrc, unsigned int uiCount) {
    return when_given(pcDst && pcSrc, [=] { return strncat(pcDst, pcSrc, uiCount); });
}

char* tavo_osal_string_duplicate_string(char* pcStr) {
    return when_given(pcStr, [=] { return duplicate(pcStr); });
}

unsigned int tavo_osal_string_get_length(const char* pcStr) {
    return when_given(pcStr, [=] { return static_cast<unsigned int>(strlen(pcStr)); });
}

char* tavo_osal_string_search_string(char* pcHaystack, const char* pcNeedle) {
    return when_given(pcHaystack && pcNeedle, [=] { return strstr(pcHaystack, pcNeedle); });
}

char* tavo_osal_string_search_character(char* pcStr, int iChar) {
    return when_given(pcStr, [=] { return strchr(pcStr, iChar); });
}

char* tavo_osal_string_search_last_character(char* pcStr, int iChar) {
    return when_given(pcStr, [=] { return strrchr(pcStr, iChar); });
}

// Both names are part of the interface.
char* tavo_osal_string_scan_string(char* pcStr, int iChar) { return tavo_osal_string_search_character(pcStr, iChar); }

char* tavo_osal_string_scan_string_rev(char* pcStr, int iChar) {
    return tavo_osal_string_search_last_character(pcStr, iChar);
}

int tavo_osal_string_compare(const char* pcA, const char* pcB) { return compare(pcA, pcB, strcmp); }

int tavo_osal_string_num_compare(const char* pcA, const char* pcB, unsigned int uiCount) {
    return compare(pcA, pcB, [=](const char* a, const char* b) { return strncmp(a, b, uiCount); });
}

int tavo_osal_case_ignore_string_compare(const char* pcA, const char* pcB) { return compare(pcA, pcB, strcasecmp); }

int tavo_osal_case_ignore_string_num_compare(const char* pcA, const char* pcB, unsigned int uiCount) {
    return compare(pcA, pcB, [=](const char* a, const char* b) { return strncasecmp(a, b, uiCount); });
}

char* tavo_osal_convert_string_to_upper(const char* pcStr) {
    char* copy = duplicate(pcStr);
    if (copy == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "String duplication failed\n");
        return nullptr;
    }
    std::transform(copy, copy + strlen(copy) + 1, copy,
                   [](char byte) { return static_cast<char>(toupper(static_cast<unsigned char>(byte))); });
    return copy;
}

TAVO_Status tavo_osal_convert_string_to_num(const char* pcStr, int iBase, long long* plNum) {
    if (pcStr == nullptr || plNum == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid input parameter, pcStr: %p, iBase: %d, plNum: %p\n",
                 static_cast<const void*>(pcStr), iBase, static_cast<void*>(plNum));
        return TAVO_INVALID_PARAM;
    }
    *plNum = 0;
    const char* end = nullptr;
    const long number = strtol_32(pcStr, end, iBase);
    // errno is not cleared beforehand, so a stale ERANGE turns an exact limit into this error; callers depend on it.
    if ((number == INT32_MAX || number == INT32_MIN) && errno == ERANGE) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Converted number goes out of range\n");
        return TAVO_OUT_OF_RANGE;
    }
    if (*end != '\0') {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Non convertible characters in the string: %s.\n", pcStr);
        return TAVO_INVALID_PARAM;
    }
    *plNum = number;
    return TAVO_SUCCESS;
}

int tavo_osal_sprintf(char* pcDst, const char* pcFormat, ...) {
    va_list values;
    va_start(values, pcFormat);
    const int length = vsprintf(pcDst, pcFormat, values);
    va_end(values);
    return length;
}

int tavo_osal_snprintf(char* pcDst, unsigned int uiSize, const char* pcFormat, ...) {
    va_list values;
    va_start(values, pcFormat);
    const int length = vsnprintf(pcDst, uiSize, pcFormat, values);
    va_end(values);
    return length;
}

int tavo_osal_sscanf(const char* pcSrc, const char* pcFormat, ...) {
    va_list targets;
    va_start(targets, pcFormat);
    const int stored = vsscanf(pcSrc, pcFormat, targets);
    va_end(targets);
    return stored;
}

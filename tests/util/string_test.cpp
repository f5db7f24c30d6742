#include "tavo_osal/string.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cinttypes>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tavo_osal/memory.h"

namespace {

using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

const ExpectedLine kOneNull = {1, "OSAL_STRING", "Invalid parameter\n"};
const ExpectedLine kTwoNulls = {1, "OSAL_STRING", "Invalid parameters\n"};

// Calls that must be refused: one logged line each, nothing copied, null or 0 as the answer.
template <typename Call>
void expect_refused(const char* what, Call call) {
    const LogCapture log;
    EXPECT_FALSE(call()) << what;
    EXPECT_TRUE(logged_exactly(log.lines(), {kOneNull})) << what;
}

class String : public testing::Test {
protected:
    char buffer[32] = "left alone";
    char text[16] = "a-b-c";
};

TEST_F(String, Copies) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_string_copy(buffer, "text"), buffer);
    EXPECT_STREQ(buffer, "text");
    EXPECT_EQ(tavo_osal_string_copy(buffer, ""), buffer);
    EXPECT_STREQ(buffer, "");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, CopiesExactlyTheCountedCharacters) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_string_num_copy(buffer, "LEFTOVER", 4), buffer);
    EXPECT_STREQ(buffer, "LEFT alone");  // cut, and no terminator written
    EXPECT_EQ(tavo_osal_string_num_copy(buffer, "ab", 6), buffer);
    EXPECT_EQ(std::string(buffer, 11), std::string("ab\0\0\0\0lone\0", 11));  // padded with zeros
    EXPECT_EQ(tavo_osal_string_num_copy(buffer, "xy", 0), buffer);
    EXPECT_STREQ(buffer, "ab");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, Concatenates) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_string_concatenate(text, "-d"), text);
    EXPECT_STREQ(text, "a-b-c-d");
    EXPECT_EQ(tavo_osal_string_num_concatenate(text, "-e-f", 2), text);
    EXPECT_STREQ(text, "a-b-c-d-e");
    EXPECT_EQ(tavo_osal_string_num_concatenate(text, "-f", 100), text);
    EXPECT_STREQ(text, "a-b-c-d-e-f");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, RefusesToCopyOrConcatenateNull) {
    expect_refused("copy to null", [] { return tavo_osal_string_copy(nullptr, "x"); });
    expect_refused("copy of null", [&] { return tavo_osal_string_copy(buffer, nullptr); });
    expect_refused("copy, both", [] { return tavo_osal_string_copy(nullptr, nullptr); });
    expect_refused("num_copy to null", [] { return tavo_osal_string_num_copy(nullptr, "x", 1); });
    expect_refused("num_copy of null", [&] { return tavo_osal_string_num_copy(buffer, nullptr, 1); });
    expect_refused("num_copy, both, count 0", [] { return tavo_osal_string_num_copy(nullptr, nullptr, 0); });
    expect_refused("concatenate to null", [] { return tavo_osal_string_concatenate(nullptr, "x"); });
    expect_refused("concatenate of null", [&] { return tavo_osal_string_concatenate(buffer, nullptr); });
    expect_refused("concatenate, both", [] { return tavo_osal_string_concatenate(nullptr, nullptr); });
    expect_refused("num_concatenate to null", [] { return tavo_osal_string_num_concatenate(nullptr, "x", 1); });
    expect_refused("num_concatenate of null", [&] { return tavo_osal_string_num_concatenate(buffer, nullptr, 1); });
    expect_refused("num_concatenate, both", [] { return tavo_osal_string_num_concatenate(nullptr, nullptr, 1); });
    EXPECT_STREQ(buffer, "left alone");
}

TEST_F(String, Measures) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_string_get_length(""), 0U);
    EXPECT_EQ(tavo_osal_string_get_length("abc"), 3U);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, MeasuresNullAsNothing) {
    expect_refused("length", [] { return tavo_osal_string_get_length(nullptr); });
}

TEST_F(String, SearchesTexts) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_string_search_string(text, "-"), text + 1);
    EXPECT_EQ(tavo_osal_string_search_string(text, "b-c"), text + 2);
    EXPECT_EQ(tavo_osal_string_search_string(text, ""), text);
    EXPECT_EQ(tavo_osal_string_search_string(text, "d"), nullptr);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, RefusesToSearchNull) {
    expect_refused("in null", [] { return tavo_osal_string_search_string(nullptr, "x"); });
    expect_refused("for null", [&] { return tavo_osal_string_search_string(text, nullptr); });
    expect_refused("both", [] { return tavo_osal_string_search_string(nullptr, nullptr); });
}

TEST_F(String, SearchesCharactersUnderBothNames) {
    for (const auto first : {tavo_osal_string_search_character, tavo_osal_string_scan_string}) {
        const LogCapture log;
        EXPECT_EQ(first(text, '-'), text + 1);
        EXPECT_EQ(first(text, '\0'), text + 5);
        EXPECT_EQ(first(text, 0x100 + 'b'), text + 2);  // as a char
        EXPECT_EQ(first(text, 'x'), nullptr);
        EXPECT_TRUE(log.lines().empty());
    }
    for (const auto last : {tavo_osal_string_search_last_character, tavo_osal_string_scan_string_rev}) {
        const LogCapture log;
        EXPECT_EQ(last(text, '-'), text + 3);
        EXPECT_EQ(last(text, '\0'), text + 5);
        EXPECT_EQ(last(text, 'x'), nullptr);
        EXPECT_TRUE(log.lines().empty());
    }
}

TEST_F(String, RefusesToSearchCharactersInNull) {
    for (const auto search : {tavo_osal_string_search_character, tavo_osal_string_scan_string,
                              tavo_osal_string_search_last_character, tavo_osal_string_scan_string_rev}) {
        expect_refused("character", [search] { return search(nullptr, 'x'); });
    }
}

TEST_F(String, DuplicatesIntoMemoryOfTheCallers) {
    const LogCapture log;
    char* copy = tavo_osal_string_duplicate_string(text);
    ASSERT_NE(copy, nullptr);
    EXPECT_NE(copy, text);
    EXPECT_STREQ(copy, text);
    tavo_osal_mem_free(copy);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, RefusesToDuplicateNull) {
    expect_refused("duplicate", [] { return tavo_osal_string_duplicate_string(nullptr) != nullptr; });
}

char* failing_strdup(const char*) {
    errno = ENOMEM;
    return nullptr;
}

TEST_F(String, PassesAFailedDuplicationOnWithoutAWord) {
    const PlatformHook hook("libtavoosal.so", "strdup", failing_strdup);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_string_duplicate_string(text), nullptr);
    EXPECT_TRUE(log.lines().empty());
}

int sign(int value) { return (value > 0) - (value < 0); }

using Comparison = int (*)(const char*, const char*);

struct NamedComparison {
    const char* name;
    Comparison compare;
};

// The counted ones with a count that reaches over all the texts below, and with 0, which null rules ignore.
const NamedComparison kComparisons[] = {
    {"compare", tavo_osal_string_compare},
    {"case_ignore_compare", tavo_osal_case_ignore_string_compare},
    {"num_compare", [](const char* a, const char* b) { return tavo_osal_string_num_compare(a, b, 99); }},
    {"case_ignore_num_compare",
     [](const char* a, const char* b) { return tavo_osal_case_ignore_string_num_compare(a, b, 99); }},
};
const NamedComparison kComparisonsOfNothing[] = {
    {"num_compare", [](const char* a, const char* b) { return tavo_osal_string_num_compare(a, b, 0); }},
    {"case_ignore_num_compare",
     [](const char* a, const char* b) { return tavo_osal_case_ignore_string_num_compare(a, b, 0); }},
};

TEST_F(String, ComparesAsTheCLibraryDoes) {
    const LogCapture log;
    for (const auto& [name, compare] : kComparisons) {
        EXPECT_EQ(compare("abc", "abc"), 0) << name;
        EXPECT_EQ(sign(compare("abc", "abd")), -1) << name;
        EXPECT_EQ(sign(compare("abcd", "abc")), 1) << name;
        EXPECT_EQ(sign(compare("", "a")), -1) << name;
        EXPECT_EQ(sign(compare("\xff", "a")), 1) << name;
    }
    EXPECT_EQ(sign(tavo_osal_string_compare("ABC", "abc")), -1);
    EXPECT_EQ(tavo_osal_case_ignore_string_compare("ABC", "abc"), 0);
    EXPECT_EQ(tavo_osal_string_num_compare("abX", "abY", 2), 0);
    EXPECT_EQ(sign(tavo_osal_string_num_compare("abX", "abY", 3)), -1);
    EXPECT_EQ(sign(tavo_osal_string_num_compare("AB", "ab", 2)), -1);
    EXPECT_EQ(tavo_osal_case_ignore_string_num_compare("ABx", "abY", 2), 0);
    EXPECT_EQ(sign(tavo_osal_case_ignore_string_num_compare("ABx", "abY", 3)), -1);
    for (const auto& [name, compare] : kComparisonsOfNothing) EXPECT_EQ(compare("a", "b"), 0) << name;
    EXPECT_TRUE(log.lines().empty());
}

void expect_null_rules(const NamedComparison& comparison) {
    struct Row {
        const char* a;
        const char* b;
        int result;
        const ExpectedLine& line;
    };
    const Row rows[] = {
        {"abc", nullptr, 97, kOneNull}, {"Abc", nullptr, 65, kOneNull},   {"\xff", nullptr, 255, kOneNull},
        {"", nullptr, 0, kOneNull},     {nullptr, "B", -66, kOneNull},    {nullptr, "\xff", -255, kOneNull},
        {nullptr, "", 0, kOneNull},     {nullptr, nullptr, 0, kTwoNulls},
    };
    for (const Row& row : rows) {
        const LogCapture log;
        EXPECT_EQ(comparison.compare(row.a, row.b), row.result) << comparison.name;
        EXPECT_TRUE(logged_exactly(log.lines(), {row.line})) << comparison.name;
    }
}

TEST_F(String, ComparesNullLikeAnEmptyText) {
    for (const NamedComparison& comparison : kComparisons) expect_null_rules(comparison);
    for (const NamedComparison& comparison : kComparisonsOfNothing) expect_null_rules(comparison);
}

TEST_F(String, UpperCasesIntoANewText) {
    const LogCapture log;
    const char source[] = "a1b";
    char* upper = tavo_osal_convert_string_to_upper(source);
    EXPECT_STREQ(upper, "A1B");
    EXPECT_STREQ(source, "a1b");
    tavo_osal_mem_free(upper);
    upper = tavo_osal_convert_string_to_upper("");
    EXPECT_STREQ(upper, "");
    tavo_osal_mem_free(upper);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, UpperCasesEveryByteAsToupperHasIt) {
    std::string all;
    std::string expected;
    for (int byte = 1; byte <= UCHAR_MAX; ++byte) {
        all += static_cast<char>(byte);
        expected += static_cast<char>(byte >= 'a' && byte <= 'z' ? byte - 'a' + 'A' : byte);
    }
    char* upper = tavo_osal_convert_string_to_upper(all.c_str());
    EXPECT_EQ(std::string(upper), expected);
    tavo_osal_mem_free(upper);
}

TEST_F(String, ReportsAFailedDuplicationForUpperCase) {
    const PlatformHook hook("libtavoosal.so", "strdup", failing_strdup);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_convert_string_to_upper("text"), nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_STRING", "String duplication failed\n"}}));
}

struct Conversion {
    const char* text;
    int base;
    TAVO_Status status;
    long long number;
};

ExpectedLine conversion_failure(const Conversion& conversion) {
    return conversion.status == TAVO_OUT_OF_RANGE
               ? ExpectedLine{1, "OSAL_STRING", "Converted number goes out of range\n"}
               : ExpectedLine{1, "OSAL_STRING",
                              std::string("Non convertible characters in the string: ") + conversion.text + ".\n"};
}

void expect_conversion(const Conversion& conversion) {
    const LogCapture log;
    long long number = 77;
    EXPECT_EQ(tavo_osal_convert_string_to_num(conversion.text, conversion.base, &number), conversion.status)
        << conversion.text << ", base " << conversion.base;
    EXPECT_EQ(number, conversion.number) << conversion.text << ", base " << conversion.base;
    if (conversion.status == TAVO_SUCCESS) {
        EXPECT_TRUE(log.lines().empty()) << conversion.text;
    } else {
        EXPECT_TRUE(logged_exactly(log.lines(), {conversion_failure(conversion)})) << conversion.text;
    }
}

TEST(StringToNumber, ConvertsWholeTexts) {
    const Conversion rows[] = {
        {"0", 10, TAVO_SUCCESS, 0},
        {"-5", 10, TAVO_SUCCESS, -5},
        {"+7", 10, TAVO_SUCCESS, 7},
        {" \t\n 42", 10, TAVO_SUCCESS, 42},
        {"", 10, TAVO_SUCCESS, 0},
        {"0x1F", 16, TAVO_SUCCESS, 31},
        {"0x1F", 0, TAVO_SUCCESS, 31},
        {"1f", 16, TAVO_SUCCESS, 31},
        {"017", 0, TAVO_SUCCESS, 15},
        {"017", 10, TAVO_SUCCESS, 17},
        {"101", 2, TAVO_SUCCESS, 5},
        {"zz", 36, TAVO_SUCCESS, 35 * 36 + 35},
        {"2147483646", 10, TAVO_SUCCESS, 2147483646},
        {"2147483647", 10, TAVO_SUCCESS, 2147483647},
        {"-2147483647", 10, TAVO_SUCCESS, -2147483647},
        {"-2147483648", 10, TAVO_SUCCESS, -2147483648LL},
    };
    for (const Conversion& row : rows) {
        errno = 0;
        expect_conversion(row);
    }
}

TEST(StringToNumber, RefusesWhatIsNoNumber) {
    for (const Conversion& row : {
             Conversion{"12ab", 10, TAVO_INVALID_PARAM, 0},
             {"12 ", 10, TAVO_INVALID_PARAM, 0},
             {"x", 10, TAVO_INVALID_PARAM, 0},
             {" ", 10, TAVO_INVALID_PARAM, 0},
             {"-", 10, TAVO_INVALID_PARAM, 0},
             {"1.5", 10, TAVO_INVALID_PARAM, 0},
             {"0x1F", 10, TAVO_INVALID_PARAM, 0},
             {"2", 2, TAVO_INVALID_PARAM, 0},
             {"%s%n", 10, TAVO_INVALID_PARAM, 0},
         }) {
        errno = 0;
        expect_conversion(row);
    }
}

TEST(StringToNumber, RefusesWhatDoesNotFitIn32Bits) {
    for (const Conversion& row : {
             Conversion{"2147483648", 10, TAVO_OUT_OF_RANGE, 0},
             {"-2147483649", 10, TAVO_OUT_OF_RANGE, 0},
             {"4294967296", 10, TAVO_OUT_OF_RANGE, 0},
             {"9223372036854775807", 10, TAVO_OUT_OF_RANGE, 0},
             {"9223372036854775808", 10, TAVO_OUT_OF_RANGE, 0},
             {"-99999999999999999999999999", 10, TAVO_OUT_OF_RANGE, 0},
             {"0xFFFFFFFF", 16, TAVO_OUT_OF_RANGE, 0},
             {"2147483648x", 10, TAVO_OUT_OF_RANGE, 0},  // the range is looked at first
         }) {
        errno = 0;
        expect_conversion(row);
        EXPECT_EQ(errno, ERANGE) << row.text;
    }
}

TEST(StringToNumber, TakesAnExactLimitForOutOfRangeAfterAStaleError) {
    for (const char* limit : {"2147483647", "-2147483648"}) {
        errno = ERANGE;
        expect_conversion({limit, 10, TAVO_OUT_OF_RANGE, 0});
        EXPECT_EQ(errno, ERANGE);
    }
    errno = ERANGE;
    expect_conversion({"2147483646", 10, TAVO_SUCCESS, 2147483646});
    errno = ERANGE;
    expect_conversion({"12ab", 10, TAVO_INVALID_PARAM, 0});
}

TEST(StringToNumber, ConvertsNothingInABaseThatDoesNotExist) {
    for (const int base : {-1, 1, 37, INT_MAX, INT_MIN}) {
        errno = 0;
        expect_conversion({"12", base, TAVO_INVALID_PARAM, 0});
        expect_conversion({"", base, TAVO_SUCCESS, 0});
    }
}

TEST(StringToNumber, RefusesNullPointers) {
    LogCapture log;
    long long number = 77;
    char text[128];
    const auto expected = [&text](const char* pcStr, int base, const void* target) {
        snprintf(text, sizeof text, "Invalid input parameter, pcStr: %p, iBase: %d, plNum: %p\n",
                 static_cast<const void*>(pcStr), base, target);
        return ExpectedLine{1, "OSAL_STRING", text};
    };
    EXPECT_EQ(tavo_osal_convert_string_to_num(nullptr, 10, &number), TAVO_INVALID_PARAM);
    EXPECT_EQ(number, 77);
    EXPECT_TRUE(logged_exactly(log.lines(), {expected(nullptr, 10, &number)}));

    log.clear();
    const char* digits = "12";
    EXPECT_EQ(tavo_osal_convert_string_to_num(digits, -3, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {expected(digits, -3, nullptr)}));

    log.clear();
    EXPECT_EQ(tavo_osal_convert_string_to_num(nullptr, 0, nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {expected(nullptr, 0, nullptr)}));
}

TEST_F(String, FormatsValues) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_sprintf(buffer, "%d of %s at %.1f", 3, "five", 2.5), 16);
    EXPECT_STREQ(buffer, "3 of five at 2.5");
    EXPECT_EQ(tavo_osal_sprintf(buffer, "%" PRId64, INT64_MIN), 20);
    EXPECT_STREQ(buffer, "-9223372036854775808");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, FormatsValuesWithABoundAndTellsTheWholeLength) {
    const LogCapture log;
    const char* format = "%s-%d";
    EXPECT_EQ(tavo_osal_snprintf(buffer, 4, format, "abc", 42), 6);
    EXPECT_STREQ(buffer, "abc");
    EXPECT_EQ(tavo_osal_snprintf(buffer, sizeof buffer, format, "abc", 42), 6);
    EXPECT_STREQ(buffer, "abc-42");
    EXPECT_EQ(tavo_osal_snprintf(nullptr, 0, format, "abc", 42), 6);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(String, ScansTargets) {
    const LogCapture log;
    int number = 0;
    char word[8] = "";
    EXPECT_EQ(tavo_osal_sscanf("12 five", "%d %7s", &number, word), 2);
    EXPECT_EQ(number, 12);
    EXPECT_STREQ(word, "five");
    EXPECT_EQ(tavo_osal_sscanf("x", "%d", &number), 0);
    EXPECT_EQ(tavo_osal_sscanf("", "%d", &number), EOF);
    EXPECT_TRUE(log.lines().empty());
}

}  // namespace

// Runs the fuzz target over a corpus of its own, so that it keeps working where nobody fuzzes.
#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <string_view>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace {

using namespace std::string_view_literals;

constexpr std::string_view kCorpus[] = {
    ""sv,         "0.0.0.0"sv,  "1.2.3.4"sv,       "255.255.255.255"sv,      "10.0.0.0"sv,           "1.2.3.256"sv,
    "1.2.3.4x"sv, "1.2.3"sv,    "1.2.3.4567"sv,    "255.255.255.2555"sv,     " +1. 02.-0.255 "sv,    "-1.-1.-1.-1"sv,
    "+.+.+.+"sv,  "%s%n%s%n"sv, "1.2.3.4\0.5.6"sv, "\xFF\xFE.\x80.\xA0.1"sv, "\t\n\v\f\r 1.1.1.1"sv,
};

TEST(Ipv4Fuzz, HoldsOnTheCorpus) {
    for (const std::string_view text : kCorpus) {
        EXPECT_EQ(LLVMFuzzerTestOneInput(reinterpret_cast<const uint8_t*>(text.data()), text.size()), 0);
    }
}

TEST(Ipv4Fuzz, HoldsOnEveryChangeOfOneByteInTheCorpus) {
    for (const std::string_view text : kCorpus) {
        for (size_t at = 0; at < text.size(); ++at) {
            std::string changed(text);
            for (int byte = 0; byte < 256; ++byte) {
                changed[at] = static_cast<char>(byte);
                EXPECT_EQ(LLVMFuzzerTestOneInput(reinterpret_cast<const uint8_t*>(changed.data()), changed.size()), 0);
            }
        }
    }
}

}  // namespace

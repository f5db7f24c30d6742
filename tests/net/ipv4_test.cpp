// IPv4 texts.
#include <gtest/gtest.h>

#include <array>
#include <random>
#include <string>
#include <vector>

#include "net/ipv4_model.h"
#include "support/log_capture.h"
#include "tavo_osal/network.h"

namespace {

using tavo::test::Ipv4Model;
using tavo::test::Ipv4Verdict;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;

constexpr char kTag[] = "OSAL_SOCKET";

const std::string kMeta = "A non-routable meta-address designating invalid target:";
const std::string kLength = "Invalid length of IP address(Correct range 7-15 including dots):";
const std::string kSegments = "Invalid IPv4 address, more or less than 4 segments:";
const std::string kNetwork = "Encountered a Network address(host id  portion bits of an IP address are zero):";
const std::string kBroadcast = "Encountered a Broadcast address(host id portion bits of an IP address are one):";

void expect_silent(const std::string& text) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_validate_ipv4(text.c_str()), TAVO_SUCCESS) << text;
    EXPECT_TRUE(log.lines().empty()) << text;
}

void expect_message(const std::string& text, TAVO_Status status, unsigned level, const std::string& message) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_validate_ipv4(text.c_str()), status) << text;
    EXPECT_TRUE(logged_exactly(log.lines(), {{level, kTag, message}}));
}

TEST(Ipv4, AcceptsAddresses) {
    for (const char* text : {"1.2.3.4", "192.168.1.255", "255.255.255.254", "127.0.0.1", "8.8.8.8", "10.0.0.1"}) {
        expect_silent(text);
    }
}

TEST(Ipv4, RefusesNull) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_validate_ipv4(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "NULL IpAddress passed\n"}}));
}

TEST(Ipv4, RefusesTheMetaAddressInItsPlainSpellingOnly) {
    expect_message("0.0.0.0", TAVO_FAILURE, 1, kMeta + "0.0.0.0\n");
    expect_silent("00.0.0.0");
    expect_silent("0.0.0.0 ");
}

TEST(Ipv4, RefusesTextsOfTheWrongLength) {
    for (const std::string text : {"", "1", "1.2.3", "1.2.3.", "1.2.34", "255.255.255.2555", "1.2.3.4         "}) {
        expect_message(text, TAVO_FAILURE, 1, kLength + text + "\n");
    }
    const std::string endless(1000000, '1');
    expect_message(endless, TAVO_FAILURE, 1, kLength + endless + "\n");
}

TEST(Ipv4, RefusesMoreAndLessThanFourSegments) {
    for (const std::string text :
         {"1.2.3.4x", "1.2.3.4.5", "100.200.3", "1.2.3.x", "1..2.3.4", "1.2.3.4567", "1234.1.1.1", "1,2,3,4", "       ",
          "abcdefg", ".1.2.3.4", "1 .2.3.4", "1.2.3.4 5", "%s%s%s%s%n", "1.2.3.-", "0x1.2.3.4", "1.2.3.4\n5"}) {
        expect_message(text, TAVO_FAILURE, 1, kSegments + text + "\n");
    }
}

TEST(Ipv4, RefusesSegmentsAbove255WithTheFirstOnesValue) {
    expect_message("1.2.3.256", TAVO_FAILURE, 1, "Invalid range within IP:1.2.3.256, error segment:256\n");
    expect_message("999.300.1.1", TAVO_FAILURE, 1, "Invalid range within IP:999.300.1.1, error segment:999\n");
    expect_message("1.400.500.1", TAVO_FAILURE, 1, "Invalid range within IP:1.400.500.1, error segment:400\n");
}

TEST(Ipv4, TakesANegativeSegmentForAHugeOne) {
    expect_message("1.2.3.-1", TAVO_FAILURE, 1, "Invalid range within IP:1.2.3.-1, error segment:-1\n");
}

TEST(Ipv4, WarnsOfNetworks) {
    for (const std::string text : {"10.0.0.0", "1.0.0.0", "192.0.0.0", "255.0.0.0", "010.00.0.000"}) {
        expect_message(text, TAVO_SUCCESS, 2, kNetwork + text + "\n");
    }
}

TEST(Ipv4, WarnsOfBroadcastAddresses) {
    for (const std::string text : {"10.255.255.255", "255.255.255.255", "1.255.255.255"}) {
        expect_message(text, TAVO_SUCCESS, 2, kBroadcast + text + "\n");
    }
}

TEST(Ipv4, DoesNotWarnWhenTheFirstSegmentIsZero) {
    for (const char* text : {"0.255.255.255", "000.0.0.0", "0.0.0.1", "-0.0.0.0"}) expect_silent(text);
}

TEST(Ipv4, TakesNumbersAsTheScannerDoes) {
    for (const char* text :
         {"001.002.003.4", "+1.2.3.4", "1.+2.3.+4", " 1.2.3.4", "1. 2.3.4", "1.2.3.4  ", "1.2.3.4\t\n", "1.2.3.-0"}) {
        expect_silent(text);
    }
}

TEST(Ipv4, KeepsTheText) {
    std::string text = "1.2.3.4";
    EXPECT_EQ(tavo_osal_validate_ipv4(text.c_str()), TAVO_SUCCESS);
    EXPECT_EQ(text, "1.2.3.4");
}

// --- against the model

testing::AssertionResult agrees(const std::string& text) {
    const LogCapture log;
    const TAVO_Status status = tavo_osal_validate_ipv4(text.c_str());
    const Ipv4Verdict verdict = Ipv4Model::judge(text);
    std::vector<tavo::test::ExpectedLine> expected;
    for (const auto& message : verdict.messages) expected.push_back({message.level, kTag, message.text});
    if (status != verdict.status) {
        return testing::AssertionFailure() << testing::PrintToString(text) << ": " << std::hex << status << " but "
                                           << verdict.status << " by the model";
    }
    return logged_exactly(log.lines(), expected) << "\nfor " << testing::PrintToString(text);
}

TEST(Ipv4Differential, AgreesOnEveryCombinationOfTellingSegments) {
    const std::array<const char*, 12> segments = {"0",   "00",  "1",   "9",   "99",   "199",
                                                  "254", "255", "256", "999", "1000", ""};
    for (const char* a : segments) {
        for (const char* b : segments) {
            for (const char* c : segments) {
                for (const char* d : segments) {
                    ASSERT_TRUE(agrees(std::string(a) + "." + b + "." + c + "." + d));
                }
            }
        }
    }
}

TEST(Ipv4Differential, AgreesOnGeneratedTexts) {
    std::mt19937 random(20240229);
    const auto below = [&](size_t limit) { return std::uniform_int_distribution<size_t>(0, limit - 1)(random); };
    const std::string odd = "0123456789.+- \t\n\v\f\rxX,:%\x01\x7F\x80\xA0\xFF";
    for (int round = 0; round < 60000; ++round) {
        std::string text;
        for (int i = 0; i < 4; ++i) text += (i > 0 ? "." : "") + std::to_string(below(below(2) == 0 ? 256 : 1200));
        for (size_t change = below(4); change > 0; --change) {
            const size_t at = below(text.size() + 1);
            switch (below(3)) {
                case 0: text.insert(at, 1, odd[below(odd.size())]); break;
                case 1: text.erase(at, 1); break;
                default:
                    if (at < text.size()) text[at] = odd[below(odd.size())];
            }
            if (text.empty()) break;
        }
        ASSERT_TRUE(agrees(text));
    }
}

TEST(Ipv4Differential, AgreesOnRandomBytes) {
    std::mt19937 random(7);
    const std::string likely = "0125.+- ";
    for (int round = 0; round < 60000; ++round) {
        std::string text(5 + random() % 13, '.');
        for (char& c : text) c = likely[random() % likely.size()];
        ASSERT_TRUE(agrees(text));
    }
}

}  // namespace

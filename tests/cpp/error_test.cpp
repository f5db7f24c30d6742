#include "tavo_osal/cpp/error.hpp"

#include <gtest/gtest.h>

#include <set>
#include <string>

namespace {

using tavo::Errc;

TEST(CppError, SuccessIsNoError) {
    EXPECT_FALSE(tavo::to_error_code(TAVO_SUCCESS));
    EXPECT_EQ(tavo::status_category().message(TAVO_SUCCESS), "success");
}

TEST(CppError, AStatusKeepsItsNumberAndComesWithTheCategory) {
    const std::error_code error = tavo::to_error_code(TAVO_MQ_MSG_TOO_LARGE);
    EXPECT_TRUE(error);
    EXPECT_EQ(error.value(), 0x9305);
    EXPECT_EQ(error.category(), tavo::status_category());
    EXPECT_STREQ(error.category().name(), "tavo_osal");
}

TEST(CppError, CodesCompareWithTheEnumeration) {
    EXPECT_EQ(tavo::to_error_code(TAVO_NO_MEMORY), Errc::no_memory);
    EXPECT_NE(tavo::to_error_code(TAVO_NO_MEMORY), Errc::failure);
    const std::error_code assigned = Errc::busy;
    EXPECT_EQ(assigned.value(), TAVO_BUSY);
}

TEST(CppError, EveryCodeHasAMessageOfItsOwn) {
    std::set<std::string> messages;
    for (const auto& entry : tavo::detail::kStatusTexts) {
        const std::string message = make_error_code(entry.code).message();
        EXPECT_EQ(message, entry.text);
        EXPECT_TRUE(messages.insert(message).second) << message;
    }
    // 25 codes of status.h, and the two numbers the queues answer with besides.
    EXPECT_EQ(messages.size(), 28U);
}

TEST(CppError, UnknownCodesSayWhichNumberTheyAre) {
    EXPECT_EQ(tavo::to_error_code(0x9999).message(), "unknown status 39321 (0x9999)");
    EXPECT_EQ(tavo::to_error_code(-2).message(), "unknown status -2 (0xfffffffe)");
}

TEST(CppError, CodesAnswerToTheStandardsConditions) {
    EXPECT_EQ(tavo::to_error_code(TAVO_TIMEOUT), std::errc::timed_out);
    EXPECT_EQ(tavo::to_error_code(TAVO_CONDITION_TIMEOUT), std::errc::timed_out);
    EXPECT_EQ(tavo::to_error_code(TAVO_SEMAPHORE_TIMEOUT), std::errc::timed_out);
    EXPECT_EQ(tavo::to_error_code(TAVO_SOCKET_SELECT_TIMEOUT), std::errc::timed_out);
    EXPECT_EQ(tavo::to_error_code(TAVO_INVALID_PARAM), std::errc::invalid_argument);
    EXPECT_EQ(tavo::to_error_code(TAVO_NO_MEMORY), std::errc::not_enough_memory);
    EXPECT_EQ(tavo::to_error_code(TAVO_BUSY), std::errc::device_or_resource_busy);
    EXPECT_EQ(tavo::to_error_code(TAVO_MQ_MSG_TOO_LARGE), std::errc::message_size);
    EXPECT_NE(tavo::to_error_code(TAVO_FAILURE), std::errc::io_error);
    EXPECT_EQ(tavo::to_error_code(TAVO_FAILURE).default_error_condition().category(), tavo::status_category());
}

TEST(CppError, ExceptionsCarryTheCodeAndTheOperation) {
    try {
        tavo::detail::or_throw("the operation", [](std::error_code& error) { error = Errc::no_memory; });
        FAIL() << "nothing was thrown";
    } catch (const std::system_error& thrown) {
        EXPECT_EQ(thrown.code(), Errc::no_memory);
        EXPECT_STREQ(thrown.what(), "the operation: no memory, or no free place");
    }
    EXPECT_EQ(tavo::detail::or_throw("", [](std::error_code&) { return 7; }), 7);
}

}  // namespace

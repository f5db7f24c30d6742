#include "tavo_osal/status.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <set>
#include <type_traits>

namespace {

struct Code {
    const char* name;
    TAVO_Status value;
    TAVO_Status expected;
};

#define CODE(name, expected) \
    { #name, name, expected }

const Code kCodes[] = {
    CODE(TAVO_SUCCESS, 0),
    CODE(TAVO_FAILURE, 0x9001),
    CODE(TAVO_INVALID_PARAM, 0x9002),
    CODE(TAVO_NO_MEMORY, 0x9003),
    CODE(TAVO_DESTROY_FAILED, 0x9004),
    CODE(TAVO_NOT_SUPPORTED, 0x9005),
    CODE(TAVO_BUSY, 0x9006),
    CODE(TAVO_OUT_OF_RANGE, 0x9007),
    CODE(TAVO_TIMEOUT, 0x9101),
    CODE(TAVO_SOCKET_CREATE_FAILED, 0x9201),
    CODE(TAVO_SOCKET_CONNECT_FAILED, 0x9202),
    CODE(TAVO_SOCKET_CLOSE_FAILED, 0x9203),
    CODE(TAVO_SOCKET_SELECT_TIMEOUT, 0x9204),
    CODE(TAVO_SOCKET_SELECT_FAILED, 0x9205),
    CODE(TAVO_SOCKET_SEND_FAILED, 0x9206),
    CODE(TAVO_SOCKET_OPTION_FAILED, 0x9207),
    CODE(TAVO_MQ_KEY_FAILED, 0x9301),
    CODE(TAVO_MQ_INVALID_POINTER, 0x9302),
    CODE(TAVO_MQ_FAILURE, 0x9303),
    CODE(TAVO_MQ_MSG_TOO_LARGE, 0x9305),
    CODE(TAVO_MQ_NOT_AVAILABLE, 0x9306),
    CODE(TAVO_CONDITION_TIMEOUT, 0x9501),
    CODE(TAVO_SEM_DELETE_FAILED, 0x9602),
    CODE(TAVO_SEMAPHORE_TIMEOUT, 0x9608),
    CODE(TAVO_DL_OPEN_FAILED, 0x9801),
    CODE(TAVO_DL_SYMBOL_FAILED, 0x9802),
    CODE(TAVO_DL_CLOSE_FAILED, 0x9803),
};

TEST(Status, GivesEveryCodeItsNumber) {
    for (const Code& code : kCodes) EXPECT_EQ(code.value, code.expected) << code.name;
}

TEST(Status, SharesNoNumberBetweenTwoCodes) {
    std::set<TAVO_Status> seen;
    for (const Code& code : kCodes) EXPECT_TRUE(seen.insert(code.value).second) << code.name;
}

TEST(Status, TellsTheFourTimeOutsApart) {
    EXPECT_EQ((std::set<TAVO_Status>{TAVO_SOCKET_SELECT_TIMEOUT, TAVO_TIMEOUT, TAVO_CONDITION_TIMEOUT,
                                     TAVO_SEMAPHORE_TIMEOUT})
                  .size(),
              4U);
}

TEST(ScalarTypes, HaveTheirWidthsAndSigns) {
    EXPECT_EQ(sizeof(TAVO_Status), 4U);
    EXPECT_TRUE(std::is_signed_v<TAVO_Status>);
    EXPECT_TRUE((std::is_same_v<TAVO_CHAR, char>));
    EXPECT_EQ(sizeof(TAVO_INT64), 8U);
    EXPECT_TRUE(std::is_signed_v<TAVO_INT64>);
    EXPECT_EQ(sizeof(TAVO_TimeVal), 8U);
    EXPECT_EQ(sizeof(TAVO_TimeVal::tv_sec), 4U);
    EXPECT_EQ(sizeof(TAVO_TimeVal::tv_usec), 4U);
    EXPECT_EQ(offsetof(TAVO_TimeVal, tv_usec), 4U);
}

}  // namespace

/**
 * @file
 * The testing kit's checks as GoogleTest's, for programs that use it: EXPECT_TRUE(logged(...)) shows all lines on
 * failure. The rest of the kit needs no test framework.
 */
#ifndef TAVO_OSAL_TESTING_GTEST_HPP
#define TAVO_OSAL_TESTING_GTEST_HPP

#include <gtest/gtest.h>

#include <algorithm>
#include <vector>

#include "tavo_osal/testing/log_capture.hpp"

namespace tavo::test {

/** Exactly these lines, in this order. */
inline ::testing::AssertionResult logged_exactly(const std::vector<LogLine>& lines,
                                                 const std::vector<ExpectedLine>& expected) {
    if (std::equal(lines.begin(), lines.end(), expected.begin(), expected.end())) {
        return ::testing::AssertionSuccess();
    }
    return ::testing::AssertionFailure() << "expected lines " << ::testing::PrintToString(expected) << "\nlogged lines "
                                         << ::testing::PrintToString(lines);
}

/** This line, among others. */
inline ::testing::AssertionResult logged(const std::vector<LogLine>& lines, const ExpectedLine& expected) {
    if (has_line(lines, expected)) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "expected among others " << ::testing::PrintToString(expected)
                                         << "\nlogged lines " << ::testing::PrintToString(lines);
}

}  // namespace tavo::test

#endif

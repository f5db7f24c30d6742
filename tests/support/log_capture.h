// Captures what is written to the Android log while it lives, instead of letting it reach the log.
//
// The test program defines __android_log_vprint and __android_log_print itself; the dynamic linker
// gives the library those in place of liblog's.
#pragma once

#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

namespace tavo::test {

struct LogLine {
    int priority;      // Android's, or level when compared through ExpectedLine
    std::string tag;   // "(null)" for a null tag
    std::string text;  // as given to the log, with the source line prefix
    bool by_print;     // through __android_log_print, not __android_log_vprint

    // The text behind the "LINE::" prefix.
    std::string message() const;
};

// A message as the library's developer writes it: level, tag, text without the source line.
struct ExpectedLine {
    unsigned level;
    std::string tag;
    std::string message;
};

class LogCapture {
public:
    // Everything is let through to the capture unless the test lowers the level itself.
    explicit LogCapture(unsigned max_level = 6);
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    // Lines so far, oldest first.
    std::vector<LogLine> lines() const;
    // Lines so far with one tag only.
    std::vector<LogLine> lines(const std::string& tag) const;
    // Forgets the lines so far.
    void clear();

private:
    uint32_t saved_level_;
    uint32_t saved_mask_;
};

int priority_of(unsigned level);

bool operator==(const LogLine& line, const ExpectedLine& expected);
std::ostream& operator<<(std::ostream& out, const LogLine& line);
std::ostream& operator<<(std::ostream& out, const ExpectedLine& line);

// Exactly these lines, in this order.
testing::AssertionResult logged_exactly(const std::vector<LogLine>& lines, const std::vector<ExpectedLine>& expected);
// This line, among others.
testing::AssertionResult logged(const std::vector<LogLine>& lines, const ExpectedLine& expected);

}  // namespace tavo::test

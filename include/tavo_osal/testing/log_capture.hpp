/**
 * @file
 * tavo::test::LogCapture: what is written to the Android log, as lines with level, tag and text.
 */
#ifndef TAVO_OSAL_TESTING_LOG_CAPTURE_HPP
#define TAVO_OSAL_TESTING_LOG_CAPTURE_HPP

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

namespace tavo::test {

/** One line of the log. */
struct LogLine {
    int priority;     /**< Android's: 2 verbose, 3 debug, 4 information, 5 warning, 6 error */
    std::string tag;  /**< "(null)" for a null tag */
    std::string text; /**< as given to the log, with the source line that tavo_print_log() puts in front */
    bool by_print;    /**< written with __android_log_print(), and not by the library's logging */

    /** The text behind the "LINE::" in front, the one that the developer wrote. */
    std::string message() const;
};

/** A line as the developer writes it: what tavo_print_log() was given. */
struct ExpectedLine {
    unsigned level;      /**< #TAVO_LOG_ERROR and so on */
    std::string tag;     /**< the module's tag */
    std::string message; /**< without the source line, which changes with every edit */
};

/**
 * Captures everything that is written to the Android log while it lives, by this program and the libraries it
 * has loaded, instead of letting it reach the log. Raises the library's maximum level, so that nothing is filtered
 * out, and puts level and modules back when it ends.
 *
 * One at a time. Lines may come from any thread.
 */
class LogCapture {
public:
    /** Begins to capture. @param max_level levels above it are filtered out as usual */
    explicit LogCapture(unsigned max_level = 6);
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    /** The lines so far, oldest first. */
    std::vector<LogLine> lines() const;
    /** The lines so far that have a certain tag. */
    std::vector<LogLine> lines(const std::string& tag) const;
    /** Forgets the lines so far. */
    void clear();

private:
    uint32_t saved_level_;
    uint32_t saved_mask_;
};

/** The Android priority that a level is written with. */
int priority_of(unsigned level);

/** Whether this line was logged, among others. */
bool has_line(const std::vector<LogLine>& lines, const ExpectedLine& expected);

/** Whether a line is the one expected. */
bool operator==(const LogLine& line, const ExpectedLine& expected);
/** For messages of failed tests. */
std::ostream& operator<<(std::ostream& out, const LogLine& line);
/** For messages of failed tests. */
std::ostream& operator<<(std::ostream& out, const ExpectedLine& line);

}  // namespace tavo::test

#endif

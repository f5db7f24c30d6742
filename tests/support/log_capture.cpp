#include "support/log_capture.h"

#include <android/log.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <mutex>

#include "tavo_osal/log.h"

namespace tavo::test {
namespace {

std::mutex g_mutex;
std::vector<LogLine>* g_lines = nullptr;  // null while nothing captures

int write_line(int priority, const char* tag, bool by_print, const char* format, va_list values) {
    va_list again;
    va_copy(again, values);
    const int length = vsnprintf(nullptr, 0, format, again);
    va_end(again);
    std::string text(length > 0 ? static_cast<size_t>(length) : 0, '\0');
    if (length > 0) vsnprintf(text.data(), text.size() + 1, format, values);

    const std::lock_guard<std::mutex> lock(g_mutex);
    if (g_lines != nullptr) {
        g_lines->push_back({priority, tag != nullptr ? tag : "(null)", text, by_print});
    }
    return 1;
}

}  // namespace

std::string LogLine::message() const {
    const size_t separator = text.find("::");
    return separator == std::string::npos ? text : text.substr(separator + 2);
}

// Atomically, because the library's threads may be reading it.
static void set_global(uint32_t& global, uint32_t value) { __atomic_store_n(&global, value, __ATOMIC_RELAXED); }

LogCapture::LogCapture(unsigned max_level) : saved_level_(g_uiMxEnabledLogLevel), saved_mask_(g_uiEnabledModuleMask) {
    set_global(g_uiMxEnabledLogLevel, max_level);
    const std::lock_guard<std::mutex> lock(g_mutex);
    g_lines = new std::vector<LogLine>;
}

LogCapture::~LogCapture() {
    set_global(g_uiMxEnabledLogLevel, saved_level_);
    set_global(g_uiEnabledModuleMask, saved_mask_);
    const std::lock_guard<std::mutex> lock(g_mutex);
    delete g_lines;
    g_lines = nullptr;
}

std::vector<LogLine> LogCapture::lines() const {
    const std::lock_guard<std::mutex> lock(g_mutex);
    return *g_lines;
}

std::vector<LogLine> LogCapture::lines(const std::string& tag) const {
    std::vector<LogLine> all = lines();
    all.erase(std::remove_if(all.begin(), all.end(), [&](const LogLine& line) { return line.tag != tag; }), all.end());
    return all;
}

void LogCapture::clear() {
    const std::lock_guard<std::mutex> lock(g_mutex);
    g_lines->clear();
}

int priority_of(unsigned level) {
    constexpr int kPriorities[] = {2, 6, 5, 4, 3, 2, 2};
    return level < std::size(kPriorities) ? kPriorities[level] : 0;
}

bool operator==(const LogLine& line, const ExpectedLine& expected) {
    return !line.by_print && line.priority == priority_of(expected.level) && line.tag == expected.tag &&
           line.message() == expected.message;
}

std::ostream& operator<<(std::ostream& out, const LogLine& line) {
    return out << "priority " << line.priority << ", tag " << line.tag << ", " << testing::PrintToString(line.text);
}

std::ostream& operator<<(std::ostream& out, const ExpectedLine& line) {
    return out << "priority " << priority_of(line.level) << ", tag " << line.tag << ", "
               << testing::PrintToString(line.message);
}

testing::AssertionResult logged_exactly(const std::vector<LogLine>& lines, const std::vector<ExpectedLine>& expected) {
    if (std::equal(lines.begin(), lines.end(), expected.begin(), expected.end())) return testing::AssertionSuccess();
    return testing::AssertionFailure() << "expected lines " << testing::PrintToString(expected) << "\nlogged lines "
                                       << testing::PrintToString(lines);
}

testing::AssertionResult logged(const std::vector<LogLine>& lines, const ExpectedLine& expected) {
    if (std::find(lines.begin(), lines.end(), expected) != lines.end()) return testing::AssertionSuccess();
    return testing::AssertionFailure() << "expected among others " << testing::PrintToString(expected)
                                       << "\nlogged lines " << testing::PrintToString(lines);
}

}  // namespace tavo::test

extern "C" [[gnu::visibility("default")]] int __android_log_vprint(int priority, const char* tag, const char* format,
                                                                   va_list values) {
    return tavo::test::write_line(priority, tag, false, format, values);
}

extern "C" [[gnu::visibility("default")]] int __android_log_print(int priority, const char* tag, const char* format,
                                                                  ...) {
    va_list values;
    va_start(values, format);
    const int result = tavo::test::write_line(priority, tag, true, format, values);
    va_end(values);
    return result;
}

#include "tavo_osal/testing/log_capture.hpp"

#include <link.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <list>
#include <mutex>

#include "tavo_osal/log.h"
#include "tavo_osal/testing/platform_hook.hpp"

namespace tavo::test {
namespace {

using VPrint = int(int, const char*, const char*, va_list);

std::mutex g_mutex;
std::vector<LogLine>* g_lines = nullptr;  // null while nothing captures

std::string formatted(const char* format, va_list values) {
    va_list again;
    va_copy(again, values);
    const int length = vsnprintf(nullptr, 0, format, again);
    va_end(again);
    std::string text(length > 0 ? static_cast<size_t>(length) : 0, '\0');
    if (length > 0) vsnprintf(text.data(), text.size() + 1, format, values);
    return text;
}

// False while nothing captures.
bool captured(int priority, const char* tag, bool by_print, const char* format, va_list values) {
    const std::lock_guard<std::mutex> lock(g_mutex);
    if (g_lines == nullptr) return false;
    g_lines->push_back({priority, tag != nullptr ? tag : "(null)", formatted(format, values), by_print});
    return true;
}

int vprint(int priority, const char* tag, const char* format, va_list values) {
    if (captured(priority, tag, false, format, values)) return 1;
    static VPrint* const real = function_named_as<VPrint>("__android_log_vprint");
    return real(priority, tag, format, values);
}

int print(int priority, const char* tag, const char* format, ...) {
    static VPrint* const real = function_named_as<VPrint>("__android_log_vprint");
    va_list values;
    va_start(values, format);
    const int result = captured(priority, tag, true, format, values) ? 1 : real(priority, tag, format, values);
    va_end(values);
    return result;
}

// How many objects have ever been loaded.
unsigned long long loaded_objects() {
    unsigned long long count = 0;
    dl_iterate_phdr(
        [](dl_phdr_info* info, size_t, void* result) {
            *static_cast<unsigned long long*>(result) = info->dlpi_adds;
            return 1;
        },
        &count);
    return count;
}

// The hooks stay, since threads may be in them at any time; looking for what to hook takes milliseconds.
void hook_what_is_loaded() {
    static std::mutex mutex;
    static unsigned long long seen = 0;
    static std::list<PlatformHook>& hooks = *new std::list<PlatformHook>;
    const std::lock_guard<std::mutex> lock(mutex);
    const unsigned long long now = loaded_objects();
    if (now == seen) return;
    const auto every = [](const std::string&) { return true; };
    hooks.emplace_back(every, "__android_log_vprint", reinterpret_cast<void*>(&vprint));
    hooks.emplace_back(every, "__android_log_print", reinterpret_cast<void*>(&print));
    seen = now;
}

// Atomically, because the library's threads may be reading it.
void set_global(uint32_t& global, uint32_t value) { __atomic_store_n(&global, value, __ATOMIC_RELAXED); }

std::string quoted(const std::string& text) {
    std::string result = "\"";
    for (const char character : text) {
        if (character == '\n') {
            result += "\\n";
        } else if (character == '"' || character == '\\') {
            (result += '\\') += character;
        } else {
            result += character;
        }
    }
    return result + '"';
}

}  // namespace

std::string LogLine::message() const {
    const size_t separator = text.find("::");
    return separator == std::string::npos ? text : text.substr(separator + 2);
}

LogCapture::LogCapture(unsigned max_level) : saved_level_(g_uiMxEnabledLogLevel), saved_mask_(g_uiEnabledModuleMask) {
    hook_what_is_loaded();
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

bool has_line(const std::vector<LogLine>& lines, const ExpectedLine& expected) {
    return std::find(lines.begin(), lines.end(), expected) != lines.end();
}

bool operator==(const LogLine& line, const ExpectedLine& expected) {
    return !line.by_print && line.priority == priority_of(expected.level) && line.tag == expected.tag &&
           line.message() == expected.message;
}

std::ostream& operator<<(std::ostream& out, const LogLine& line) {
    return out << "priority " << line.priority << ", tag " << line.tag << ", " << quoted(line.text);
}

std::ostream& operator<<(std::ostream& out, const ExpectedLine& line) {
    return out << "priority " << priority_of(line.level) << ", tag " << line.tag << ", " << quoted(line.message);
}

}  // namespace tavo::test

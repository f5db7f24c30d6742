// How the library's own sources log: TAVO_LOG(kTag, level, format, values...).
//
// A message that the filter drops costs a few loads and compares in line: no call, and the values are
// not evaluated. Values must therefore be free of side effects.
#pragma once

#include "tavo_osal/log.h"

namespace tavo {

// The filter for messages of module 0, which all of the library's own are. The globals are read with
// relaxed atomic loads (plain loads in machine code), since a preference may be set at any time.
inline bool log_enabled(uint32_t level) {
    if (level > __atomic_load_n(&g_uiMxEnabledLogLevel, __ATOMIC_RELAXED)) return false;
    if (level == TAVO_LOG_PERFORMANCE && __atomic_load_n(&g_uiPerformance, __ATOMIC_RELAXED) == 0) return false;
    return level <= TAVO_LOG_WARNING || __atomic_load_n(&g_uiEnabledModuleMask, __ATOMIC_RELAXED) == UINT32_MAX;
}

}  // namespace tavo

// A macro, because only a macro can take the caller's source line.
#define TAVO_LOG(tag, level, ...) TAVO_LOG_AT(__LINE__, tag, level, __VA_ARGS__)

// For helpers that log on behalf of their callers, who hand in their line as a defaulted __builtin_LINE().
#define TAVO_LOG_AT(line, tag, level, ...)                                           \
    do {                                                                             \
        if (__builtin_expect(tavo::log_enabled(level), (level) <= TAVO_LOG_WARNING)) \
            tavo_print_log((level), 0, (line), (tag), __VA_ARGS__);                  \
    } while (false)

namespace tavo {

// A function's entry and exit in the trace.
class ScopeTrace {
public:
    ScopeTrace(const char* tag, int line, const char* entered, const char* exiting = "--Exiting\n")
        : tag_(tag), line_(line), exiting_(exiting) {
        TAVO_LOG_AT(line_, tag_, TAVO_LOG_TRACE, "%s", entered);
    }
    // A thread may be cancelled, which unwinds its stack, while it writes the log.
    ~ScopeTrace() noexcept(false) { TAVO_LOG_AT(line_, tag_, TAVO_LOG_TRACE, "%s", exiting_); }
    ScopeTrace(const ScopeTrace&) = delete;
    ScopeTrace& operator=(const ScopeTrace&) = delete;

private:
    const char* const tag_;
    const int line_;
    const char* const exiting_;
};

}  // namespace tavo

// "++Entered" here and "--Exiting" wherever the function is left.
#define TAVO_TRACE_SCOPE(tag) TAVO_TRACE_SCOPE_AS(tag, "++Entered\n")
// For a function that says it entered, and maybe that it exits, in words of its own.
#define TAVO_TRACE_SCOPE_AS(tag, ...) const tavo::ScopeTrace scope_trace((tag), __LINE__, __VA_ARGS__)

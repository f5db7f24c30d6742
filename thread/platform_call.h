// The shape most operations have: call the platform, log a failure with its error number, answer with a code.
#pragma once

#include <cerrno>

#include "log/module_log.h"
#include "tavo_osal/status.h"

namespace tavo {

// Logs one line at the error level under the caller's source line. The format may leave out the error number.
[[gnu::cold, gnu::noinline]] inline void log_failure(const char* tag, const char* format, int error, int line) {
    TAVO_LOG_AT(line, tag, TAVO_LOG_ERROR, format, error);
}

// For a platform call that answers with an error number.
inline TAVO_Status checked(const char* tag, int error, const char* format, int line = __builtin_LINE()) {
    if (__builtin_expect(error == 0, 1)) return TAVO_SUCCESS;
    log_failure(tag, format, error, line);
    return TAVO_FAILURE;
}

// For a platform call that answers 0, or anything else and sets errno.
inline TAVO_Status checked_errno(const char* tag, int result, const char* format, int line = __builtin_LINE()) {
    if (__builtin_expect(result == 0, 1)) return TAVO_SUCCESS;
    log_failure(tag, format, errno, line);
    return TAVO_FAILURE;
}

// For arguments that are not passed on.
[[gnu::cold, gnu::noinline]] inline TAVO_Status refused(const char* tag, const char* message,
                                                        int line = __builtin_LINE()) {
    TAVO_LOG_AT(line, tag, TAVO_LOG_ERROR, "%s", message);
    return TAVO_INVALID_PARAM;
}

}  // namespace tavo

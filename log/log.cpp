#include "tavo_osal/log.h"

#include <android/log.h>
#include <sys/time.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "log/cancel_shield.h"
#include "log/module_log.h"

uint32_t g_uiMxEnabledLogLevel = TAVO_LOG_WARNING;
uint32_t g_uiOutputStreamId = TAVO_LOG_STREAM_CONSOLE;
uint32_t g_uiEnabledModuleMask = UINT32_MAX;
TAVO_CHAR g_acFilePath[32] = "/tmp/ZORLA_LOG.txt";
TAVO_LogCallback g_fpLogCallback = nullptr;
void* g_pvCallbackParam = nullptr;
uint32_t g_uiPerformance = 0;
uint32_t g_uiEnvValueRead = 0;
uint32_t guiMaxFileSize = 0x700000;
uint32_t g_uiFileSize = 0;
uint32_t g_uiFirstTime = 1;
uint32_t uiTotalTimeSecs = 0;
uint32_t uiTotalTimeMilliSecs = 0;
TAVO_TimeVal tv1 = {0, 0};
TAVO_TimeVal tv2 = {0, 0};

namespace {

constexpr char kTag[] = "TAVO_LOG";
constexpr uint32_t kModuleCount = 32;
constexpr uint32_t kHighestLevel = TAVO_LOG_TRACE;
constexpr size_t kLineBufferSize = 300;

constexpr int kPriorities[] = {
    ANDROID_LOG_VERBOSE, ANDROID_LOG_ERROR,   ANDROID_LOG_WARN,    ANDROID_LOG_INFO,
    ANDROID_LOG_DEBUG,   ANDROID_LOG_VERBOSE, ANDROID_LOG_VERBOSE,
};
static_assert(sizeof(kPriorities) / sizeof(kPriorities[0]) == kHighestLevel + 1);

// Each setting is one atomic exchange: messages may be printed on other threads meanwhile.
template <typename T>
void store(T& global, T value) {
    static_cast<void>(__atomic_exchange_n(&global, value, __ATOMIC_SEQ_CST));
}

template <typename T>
T load(const T& global) {
    return __atomic_load_n(&global, __ATOMIC_RELAXED);
}

bool passes(uint32_t level, uint32_t module) {
    const uint32_t mask = load(g_uiEnabledModuleMask);
    const uint32_t max = load(g_uiMxEnabledLogLevel);
    bool passed = level <= max;
    if (mask != UINT32_MAX && (module & mask) == 0) {
        // Modules outside the list keep their warnings and errors even below the maximum level, while
        // module 0 is held to both limits. Callers depend on the difference.
        const bool important = level <= TAVO_LOG_WARNING;
        passed = module != 0 ? important : important && passed;
    }
    return passed && (level != TAVO_LOG_PERFORMANCE || load(g_uiPerformance) != 0);
}

// The decimal number that text is; 0, and a logged error, when it is none.
long parse_number(const char* text) {
    char* end = nullptr;
    const long number = strtol(text, &end, 10);
    if (*end == '\0') return number;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid string is passed. string = %s.\n", text);
    return 0;
}

void apply_level(const char* text) {
    const long level = parse_number(text);
    if (level >= 0 && level <= static_cast<long>(kHighestLevel)) {
        store(g_uiMxEnabledLogLevel, static_cast<uint32_t>(level));
    }
}

// Adds the modules of one "-m" list. The first valid number of the whole preference clears the mask.
bool apply_modules(const char* list, bool& cleared) {
    char* copy = strdup(list);
    if (copy == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "pcTempString memory allocation failed.\n");
        return false;
    }
    char* rest = nullptr;
    for (char* item = strtok_r(copy, ",", &rest); item != nullptr; item = strtok_r(nullptr, ",", &rest)) {
        const long module = parse_number(item);
        if (module < 1 || module > static_cast<long>(kModuleCount)) continue;
        if (!cleared) store(g_uiEnabledModuleMask, 0U);
        cleared = true;
        __atomic_fetch_or(&g_uiEnabledModuleMask, 1U << (module - 1), __ATOMIC_SEQ_CST);
    }
    free(copy);
    return true;
}

void apply_file_name(const char* name) {
    TAVO_CHAR path[sizeof g_acFilePath] = {};
    if (snprintf(path, sizeof path, "%s%s%s", "/tmp/", name, ".txt") < 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "snprintf failed.\n");
        return;
    }
    // The whole path has no single exchange; byte by byte, two setters at once mix names but never race.
    for (size_t i = 0; i < sizeof path; ++i) store(g_acFilePath[i], path[i]);
}

// Splits the preference in place and applies it from left to right.
void apply_preference(char* preference, TAVO_LogCallback callback, void* param) {
    bool mask_cleared = false;
    char* rest = nullptr;
    for (char* token = strtok_r(preference, " ", &rest); token != nullptr; token = strtok_r(nullptr, " ", &rest)) {
        const size_t length = strlen(token);
        if (token[0] != '-') {
            apply_file_name(token);
        } else if (strcmp(token, "-s") == 0) {
            store<uint32_t>(g_uiOutputStreamId, TAVO_LOG_STREAM_CONSOLE);
        } else if (strcmp(token, "-f") == 0) {
            store<uint32_t>(g_uiOutputStreamId, TAVO_LOG_STREAM_FILE);
        } else if (strcmp(token, "-c") == 0) {
            store<uint32_t>(g_uiOutputStreamId, TAVO_LOG_STREAM_CALLBACK);
            store(g_fpLogCallback, callback);
            store(g_pvCallbackParam, param);
        } else if (strcmp(token, "-a") == 0) {
            store(g_uiEnabledModuleMask, UINT32_MAX);
        } else if (strcmp(token, "-t") == 0) {
            store(g_uiPerformance, 1U);
        } else if (token[1] == 'l' && length == 3) {
            apply_level(token + 2);
        } else if (token[1] == 'm' && length > 2) {
            if (!apply_modules(token + 2, mask_cleared)) return;
        }
    }
}

}  // namespace

void tavo_print_log(uint32_t uiLevel, uint32_t uiModule, int iLine, const TAVO_CHAR* pcTag, const TAVO_CHAR* pcFormat,
                    ...) {
    if (!passes(uiLevel, uiModule)) return;
    // A thread that vanished from within the log would leave the log's own locks behind, or end the process.
    const tavo::CancelShield shield;
    // Several messages print the errno of a call made before another line was logged.
    const int saved_errno = errno;

    char line[kLineBufferSize] = {};
    if (uiLevel == TAVO_LOG_PERFORMANCE) {
        timeval now = {};
        gettimeofday(&now, nullptr);
        const auto micros =
            static_cast<unsigned long long>(now.tv_sec) * 1000000ULL + static_cast<unsigned long long>(now.tv_usec);
        snprintf(line, sizeof line, "%llu ::%d::%s", micros, iLine, pcFormat);
    } else {
        snprintf(line, sizeof line, "%d::%s", iLine, pcFormat);
    }

    va_list values;
    va_start(values, pcFormat);
    // Called by name through the dynamic linker, so that a program can put its own sink in front.
    const int priority = uiLevel <= kHighestLevel ? kPriorities[uiLevel] : ANDROID_LOG_UNKNOWN;
    errno = saved_errno;  // "%m" in a caller's format
    __android_log_vprint(priority, pcTag, line, values);
    va_end(values);
    errno = saved_errno;
}

void tavo_set_log_preference(const TAVO_CHAR* pcLogPreference, TAVO_LogCallback fpCallback, void* pvParam) {
    // As in the writer; the allocator has a lock, too.
    const tavo::CancelShield shield;
    // Of several threads that find LOG_PREF at once, the one that sets the latch takes its value: it is split in
    // place, which two threads must not do to one string.
    char* preference = nullptr;
    bool consumed = __atomic_load_n(&g_uiEnvValueRead, __ATOMIC_SEQ_CST) == 1;
    if (!consumed) {
        preference = getenv("LOG_PREF");
        if (preference != nullptr) consumed = __atomic_exchange_n(&g_uiEnvValueRead, 1U, __ATOMIC_SEQ_CST) == 1;
    }
    if (consumed) {
        printf("g_uiEnvValueRead var read and use already set pref");
        return;
    }

    char* copy = nullptr;
    if (preference != nullptr) {
        printf("Environment variable LOG_PREF is %s\n", preference);
    } else {
        printf("No preferences received from env LOG_PREF ");
        if (pcLogPreference == nullptr) {
            printf("Invalid log prefrence passed");
            return;
        }
        store<uint32_t>(g_uiOutputStreamId, TAVO_LOG_STREAM_CONSOLE);
        // The C library's allocator directly: logging depends on no other family.
        copy = strdup(pcLogPreference);
        if (copy == nullptr) {
            TAVO_LOG(kTag, TAVO_LOG_ERROR, " pcLogPreference memory allocation failed.\n");
            return;
        }
        preference = copy;
    }
    printf("Log preference is set to %s\n", preference);
    apply_preference(preference, fpCallback, pvParam);
    free(copy);
}

/**
 * @file
 * Logging: one call that filters, prefixes and writes a message to the Android log, and the
 * preference that steers the filter.
 *
 * All state lives in the exported globals below. Nothing needs initialising before the first
 * message. A program may read or set the globals directly; the writer reads them with plain
 * 32-bit loads and takes no lock.
 */
#ifndef TAVO_OSAL_LOG_H
#define TAVO_OSAL_LOG_H

#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** Message levels, and the Android log priority each is written with. Levels from 7 up are written
 *  with ANDROID_LOG_UNKNOWN. */
enum {
    TAVO_LOG_PERFORMANCE = 0, /**< time-stamped trace, only while ::g_uiPerformance is set; ANDROID_LOG_VERBOSE */
    TAVO_LOG_ERROR = 1,       /**< errors and failed calls; ANDROID_LOG_ERROR */
    TAVO_LOG_WARNING = 2,     /**< warnings; ANDROID_LOG_WARN */
    TAVO_LOG_INFO = 3,        /**< successes and state changes; ANDROID_LOG_INFO */
    TAVO_LOG_DEBUG = 4,       /**< ANDROID_LOG_DEBUG */
    TAVO_LOG_VERBOSE = 5,     /**< ANDROID_LOG_VERBOSE */
    TAVO_LOG_TRACE = 6        /**< function entry and exit; ANDROID_LOG_VERBOSE */
};

/** Output streams a preference can select. The selection is recorded only: every message goes to
 *  the Android log. */
enum {
    TAVO_LOG_STREAM_CONSOLE = 1, /**< "-s" */
    TAVO_LOG_STREAM_FILE = 2,    /**< "-f" */
    TAVO_LOG_STREAM_CALLBACK = 3 /**< "-c" */
};

/** A user's log callback. Recorded by the preference "-c"; this version never calls it. */
typedef void (*TAVO_LogCallback)(void* pvParam);

/** Highest level that is written; initially 2. */
extern TAVO_API uint32_t g_uiMxEnabledLogLevel;
/** Selected output stream; initially #TAVO_LOG_STREAM_CONSOLE. */
extern TAVO_API uint32_t g_uiOutputStreamId;
/** Enabled modules, bit n-1 for module number n; initially all ones, which means every module. */
extern TAVO_API uint32_t g_uiEnabledModuleMask;
/** Log file path, cut to 31 characters; initially "/tmp/ZORLA_LOG.txt". */
extern TAVO_API TAVO_CHAR g_acFilePath[32];
/** User log callback; initially null. */
extern TAVO_API TAVO_LogCallback g_fpLogCallback;
/** Argument for the callback; initially null. */
extern TAVO_API void* g_pvCallbackParam;
/** Non-zero enables level-0 messages; initially 0. */
extern TAVO_API uint32_t g_uiPerformance;
/** 1 once the environment variable LOG_PREF has been consumed; initially 0. */
extern TAVO_API uint32_t g_uiEnvValueRead;

/** @name Storage that programs use among themselves
 *  Exported with these initial values; the library neither reads nor writes them.
 *  @{ */
extern TAVO_API uint32_t guiMaxFileSize;       /**< 0x700000 (7 MiB) */
extern TAVO_API uint32_t g_uiFileSize;         /**< 0 */
extern TAVO_API uint32_t g_uiFirstTime;        /**< 1 */
extern TAVO_API uint32_t uiTotalTimeSecs;      /**< 0 */
extern TAVO_API uint32_t uiTotalTimeMilliSecs; /**< 0 */
extern TAVO_API TAVO_TimeVal tv1;              /**< 0, 0 */
extern TAVO_API TAVO_TimeVal tv2;              /**< 0, 0 */
/** @} */

/**
 * Writes one message to the Android log.
 *
 * The message passes when its level is at most ::g_uiMxEnabledLogLevel and its modules are enabled;
 * a level-0 message also needs ::g_uiPerformance. Once a module list is set, messages of levels 0 to 2
 * from modules outside the list pass whatever the maximum level is, and messages of module 0 pass only
 * up to level 2.
 *
 * The text is the line, "::", and the formatted message; level 0 puts microseconds since the epoch and
 * " ::" in front. Prefix and format together are cut to 299 characters before the values are expanded,
 * so a format of more than about 290 characters loses its end.
 *
 * Preserves errno. May be called from any thread at any time, and takes no lock of its own.
 *
 * @param uiLevel  one of the levels above
 * @param uiModule bit set of module numbers tested against ::g_uiEnabledModuleMask; 0 for none
 * @param iLine    the caller's source line
 * @param pcTag    module tag, used as the Android log tag
 * @param pcFormat printf format of the values that follow
 */
TAVO_API void tavo_print_log(uint32_t uiLevel, uint32_t uiModule, int iLine, const TAVO_CHAR* pcTag,
                             const TAVO_CHAR* pcFormat, ...) TAVO_PRINTF(5, 6);

/**
 * Sets the logging globals from a preference string, or from the environment variable LOG_PREF.
 *
 * LOG_PREF wins over the argument and is consumed once: the first call that finds it applies it and
 * every later call changes nothing. Its value is split in place, so getenv() finds the first token afterwards.
 * Progress is printed on standard output.
 *
 * The string is split at blanks and applied from left to right:
 *
 * | token      | effect                                                                                   |
 * |------------|------------------------------------------------------------------------------------------|
 * | -s, -f, -c | stream 1, 2 or 3; -c also records the callback and its parameter                         |
 * | -a         | enables every module                                                                     |
 * | -t         | enables level-0 messages                                                                 |
 * | -lN        | one digit: maximum level 0 to 6, 7 to 9 are ignored; no digit: 0, and an error is logged |
 * | -mN,N,...  | enables only the modules listed; several such tokens of one call add up                  |
 * | other -... | ignored, longer level tokens such as -l12 among them                                     |
 * | NAME       | log file path "/tmp/NAME.txt", cut to 31 characters                                      |
 *
 * In a module list, numbers outside 1 to 32 are ignored, and what is no number is logged as an error and skipped. A
 * list without a valid number changes nothing.
 *
 * When an allocation fails, that is logged and the rest of the string is dropped; what was applied
 * before stays. Takes no lock; each global is set atomically.
 *
 * @param pcLogPreference the string; not kept, not changed. Null is refused unless LOG_PREF is set
 * @param fpCallback      recorded only when the string holds "-c"
 * @param pvParam         recorded only when the string holds "-c"
 */
TAVO_API void tavo_set_log_preference(const TAVO_CHAR* pcLogPreference, TAVO_LogCallback fpCallback, void* pvParam);

TAVO_END_DECLS

#endif

// Finding the service.
#pragma once

#include <utils/RefBase.h>

#include <cstdint>

#include "ipc/ITavoBinder.h"
#include "tavo_osal/export.h"
#include "tavo_osal/log.h"
#include "tavo_osal/status.h"

/**
 * The service, wherever it is published; null when it is not reachable. The name is not used: there is only
 * the one. C++ linkage, for the strong reference.
 */
TAVO_API android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR* name);

namespace tavo {

// What the families that look the service up say differently. Users' log filters rely on it.
struct LookupLog {
    const char* tag;
    uint32_t trace_level;  // of entering and exiting
    bool tells_progress;
};

inline constexpr LookupLog kQueueLookup = {"MSGQUEUE_BINDER", TAVO_LOG_INFO, true};
inline constexpr LookupLog kSharedMemoryLookup = {"TAVO_OSAL_SHARED_MEM", TAVO_LOG_ERROR, false};

// tavo_osal_get_service, in a family's own words.
android::sp<android::ITavoBinder> find_service(const LookupLog& log);

}  // namespace tavo

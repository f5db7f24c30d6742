// Finding the service.
#pragma once

#include <utils/RefBase.h>

#include "ipc/ITavoBinder.h"
#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

/**
 * The service, wherever it is published; null when it is not reachable. The name is not used: there is only
 * the one. C++ linkage, for the strong reference.
 */
TAVO_API android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR* name);

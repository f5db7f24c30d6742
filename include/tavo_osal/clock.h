/**
 * @file
 * Clocks: the time of day and the monotonic clock. Every function may be called from any thread. Messages carry the
 * tag "OSAL_TIMER" and level 1 unless said otherwise.
 */
#ifndef TAVO_OSAL_CLOCK_H
#define TAVO_OSAL_CLOCK_H

#include <stdint.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * Reads the time of day as seconds and microseconds since the epoch, and logs both at level 4. The seconds have 32
 * bits on every platform; within a day of their overflow a warning is logged at level 2, and past it they are negative.
 * @param pTime receives the time; must not be null, which is not checked
 * @retval TAVO_SUCCESS read, whether or not the warning was logged
 * @retval TAVO_FAILURE the platform's clock could not be read; pTime is untouched
 */
TAVO_API TAVO_Status tavo_osal_get_current_time(TAVO_TimeVal* pTime);

/**
 * Reads the time of day in microseconds since the epoch.
 * @param plMicroSeconds receives the time
 * @retval TAVO_SUCCESS       read
 * @retval TAVO_INVALID_PARAM plMicroSeconds is null
 * @retval TAVO_FAILURE       the platform's clock could not be read; plMicroSeconds is untouched
 */
TAVO_API TAVO_Status tavo_osal_get_current_time_us(TAVO_INT64* plMicroSeconds);

/**
 * Reads the monotonic clock in nanoseconds. Only differences mean something, and setting the time of day does not
 * change them.
 * @param plNanoSeconds receives the reading
 * @retval TAVO_SUCCESS       read
 * @retval TAVO_INVALID_PARAM plNanoSeconds is null
 * @retval TAVO_FAILURE       the platform's clock could not be read; plNanoSeconds is untouched
 */
TAVO_API TAVO_Status tavo_osal_get_current_time_ns(TAVO_INT64* plNanoSeconds);

TAVO_END_DECLS

#endif

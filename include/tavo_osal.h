/**
 * @file
 * The whole C API. Include this, or the header of the family you need.
 */
#ifndef TAVO_OSAL_H
#define TAVO_OSAL_H

#include "tavo_osal/clock.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/event.h"
#include "tavo_osal/list.h"
#include "tavo_osal/log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/semaphore.h"
#include "tavo_osal/status.h"
#include "tavo_osal/thread.h"
#include "tavo_osal/timer.h"

#endif

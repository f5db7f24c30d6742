/**
 * @file
 * The whole C API. Include this, or the header of the family you need.
 *
 * Where a header says "/sdcard", it is the shared storage of a device, and on Linux the directory that the library was
 * built for (TAVO_STORAGE_ROOT). It must exist.
 */
#ifndef TAVO_OSAL_H
#define TAVO_OSAL_H

#include "tavo_osal/clock.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/dl.h"
#include "tavo_osal/event.h"
#include "tavo_osal/file.h"
#include "tavo_osal/init.h"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/list.h"
#include "tavo_osal/log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/network.h"
#include "tavo_osal/process.h"
#include "tavo_osal/semaphore.h"
#include "tavo_osal/shared_memory.h"
#include "tavo_osal/socket.h"
#include "tavo_osal/status.h"
#include "tavo_osal/string.h"
#include "tavo_osal/thread.h"
#include "tavo_osal/timer.h"

#endif

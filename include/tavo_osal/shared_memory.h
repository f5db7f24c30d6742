/**
 * @file
 * Memory blocks that processes share, by key.
 *
 * A block lives in the service (tavo_osal_init()), which makes it, zeroed, for the first process that acquires its
 * key, and forgets the key when it was deleted as often as it was acquired. A process that has acquired a block uses
 * it directly, without the service, until it releases it: neither a delete, nor another process's release, nor the
 * end of the service takes mapped memory away. A key that is acquired again after its last delete is a new block,
 * unrelated to mappings of the old one. The memory is given back when the service has forgotten the key and the last
 * process has released the block, or has ended.
 *
 * The typical use: the processes agree on a key, or one makes one and tells the others. Each calls tavo_shm_init()
 * and tavo_shm_acquire(), and when it is done tavo_shm_release() and tavo_shm_delete().
 *
 * A process can have #TAVO_SHM_MAX_ACQUIRED acquisitions at a time. Every function may be called from any thread; what
 * is in a block is for its users to guard. Calls to the service block until it answers. The memory's size is
 * fixed when the block is made, to whole pages, and no process can change it afterwards.
 */
#ifndef TAVO_OSAL_SHARED_MEMORY_H
#define TAVO_OSAL_SHARED_MEMORY_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** Acquisitions that a process can have at a time. */
#define TAVO_SHM_MAX_ACQUIRED 25

/** What a block is asked for with. */
typedef struct TavoShmHandle {
    uint32_t uiKey;  /**< the key. 0 is none. Blocks whose key is above INT32_MAX, which the service takes as negative,
                          cannot be deleted */
    uint32_t uiSize; /**< bytes, at most INT32_MAX */
} TavoShmHandle;

/**
 * Makes a key out of a number that is kept, and counted up, in the file "/sdcard/shm_key_index_file.txt". The service
 * sets the number back to 1 when it starts.
 *
 * Keys repeat after 256 calls, and differ between file systems: they are ftok()'s, of the number and the file
 * "/sdcard/shm_key_gen_file.txt", which the user provides; its contents do not matter. The number is not
 * locked: processes that make keys at the same moment can get the same key.
 *
 * @param puiKey receives the key: 0xFFFFFFFF when the number could not be read and written back, or the other file
 *               does not exist. Its value on entry is only logged
 * @return #TAVO_SUCCESS; #TAVO_INVALID_PARAM: puiKey is null, and the number was not counted up
 */
TAVO_API TAVO_Status tavo_osal_shared_memory_key_create(uint32_t* puiKey);

/**
 * Makes a handle. The service is not asked.
 *
 * @param uiKey    the block's key
 * @param ppHandle receives the handle, which tavo_shm_delete() frees; null when there is no memory. One that could not
 *                 be acquired is freed with tavo_osal_mem_free(): deleting would take back somebody else's use
 * @param uiSize   bytes, not 0. Only counts when the block is made: a block that exists is acquired as it is
 * @return #TAVO_SUCCESS; #TAVO_INVALID_PARAM: ppHandle is null or uiSize is 0; #TAVO_NO_MEMORY
 */
TAVO_API TAVO_Status tavo_shm_init(uint32_t uiKey, TavoShmHandle** ppHandle, uint32_t uiSize);

/**
 * Maps the handle's block into this process and counts one use of it in the service, which makes it if
 * necessary. A process that acquires a block several times gets the same address each time, and has to release
 * it as often.
 *
 * @param pHandle  handle from tavo_shm_init()
 * @param ppvAddr  receives the address of the block, which starts on a page; untouched on failure
 * @return #TAVO_SUCCESS; #TAVO_INVALID_PARAM: a pointer is null; #TAVO_NO_MEMORY: this process has
 *         #TAVO_SHM_MAX_ACQUIRED acquisitions already; #TAVO_FAILURE: the service is not reachable, or has no
 *         block for the key and size, or the block could not be mapped. A failure leaves everything as it was
 */
TAVO_API TAVO_Status tavo_shm_acquire(TavoShmHandle* pHandle, void** ppvAddr);

/**
 * Gives up one acquisition of a block in this process; the last one unmaps it. The service still has the block.
 *
 * @param pvAddr address from tavo_shm_acquire()
 * @return #TAVO_SUCCESS, also for an address that was not acquired; #TAVO_INVALID_PARAM: pvAddr is null
 */
TAVO_API TAVO_Status tavo_shm_release(void* pvAddr);

/** tavo_shm_release(). @param uiSize ignored @param pvAddr as there @return as there */
TAVO_API TAVO_Status tavo_shm_release_by_size(uint32_t uiSize, void* pvAddr);

/**
 * Takes back one use of the handle's block in the service, and frees the handle. Mappings stay valid until they
 * are released, here and in other processes.
 *
 * @param pHandle handle from tavo_shm_init()
 * @return #TAVO_SUCCESS, also when the service has no such block; #TAVO_INVALID_PARAM: pHandle is null; #TAVO_FAILURE:
 *         the service is not reachable, in which case the handle stays valid, or it does not delete blocks of this
 *         key, see TavoShmHandle::uiKey; -1: the service was not initialised
 */
TAVO_API TAVO_Status tavo_shm_delete(TavoShmHandle* pHandle);

TAVO_END_DECLS

#endif

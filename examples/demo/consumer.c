/* Waits for the semaphore, looks at the shared block, and hands the result back through a queue. */
#include <stdio.h>
#include <string.h>

#include "block.h"
#include "messages.h"
#include "tavo_osal.h"

int main(void) {
    char result_key[] = DEMO_RESULT_KEY;
    TavoShmHandle* handle = NULL;
    void* block = NULL;
    TAVO_INT64 semaphore = 0;
    TAVO_INT64 results = 0;
    tavo_set_log_preference("DEMO -s -a -l3", NULL, NULL);
    if (tavo_shm_init(DEMO_BLOCK_KEY, &handle, DEMO_BLOCK_SIZE) != TAVO_SUCCESS ||
        tavo_shm_acquire(handle, &block) != TAVO_SUCCESS ||
        tavo_semaphore_init(DEMO_SEMAPHORE_KEY, &semaphore) != TAVO_SUCCESS ||
        tavo_msg_queue_sender_init(result_key, &results) != TAVO_SUCCESS ||
        tavo_semaphore_acquire(semaphore) != TAVO_SUCCESS) {
        return 1;
    }
    char result[DEMO_RESULT_SIZE];
    snprintf(result, sizeof result, "%u bytes, checksum %016llx", DEMO_BLOCK_SIZE,
             (unsigned long long)demo_checksum(0, block, DEMO_BLOCK_SIZE));
    printf("\nsaw %s\n", result);
    if (tavo_semaphore_release(semaphore) != TAVO_SUCCESS) return 1;
    if (tavo_msg_queue_put(results, (unsigned char*)result, (unsigned)strlen(result)) != TAVO_SUCCESS) return 1;
    tavo_msg_queue_destroy(results);
    tavo_semaphore_delete(semaphore);
    tavo_shm_release(block);
    return tavo_shm_delete(handle) == TAVO_SUCCESS ? 0 : 1;
}

/* Fills a shared block while it holds the semaphore, and hears from the consumer what arrived. */
#include <stdio.h>
#include <string.h>

#include "block.h"
#include "messages.h"
#include "tavo_osal.h"

int main(void) {
    static unsigned char result[TAVO_MSG_QUEUE_MAX_SIZE];
    char result_key[] = DEMO_RESULT_KEY;
    TavoShmHandle* handle = NULL;
    void* block = NULL;
    TAVO_INT64 semaphore = 0;
    TAVO_INT64 results = 0;
    tavo_set_log_preference("DEMO -s -a -l3", NULL, NULL);
    if (tavo_shm_init(DEMO_BLOCK_KEY, &handle, DEMO_BLOCK_SIZE) != TAVO_SUCCESS ||
        tavo_shm_acquire(handle, &block) != TAVO_SUCCESS ||
        tavo_semaphore_init(DEMO_SEMAPHORE_KEY, &semaphore) != TAVO_SUCCESS ||
        tavo_semaphore_acquire(semaphore) != TAVO_SUCCESS ||
        tavo_msg_queue_sender_init(result_key, &results) != TAVO_SUCCESS) {
        return 1;
    }
    printf("\nholds the semaphore\n");
    fflush(stdout);
    demo_fill(block, 1, DEMO_BLOCK_SIZE);
    if (tavo_semaphore_release(semaphore) != TAVO_SUCCESS) return 1;

    char expected[DEMO_RESULT_SIZE];
    snprintf(expected, sizeof expected, "%u bytes, checksum %016llx", DEMO_BLOCK_SIZE,
             (unsigned long long)demo_checksum(0, block, DEMO_BLOCK_SIZE));
    unsigned int size = sizeof result;
    if (tavo_msg_queue_get(results, result, &size) != TAVO_SUCCESS) return 1;
    if (size != strlen(expected) || memcmp(result, expected, size) != 0) {
        printf("wrote %s, but the consumer saw %.*s\n", expected, (int)size, (char*)result);
        return 1;
    }
    printf("wrote %s: the consumer saw the same\n", expected);
    tavo_msg_queue_destroy(results);
    tavo_semaphore_delete(semaphore);
    tavo_shm_release(block);
    return tavo_shm_delete(handle) == TAVO_SUCCESS ? 0 : 1;
}

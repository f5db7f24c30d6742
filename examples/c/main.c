/* A queue and a block of memory by key, in plain C: what one process puts, any other could get. */
#include <stdio.h>
#include <string.h>
#include <tavo_osal.h>

enum { QUEUE_KEY = 7, BLOCK_KEY = 9, BLOCK_SIZE = 4096 };

static unsigned char message[TAVO_MSG_QUEUE_MAX_SIZE];

static int exchange_a_message(void) {
    TAVO_INT64 queue = 0;
    unsigned int size = sizeof message;
    unsigned char text[] = "hello";
    if (tavo_msg_queue_init(QUEUE_KEY, &queue) != TAVO_SUCCESS) return -1;
    if (tavo_msg_queue_put(queue, text, sizeof text - 1) != TAVO_SUCCESS) return -1;
    if (tavo_msg_queue_get(queue, message, &size) != TAVO_SUCCESS) return -1;
    printf("got %.*s\n", (int)size, (const char*)message);
    return tavo_msg_queue_close(queue) == TAVO_SUCCESS ? 0 : -1;
}

static int share_a_block(void) {
    TavoShmHandle* block = NULL;
    void* address = NULL;
    if (tavo_shm_init(BLOCK_KEY, &block, BLOCK_SIZE) != TAVO_SUCCESS) return -1;
    if (tavo_shm_acquire(block, &address) != TAVO_SUCCESS) return -1;
    strcpy(address, "shared");
    printf("the block holds %s\n", (const char*)address);
    tavo_shm_release(address);
    return tavo_shm_delete(block) == TAVO_SUCCESS ? 0 : -1;
}

int main(void) {
    /* One process is the server; the others begin with tavo_msg_queue_init() and tavo_shm_init(). */
    if (tavo_osal_init(4, 4) != TAVO_SUCCESS) return 1;
    puts("");
    return exchange_a_message() == 0 && share_a_block() == 0 ? 0 : 1;
}

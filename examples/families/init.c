/* The server: publishes the service that owns queues and blocks, and goes on with its own work. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    TAVO_INT64 queue = 0;
    printf("before: %d\n", (int)tavo_msg_queue_init(7, &queue)); /* no service: a plain 1 */
    if (tavo_osal_init(16, 16) != TAVO_SUCCESS) return 1;
    printf("\nafter: %d\n", (int)tavo_msg_queue_init(7, &queue));
    tavo_msg_queue_close(queue);
    /* A server stays: pause(), or its own main loop, goes here. */
    return 0;
}

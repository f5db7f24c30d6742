#include <tavo_osal.h>

int main(void) {
    TAVO_INT64 queue;
    unsigned char message[TAVO_MSG_QUEUE_MAX_SIZE] = "hello";
    unsigned int size = sizeof message;
    if (tavo_osal_init(16, 16) != TAVO_SUCCESS) return 1;                  /* one process is the server ... */
    if (tavo_msg_queue_sender_init("7", &queue) != TAVO_SUCCESS) return 1; /* ... any process attaches to key 7 */
    tavo_msg_queue_put(queue, message, 6);                                 /* one puts ... */
    tavo_msg_queue_get(queue, message, &size);                             /* ... another gets: size is 6 */
    return tavo_msg_queue_destroy(queue) == TAVO_SUCCESS ? 0 : 1;
}

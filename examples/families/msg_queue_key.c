/* The same queues by integer key: here the size comes before the message. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    static unsigned char message[TAVO_MSG_QUEUE_MAX_SIZE];
    unsigned char hello[] = "hello";
    unsigned int size = sizeof message;
    int32_t key = 0;
    int32_t again = 0;
    TAVO_INT64 queue = 0;
    if (tavo_osal_init(16, 16) != TAVO_SUCCESS) return 1;
    if (tavo_msg_queue_key_create(&key, 'c') != TAVO_SUCCESS) return 1;
    if (tavo_msg_queue_key_create(&again, 'c') != TAVO_SUCCESS) return 1;
    printf("\nthe key is the same everywhere: %s\n", key == again ? "yes" : "no");
    if (tavo_msg_queue_init(key, &queue) != TAVO_SUCCESS) return 1;
    tavo_msg_queue_sendmessage(queue, sizeof hello - 1, hello);
    if (tavo_msg_queue_receivemessage(queue, &size, message) != TAVO_SUCCESS) return 1;
    printf("got %.*s\n", (int)size, (char*)message);
    return tavo_msg_queue_close(queue) == TAVO_SUCCESS ? 0 : 1;
}

/* Two attachments to one queue: any process could have either. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    static unsigned char message[TAVO_MSG_QUEUE_MAX_SIZE]; /* room for the longest message, always */
    unsigned char hello[] = "hello";
    char key[] = "7";
    unsigned int size = sizeof message;
    TAVO_INT64 sender = 0;
    TAVO_INT64 receiver = 0;
    if (tavo_osal_init(16, 16) != TAVO_SUCCESS) return 1;
    if (tavo_msg_queue_sender_init(key, &sender) != TAVO_SUCCESS) return 1;
    if (tavo_msg_queue_sender_init(key, &receiver) != TAVO_SUCCESS) return 1;
    tavo_msg_queue_put(sender, hello, sizeof hello - 1);
    tavo_msg_queue_put(sender, hello, 0); /* an empty message is one, too */
    for (int i = 0; i < 2; ++i) {
        if (tavo_msg_queue_get(receiver, message, &size) != TAVO_SUCCESS) return 1;
        printf("\ngot %u bytes: %.*s\n", size, (int)size, (char*)message);
    }
    printf("too long: %#x\n", (unsigned int)tavo_msg_queue_put(sender, message, sizeof message + 1));
    tavo_msg_queue_destroy(sender);
    return tavo_msg_queue_destroy(receiver) == TAVO_SUCCESS ? 0 : 1;
}

/* Attaches to the queue and sends all messages, the last one saying how many they were and what they sum up to. */
#include <stdio.h>

#include "messages.h"
#include "tavo_osal.h"

int main(void) {
    static unsigned char message[DEMO_MAX_SIZE];
    char key[] = DEMO_KEY;
    TAVO_INT64 queue = 0;
    tavo_set_log_preference("DEMO -s -a -l3", NULL, NULL);
    if (tavo_msg_queue_sender_init(key, &queue) != TAVO_SUCCESS) return 1;
    printf("\nattached\n");
    fflush(stdout);

    uint64_t sum = 0;
    uint64_t bytes = 0;
    for (uint32_t number = 0; number < DEMO_MESSAGES; ++number) {
        const uint32_t size = demo_size(number);
        demo_fill(message, number, size);
        sum = demo_checksum(sum, message, size);
        bytes += size;
        if (tavo_msg_queue_put(queue, message, size) != TAVO_SUCCESS) return 1;
    }
    const int length = snprintf((char*)message, sizeof message, "%u messages, checksum %016llx", DEMO_MESSAGES,
                                (unsigned long long)sum);
    if (tavo_msg_queue_put(queue, message, (unsigned)length) != TAVO_SUCCESS) return 1;
    printf("sent %u messages of 0 to %u bytes, %.1f MB in all\n", DEMO_MESSAGES, DEMO_MAX_SIZE, (double)bytes / 1e6);
    return tavo_msg_queue_destroy(queue) == TAVO_SUCCESS ? 0 : 1;
}

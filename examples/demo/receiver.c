/* Attaches to the same queue and checks every message: its place in the order, its size, its bytes. */
#include <stdio.h>
#include <string.h>
#include <time.h>

#include "messages.h"
#include "tavo_osal.h"

static double now(void) {
    struct timespec time;
    clock_gettime(CLOCK_MONOTONIC, &time);
    return (double)time.tv_sec + (double)time.tv_nsec / 1e9;
}

int main(void) {
    static unsigned char message[TAVO_MSG_QUEUE_MAX_SIZE];
    static unsigned char expected[DEMO_MAX_SIZE];
    char key[] = DEMO_KEY;
    TAVO_INT64 queue = 0;
    tavo_set_log_preference("DEMO -s -a -l3", NULL, NULL);
    if (tavo_msg_queue_sender_init(key, &queue) != TAVO_SUCCESS) return 1;
    printf("\nattached\n");
    fflush(stdout);

    uint64_t sum = 0;
    uint64_t bytes = 0;
    double start = 0;
    for (uint32_t number = 0; number < DEMO_MESSAGES; ++number) {
        unsigned int size = sizeof message;
        if (tavo_msg_queue_get(queue, message, &size) != TAVO_SUCCESS) return 1;
        if (number == 0) start = now();
        demo_fill(expected, number, demo_size(number));
        if (size != demo_size(number) || memcmp(message, expected, size) != 0) {
            printf("message %u arrived wrong: %u bytes\n", number, size);
            return 1;
        }
        sum = demo_checksum(sum, message, size);
        bytes += size;
    }
    const double seconds = now() - start;

    unsigned int size = sizeof message;
    if (tavo_msg_queue_get(queue, message, &size) != TAVO_SUCCESS) return 1;
    char summary[64];
    snprintf(summary, sizeof summary, "%u messages, checksum %016llx", DEMO_MESSAGES, (unsigned long long)sum);
    if (size != strlen(summary) || memcmp(message, summary, size) != 0) {
        printf("the sender speaks of %.*s, but here are %s\n", (int)size, (char*)message, summary);
        return 1;
    }
    printf("got %s: every one intact and in order\n", summary);
    printf("%.0f messages and %.1f MB a second\n", DEMO_MESSAGES / seconds, (double)bytes / 1e6 / seconds);
    return tavo_msg_queue_destroy(queue) == TAVO_SUCCESS ? 0 : 1;
}

/* Serves a queue and a semaphore, starts itself again as a client of both, and prints what that says. */
#include <stdio.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tavo_osal.h"

static int serve(const char* program) {
    static unsigned char message[TAVO_MSG_QUEUE_MAX_SIZE];
    unsigned int size = sizeof message;
    TAVO_INT64 queue;
    int status = -1;
    if (tavo_osal_init(4, 4) != TAVO_SUCCESS) return 2;
    if (tavo_msg_queue_init(7, &queue) != TAVO_SUCCESS) return 4;
    const pid_t client = fork();
    if (client == 0) {
        execl(program, program, "say", (char*)NULL);
        _exit(127);
    }
    if (client < 0 || waitpid(client, &status, 0) != client || status != 0) return 3;
    if (tavo_msg_queue_get(queue, message, &size) != TAVO_SUCCESS) return 5;
    printf("\nthe other process said %.*s\n", (int)size, (char*)message);
    return tavo_msg_queue_close(queue) == TAVO_SUCCESS ? 0 : 10;
}

static int say(void) {
    static unsigned char hello[] = "hello";
    TAVO_INT64 queue;
    TAVO_INT64 semaphore;
    if (tavo_semaphore_init(4660, &semaphore) != TAVO_SUCCESS) return 6;
    if (tavo_semaphore_acquire(semaphore) != TAVO_SUCCESS) return 7;
    if (tavo_msg_queue_init(7, &queue) != TAVO_SUCCESS) return 8;
    if (tavo_msg_queue_put(queue, hello, sizeof hello - 1) != TAVO_SUCCESS) return 9;
    if (tavo_semaphore_delete(semaphore) != TAVO_SUCCESS) return 11;
    return tavo_msg_queue_close(queue) == TAVO_SUCCESS ? 0 : 12;
}

int main(int argc, char** argv) { return argc == 2 && strcmp(argv[1], "say") == 0 ? say() : serve(argv[0]); }

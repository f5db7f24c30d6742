/* A thread that works and is joined, and one that waits and is cancelled. */
#include <stdio.h>
#include <tavo_osal.h>

static void* work(void* argument) {
    *(int*)argument = 42;
    return NULL;
}

static void* wait_for_ever(void* argument) {
    (void)argument;
    while (tavo_osal_thread_sleep(1000) == TAVO_SUCCESS) {
    }
    return NULL;
}

int main(void) {
    pthread_t worker;
    pthread_t waiter;
    int result = 0;
    if (tavo_osal_thread_create(&worker, work, &result) != TAVO_SUCCESS) return 1;
    if (tavo_osal_thread_create(&waiter, wait_for_ever, NULL) != TAVO_SUCCESS) return 1;
    tavo_osal_thread_join(worker);
    printf("the worker's result is %d\n", result);
    tavo_osal_thread_cancel(waiter);
    printf("joined: %d\n", (int)tavo_osal_thread_join(waiter));
    printf("joined again: %#x\n", (unsigned int)tavo_osal_thread_join(waiter));
    return 0;
}

/* A thread waits for another one's news, and then in vain. */
#include <stdio.h>
#include <tavo_osal.h>

static TAVO_Mutex* mutex;
static TAVO_Condition* condition;
static int ready;

static void* announce(void* argument) {
    (void)argument;
    tavo_osal_mutex_lock(mutex);
    ready = 1;
    tavo_osal_thread_condition_signal(condition);
    tavo_osal_mutex_unlock(mutex);
    return NULL;
}

int main(void) {
    pthread_t thread;
    if (tavo_osal_mutex_create(&mutex) != TAVO_SUCCESS) return 1;
    if (tavo_osal_thread_condition_create(&condition) != TAVO_SUCCESS) return 1;
    if (tavo_osal_thread_create(&thread, announce, NULL) != TAVO_SUCCESS) return 1;

    tavo_osal_mutex_lock(mutex);
    while (!ready) tavo_osal_thread_condition_wait(condition, mutex); /* may wake for nothing */
    printf("ready\n");
    ready = 0;
    TAVO_Status status = TAVO_SUCCESS;
    /* Whole seconds: most other time-outs fail. */
    while (!ready && status == TAVO_SUCCESS) status = tavo_osal_thread_condition_timedwait(condition, mutex, 1000);
    printf("a second later: %#x\n", (unsigned int)status);
    tavo_osal_mutex_unlock(mutex);

    tavo_osal_thread_join(thread);
    tavo_osal_thread_condition_destroy(&condition);
    return tavo_osal_mutex_destroy(&mutex) == TAVO_SUCCESS ? 0 : 1;
}

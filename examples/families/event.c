/* Sets are counted, and are not lost when they come before the wait. */
#include <stdio.h>
#include <tavo_osal.h>

static void* set(void* event) {
    tavo_osal_event_set(event);
    return NULL;
}

int main(void) {
    pthread_t thread;
    TAVO_Event* event = NULL;
    if (tavo_osal_event_create(&event) != TAVO_SUCCESS) return 1;
    if (tavo_osal_thread_create(&thread, set, event) != TAVO_SUCCESS) return 1;
    printf("set by the thread: %d\n", (int)tavo_osal_event_waitset(event, TAVO_EVENT_FOREVER));
    tavo_osal_thread_join(thread);

    tavo_osal_event_set(event);
    tavo_osal_event_set(event);
    printf("set before the wait: %d\n", (int)tavo_osal_event_waitset_with_flag(event, 1000, 1)); /* takes both */
    printf("not set: %#x\n", (unsigned int)tavo_osal_event_waitset(event, 1000));
    printf("less than a second is refused: %#x\n", (unsigned int)tavo_osal_event_waitset(event, 999));
    return tavo_osal_event_destroy(&event) == TAVO_SUCCESS ? 0 : 1;
}

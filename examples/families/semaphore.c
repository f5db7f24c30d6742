/* Two places, taken and given back. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    sem_t places;
    int count = 0;
    TAVO_INT64 now = 0;
    if (tavo_osal_semaphore_create(&places, 0, 2) != TAVO_SUCCESS) return 1;
    tavo_osal_semaphore_wait(&places);
    tavo_osal_semaphore_wait(&places);
    printf("a third: %#x\n", (unsigned int)tavo_osal_semaphore_trywait(&places));
    /* A point in time, and not a duration. */
    if (tavo_osal_get_current_time_us(&now) != TAVO_SUCCESS) return 1;
    const uint64_t deadline = (uint64_t)now / 1000 + 10;
    printf("10 ms later: %#x\n", (unsigned int)tavo_osal_semaphore_timedwait(&places, deadline));
    tavo_osal_semaphore_post(&places);
    if (tavo_osal_semaphore_get_value(&places, &count) == TAVO_SUCCESS) printf("%d place\n", count);
    return tavo_osal_semaphore_destroy(&places) == TAVO_SUCCESS ? 0 : 1;
}

/* How long something takes, by the clock that nobody sets. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    TAVO_INT64 before = 0;
    TAVO_INT64 after = 0;
    TAVO_TimeVal now;
    if (tavo_osal_get_current_time_ns(&before) != TAVO_SUCCESS) return 1;
    tavo_osal_thread_msleep(5);
    if (tavo_osal_get_current_time_ns(&after) != TAVO_SUCCESS) return 1;
    printf("at least 5 ms: %s\n", after - before >= 5000000 ? "yes" : "no");
    if (tavo_osal_get_current_time(&now) != TAVO_SUCCESS) return 1;
    printf("microseconds below a million: %s\n", now.tv_usec < 1000000 ? "yes" : "no");
    return 0;
}

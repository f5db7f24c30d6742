/* A periodic timer that fires three times. */
#include <stdio.h>
#include <tavo_osal.h>

static void* fire(void* event) {
    tavo_osal_event_set(event);
    return NULL;
}

int main(void) {
    TAVO_TimerFramework* timers = NULL;
    TAVO_Timer* timer = NULL;
    TAVO_Event* fired = NULL;
    if (tavo_osal_event_create(&fired) != TAVO_SUCCESS) return 1;
    if (tavo_osal_timer_framework_init(5, &timers) != TAVO_SUCCESS) return 1;
    /* Counts are multiples of the tick: others never come to an end. */
    if (tavo_osal_timer_create(timers, "", TAVO_TIMER_PERIODIC, 20, 10, fire, fired, &timer) != TAVO_SUCCESS) return 1;
    if (tavo_osal_timer_start(timers, timer, 20) != TAVO_SUCCESS) return 1;
    for (int i = 1; i <= 3; ++i) {
        if (tavo_osal_event_waitset(fired, TAVO_EVENT_FOREVER) == TAVO_SUCCESS) printf("fired %d\n", i);
    }
    tavo_osal_timer_stop(timers, timer);
    printf("running: %d\n", tavo_osal_is_timer_running(timers, timer));
    tavo_osal_timer_framework_uninit(timers); /* no callback runs from here on */
    return tavo_osal_event_destroy(&fired) == TAVO_SUCCESS ? 0 : 1;
}

// How many counts an event has.
#pragma once

#include "support/platform_fault.h"
#include "tavo_osal/event.h"

namespace tavo::test {

// Takes every count there is, one by one, until a wait would have to sleep. Logs nothing.
inline int take_counts(TAVO_Event* event) {
    static bool slept;
    slept = false;
    const PlatformHook hook(
        "libtavoosal.so", "pthread_cond_wait", +[](pthread_cond_t*, pthread_mutex_t*) {
            slept = true;
            return 0;
        });
    int count = 0;
    while (tavo_osal_event_waitset(event, TAVO_EVENT_FOREVER) == TAVO_SUCCESS && !slept) ++count;
    return count;
}

}  // namespace tavo::test

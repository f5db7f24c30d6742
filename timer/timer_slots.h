// What is behind the timers' handles.
#pragma once

#include <pthread.h>

#include <cstdint>

#include "tavo_osal/mutex.h"
#include "tavo_osal/timer.h"

namespace tavo {

// A plain field that is also read, or written, without the framework's mutex: callbacks run without it, their timers
// are changed without it afterwards, and the flags are read without it by intention.
template <typename T, int LoadOrder = __ATOMIC_RELAXED, int StoreOrder = __ATOMIC_RELAXED>
class Shared {
public:
    operator T() const { return __atomic_load_n(&value_, LoadOrder); }
    void operator=(T value) { __atomic_store_n(&value_, value, StoreOrder); }
    void operator=(const Shared& other) { *this = static_cast<T>(other); }

private:
    T value_;
};

}  // namespace tavo

struct TAVO_Timer {
    char acName[256];  // never filled: an empty text in the log
    tavo::Shared<uint32_t> eType;
    tavo::Shared<int32_t> iCount;   // milliseconds left while running
    tavo::Shared<int32_t> iReload;  // milliseconds after each expiry of a periodic timer, and after a restart
    tavo::Shared<TAVO_TimerCallback> callback;
    // Ordered after the callback, so that who reads the argument first never pairs a freed timer's with a callback.
    tavo::Shared<void*, __ATOMIC_ACQUIRE, __ATOMIC_RELEASE> argument;
    tavo::Shared<uint8_t> running;
    tavo::Shared<uint8_t> in_use;
};

struct TAVO_TimerFramework {
    TAVO_Timer timers[TAVO_TIMERS_PER_FRAMEWORK];
    int32_t tick_ms;
    TAVO_Mutex* mutex;
    pthread_t thread;
    tavo::Shared<uint8_t> exit;
};

namespace tavo {

// A framework in memory. The handle given for a sixth timer is the address behind the fifth, so there is room for what
// the operations on that handle look at: a timer that is forever free.
struct FrameworkBlock {
    TAVO_TimerFramework framework;
    char sixth_timer[sizeof(TAVO_Timer)];
};

}  // namespace tavo

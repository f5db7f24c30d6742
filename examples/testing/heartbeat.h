// A component to be tested: tells a supervisor, through the queue of a key, that this process is alive.
#pragma once

#include <tavo_osal.h>

class Heartbeat {
public:
    ~Heartbeat() { stop(); }

    // Attaches to the queue and beats every 100 ms from then on. A failure leaves nothing behind.
    TAVO_Status start(int key);
    void stop();
    int beats();

private:
    static void* beat(void* self);

    TAVO_Mutex* mutex_ = nullptr;  // guards beats_
    TAVO_TimerFramework* timers_ = nullptr;
    TAVO_INT64 queue_ = 0;
    int beats_ = 0;
};

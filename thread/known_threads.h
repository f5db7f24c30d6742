// Thread handles, and what must not be asked about them.
//
// A handle is dead once its thread was joined, or was detached and ended: what it refers to is gone, and giving it
// to the platform is undefined on glibc. The functions below remember the handles this library joined or detached
// and answer for the dead ones themselves, as a platform that noticed would: ESRCH. Every one of them answers with
// 0 or an error number, holds a lock of its own for short stretches only, never while it waits, and shields itself
// from cancellation.
//
// A later thread may be given a dead handle's value. One made by create_thread() is known by that; one made by
// other means is found by looking through the threads that run, on platforms where find_running_thread() can.
#pragma once

#include <pthread.h>

namespace tavo {

// Also installs the cancellation signal's handler, once the thread has been made.
int create_thread(pthread_t* thread, void* (*start)(void*), void* argument);
int join_thread(pthread_t thread);
int detach_thread(pthread_t thread);
int signal_thread(pthread_t thread, int signal);
bool is_dead(pthread_t thread);

}  // namespace tavo

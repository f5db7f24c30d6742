// What the library asks of a platform's threads beyond POSIX. A platform that lacks an answer leaves the function
// out, so each is to be tested for before it is called.
#pragma once

#include <pthread.h>
#include <sys/types.h>

namespace tavo {

// The kernel's id of the running thread that has this handle, 0 when no running thread has it, -1 when that cannot
// be told. Does not touch what the handle refers to, so that the handle may be one of a thread long gone.
[[gnu::weak]] pid_t find_running_thread(pthread_t thread);

// Called in a signal handler that interrupted a wait on a condition or for a thread's end. True when the wait is
// at a point that the thread may be ended from, with pthread_exit(), and in no other place; false when the wait was
// asked to end the thread by itself as soon as it gets to such a point. A platform without this function has waits
// that simply return when a signal interrupts them.
[[gnu::weak]] bool may_end_interrupted_wait();

}  // namespace tavo

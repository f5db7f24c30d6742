// Another thread that does something when this one has gone to sleep.
#pragma once

namespace tavo::test::faults {

// Once the calling thread sleeps: in the wait under test or, where that fails, in join_waker(). One that sleeps for
// another reason is woken before it waits, which is as good.
void start_waker(void (*wake)());
void join_waker();

}  // namespace tavo::test::faults

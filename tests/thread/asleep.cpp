#include "asleep.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <fstream>
#include <string>

namespace tavo::test {
namespace {

// 'S' for an interruptible sleep, see proc(5).
char state_of(pid_t thread) {
    std::ifstream stat("/proc/self/task/" + std::to_string(thread) + "/stat");
    std::string line;
    std::getline(stat, line);
    const size_t name_end = line.rfind(')');
    return name_end == std::string::npos ? '?' : line[name_end + 2];
}

}  // namespace

pid_t thread_id() { return static_cast<pid_t>(syscall(SYS_gettid)); }

void wait_until_asleep(pid_t thread) {
    // Twice in a row: a thread also sleeps for moments on its way to where it is going.
    int seen = 0;
    for (int i = 0; i < 20000 && seen < 3; ++i) {
        seen = state_of(thread) == 'S' ? seen + 1 : 0;
        usleep(1000);
    }
    ASSERT_EQ(seen, 3) << "the thread does not go to sleep";
}

Bedside::Bedside() { sem_init(&arrived_, 0, 0); }
Bedside::~Bedside() { sem_destroy(&arrived_); }

void Bedside::going_to_sleep() {
    thread_ = thread_id();
    sem_post(&arrived_);
}

void Bedside::wait_until_asleep() {
    while (sem_wait(&arrived_) != 0) {
    }
    tavo::test::wait_until_asleep(thread_);
}

void Bedside::wait_until_gone() {
    // Also used for a thread whose sleep was waited for already.
    while (sem_trywait(&arrived_) != 0 && thread_ == 0) usleep(1000);
    for (int i = 0; i < 20000; ++i) {
        if (state_of(thread_) == '?') return;
        usleep(1000);
    }
    FAIL() << "the thread does not end";
}

}  // namespace tavo::test

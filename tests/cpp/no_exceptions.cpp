// The C++ interface in a program without exceptions: exit status 0 when everything answers as it should.
#include <cstdio>
#include <mutex>
#include <vector>

#include "tavo_osal.hpp"

#ifdef TAVO_HAS_EXCEPTIONS
#error "this program is to be built with -fno-exceptions"
#endif

namespace {

int g_failures = 0;

void expect(bool holds, const char* what) {
    if (holds) return;
    fprintf(stderr, "not so: %s\n", what);
    ++g_failures;
}

void use_locks() {
    std::error_code error;
    tavo::Mutex mutex(error);
    tavo::Condition condition(error);
    expect(!error && mutex && condition, "a mutex and a condition are made");
    {
        const std::lock_guard<tavo::Mutex> guard(mutex);
        expect(!mutex.try_lock(error) && !error, "the guard holds the mutex");
    }
    std::unique_lock<tavo::Mutex> lock(mutex);
    expect(!condition.wait_for(lock, std::chrono::seconds(0), error) && !error, "nobody notifies");
}

void use_queue() {
    std::error_code error;
    const tavo::MessageQueue unreachable(7, error);
    expect(error == tavo::Errc::not_reachable && !unreachable, "there is no service yet");
    expect(tavo_osal_init(4, 4) == TAVO_SUCCESS, "the service is published");
    tavo::MessageQueue queue(7, error);
    queue.put("hello", error);
    std::vector<unsigned char> message;
    queue.get(message, error);
    expect(!error && message.size() == 5, "the message arrives");
    queue.close(error);
    expect(!error && !queue, "the queue is given up");
}

}  // namespace

int main() {
    use_locks();
    use_queue();
    std::error_code error;
    int seen = 0;
    tavo::Thread thread(
        error, [&seen](int value) { seen = value; }, 7);
    thread.join(error);
    expect(!error && seen == 7, "the thread runs");
    return g_failures == 0 ? 0 : 1;
}

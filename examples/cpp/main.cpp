// The C++ interface: everything is released by itself, failures are exceptions or std::error_code, times std::chrono.
#include <iostream>
#include <mutex>
#include <string>
#include <tavo_osal.hpp>

using namespace std::chrono_literals;

namespace {

// A thread hands a number over, under a mutex and a condition.
int hand_over() {
    tavo::Mutex mutex;
    tavo::Condition condition;
    int number = 0;
    tavo::Thread thread([&] {
        const std::lock_guard<tavo::Mutex> guard(mutex);
        number = 42;
        condition.notify_one();
    });
    std::unique_lock<tavo::Mutex> lock(mutex);
    condition.wait(lock, [&] { return number != 0; });
    lock.unlock();  // before the thread's destructor joins it
    return number;
}

// A periodic timer fires three times.
void count_ticks() {
    tavo::Timers timers(1ms);
    tavo::Event fired;
    tavo::Timer timer(timers, tavo::Timer::Kind::periodic, 5ms, [&] { fired.set(); });
    timer.start();
    for (int i = 0; i < 3; ++i) fired.wait();
    timers.close();  // no callback uses the event from here on
}

std::string exchange_a_message() {
    tavo::MessageQueue sender(7);
    tavo::MessageQueue receiver(7);
    sender.put("hello");
    const auto message = receiver.get();
    return {message.begin(), message.end()};
}

}  // namespace

int main() {
    std::error_code error;
    const tavo::MessageQueue too_early(7, error);
    std::cout << "\nbefore there is a service: " << error.message() << '\n';

    if (tavo_osal_init(4, 4) != TAVO_SUCCESS) return 1;
    try {
        std::cout << "\nthe thread handed over " << hand_over() << '\n';
        count_ticks();
        std::cout << "the timer fired three times\n";
        std::cout << "got " << exchange_a_message() << '\n';
        const tavo::SharedBlock block(9, 4096);
        std::cout << "mapped " << block.size() << " bytes\n";
        tavo::MessageQueue(7).put(std::string(tavo::MessageQueue::max_size + 1, 'x'));
    } catch (const std::system_error& failure) {
        std::cout << "as expected: " << failure.what() << '\n';
        return failure.code() == tavo::Errc::message_too_large ? 0 : 1;
    }
    return 1;
}

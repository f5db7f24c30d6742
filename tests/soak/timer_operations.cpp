#include <atomic>

#include "soak/failure.h"
#include "soak/operations.h"
#include "tavo_osal/clock.h"
#include "tavo_osal/thread.h"
#include "tavo_osal/timer.h"

namespace tavo::soak {
namespace {

constexpr unsigned kTickMs = 2;
constexpr TAVO_INT64 kMicrosecondsOfASecond = 1000000;

void* count_up(void* shared) {
    static_cast<std::atomic<unsigned>*>(shared)->fetch_add(1);
    return nullptr;
}

struct Clockwork {
    TAVO_Timer* timer = nullptr;
    std::atomic<unsigned> fired{0};
    bool is_periodic = false;
};

}  // namespace

void use_timers(Client& client) {
    TAVO_TimerFramework* framework = nullptr;
    if (!succeeds(tavo_osal_timer_framework_init(kTickMs, &framework), "tavo_osal_timer_framework_init")) return;
    Clockwork works[TAVO_TIMERS_PER_FRAMEWORK];
    const unsigned count = client.random.between(1, TAVO_TIMERS_PER_FRAMEWORK);
    for (unsigned i = 0; i < count; ++i) {
        works[i].is_periodic = client.random.one_in(2);
        const auto milliseconds = static_cast<int>(kTickMs * client.random.between(1, 5));
        succeeds(
            tavo_osal_timer_create(framework, "soak", works[i].is_periodic ? TAVO_TIMER_PERIODIC : TAVO_TIMER_ONE_SHOT,
                                   milliseconds, milliseconds, count_up, &works[i].fired, &works[i].timer),
            "tavo_osal_timer_create");
        succeeds(tavo_osal_timer_start(framework, works[i].timer, static_cast<unsigned>(milliseconds)),
                 "tavo_osal_timer_start");
    }
    for (unsigned i = 0; i < count; ++i) {
        const unsigned wanted = works[i].is_periodic ? 3 : 1;
        // A timer that never fires is a client without progress.
        while (works[i].fired < wanted) tavo_osal_thread_msleep(kTickMs);
    }
    for (unsigned i = 0; i < count; ++i) {
        succeeds(tavo_osal_timer_stop(framework, works[i].timer), "tavo_osal_timer_stop");
        expect(tavo_osal_is_timer_running(framework, works[i].timer) == 0, "a timer runs that was stopped");
        if (client.random.one_in(2)) succeeds(tavo_osal_timer_free(framework, works[i].timer), "tavo_osal_timer_free");
    }
    succeeds(tavo_osal_timer_framework_uninit(framework), "tavo_osal_timer_framework_uninit");
    for (unsigned i = 0; i < count; ++i) {
        expect(works[i].is_periodic || works[i].fired == 1, "a one-shot timer fired twice");
    }
}

void read_clocks(Client&) {
    TAVO_INT64 first = 0, second = 0;
    succeeds(tavo_osal_get_current_time_ns(&first), "tavo_osal_get_current_time_ns");
    TAVO_INT64 before = 0, after = 0;
    TAVO_TimeVal between = {};
    succeeds(tavo_osal_get_current_time_us(&before), "tavo_osal_get_current_time_us");
    succeeds(tavo_osal_get_current_time(&between), "tavo_osal_get_current_time");
    succeeds(tavo_osal_get_current_time_us(&after), "tavo_osal_get_current_time_us");
    succeeds(tavo_osal_get_current_time_ns(&second), "tavo_osal_get_current_time_ns");
    expect(first <= second, "the monotonic clock went back");
    // Setting the time of day is nobody's mistake here, so the two readings only have to be of one day.
    const TAVO_INT64 middle = between.tv_sec * kMicrosecondsOfASecond + between.tv_usec;
    const TAVO_INT64 day = 86400 * kMicrosecondsOfASecond;
    expect(between.tv_usec >= 0 && between.tv_usec < kMicrosecondsOfASecond && middle > before - day &&
               middle < after + day,
           "two readings of the time of day differ");
}

}  // namespace tavo::soak

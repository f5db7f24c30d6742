#include "tick_driver.h"

#include <semaphore.h>

#include <thread>

#include "../thread/asleep.h"

namespace tavo::test {
namespace {

sem_t g_go;
sem_t g_asleep;
useconds_t g_asked_for;

void take(sem_t& semaphore) {
    while (sem_wait(&semaphore) != 0) {
    }
}

int sleep_until_told(useconds_t duration) {
    g_asked_for = duration;
    sem_post(&g_asleep);
    take(g_go);
    return 0;
}

}  // namespace

TickDriver::TickDriver(unsigned tick_ms) : sleep_("libtavoosal.so", "usleep", &sleep_until_told) {
    sem_init(&g_go, 0, 0);
    sem_init(&g_asleep, 0, 0);
    EXPECT_EQ(tavo_osal_timer_framework_init(tick_ms, &framework_), TAVO_SUCCESS);
    take(g_asleep);
}

TickDriver::~TickDriver() {
    if (framework_ != nullptr) {
        EXPECT_EQ(uninit(), TAVO_SUCCESS);
    }
}

void TickDriver::tick(int times) {
    for (int i = 0; i < times; ++i) {
        sem_post(&g_go);
        take(g_asleep);
    }
}

void TickDriver::last_tick() { sem_post(&g_go); }

TAVO_Status TickDriver::uninit() {
    Bedside bedside;
    TAVO_Status status = TAVO_FAILURE;
    std::thread ending([&] {
        bedside.going_to_sleep();
        status = tavo_osal_timer_framework_uninit(framework_);
    });
    bedside.wait_until_asleep();  // in the worker's join, so the worker has been told
    last_tick();
    ending.join();
    if (status == TAVO_SUCCESS) forget();
    return status;
}

useconds_t TickDriver::asked_for() { return g_asked_for; }

}  // namespace tavo::test

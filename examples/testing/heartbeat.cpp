#include "heartbeat.h"

#include <string>

namespace {

constexpr unsigned kTickMs = 50;
constexpr int kPeriodMs = 100;

}  // namespace

TAVO_Status Heartbeat::start(int key) {
    TAVO_Timer* timer = nullptr;
    TAVO_Status status = tavo_osal_mutex_create(&mutex_);
    if (status == TAVO_SUCCESS) status = tavo_msg_queue_init(key, &queue_);
    if (status == TAVO_SUCCESS) status = tavo_osal_timer_framework_init(kTickMs, &timers_);
    if (status == TAVO_SUCCESS) {
        status =
            tavo_osal_timer_create(timers_, "heartbeat", TAVO_TIMER_PERIODIC, kPeriodMs, kPeriodMs, beat, this, &timer);
    }
    if (status == TAVO_SUCCESS) status = tavo_osal_timer_start(timers_, timer, kPeriodMs);
    if (status != TAVO_SUCCESS) {
        tavo_print_log(TAVO_LOG_ERROR, 0, __LINE__, "HEARTBEAT", "No heartbeat for key %d: %#x\n", key, status);
        stop();
    }
    return status;
}

void Heartbeat::stop() {
    if (timers_ != nullptr) tavo_osal_timer_framework_uninit(timers_);
    if (queue_ != 0) tavo_msg_queue_close(queue_);
    tavo_osal_mutex_destroy(&mutex_);
    timers_ = nullptr;
    queue_ = 0;
    mutex_ = nullptr;
}

int Heartbeat::beats() {
    tavo_osal_mutex_lock(mutex_);
    const int beats = beats_;
    tavo_osal_mutex_unlock(mutex_);
    return beats;
}

void* Heartbeat::beat(void* self) {
    auto& heartbeat = *static_cast<Heartbeat*>(self);
    std::string message = "alive " + std::to_string(heartbeat.beats() + 1);
    auto* bytes = reinterpret_cast<unsigned char*>(message.data());
    if (tavo_msg_queue_put(heartbeat.queue_, bytes, static_cast<unsigned int>(message.size())) != TAVO_SUCCESS) {
        tavo_print_log(TAVO_LOG_WARNING, 0, __LINE__, "HEARTBEAT", "A beat was lost\n");
        return nullptr;
    }
    tavo_osal_mutex_lock(heartbeat.mutex_);
    ++heartbeat.beats_;
    tavo_osal_mutex_unlock(heartbeat.mutex_);
    return nullptr;
}

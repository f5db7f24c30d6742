// Mutexes, condition variables, events and counting semaphores.
#include <pthread.h>
#include <semaphore.h>

#include <cerrno>

#include "faults/plan.h"
#include "faults/row.h"
#include "faults/waker.h"
#include "tavo_osal/condition.h"
#include "tavo_osal/event.h"
#include "tavo_osal/log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/mutex.h"
#include "tavo_osal/semaphore.h"

namespace tavo::test::faults {
namespace {

constexpr char kTag[] = "OSAL_THREAD";
constexpr char kSemaphoreTag[] = "TAVO_OSAL";

Line error(std::string text) { return {TAVO_LOG_ERROR, kTag, std::move(text)}; }
Line no_memory() { return {TAVO_LOG_ERROR, "OSAL_MEM", "Memory not allocated. Size Requested: *.\n"}; }

TAVO_Mutex* g_mutex;
TAVO_Condition* g_condition;
TAVO_Event* g_event;
sem_t g_semaphore;

void make_mutex() { tavo_osal_mutex_create(&g_mutex); }
void drop_mutex() { tavo_osal_mutex_destroy(&g_mutex); }
void make_condition() {
    make_mutex();
    tavo_osal_mutex_lock(g_mutex);
    tavo_osal_thread_condition_create(&g_condition);
}
void drop_condition() {
    tavo_osal_thread_condition_destroy(&g_condition);
    tavo_osal_mutex_unlock(g_mutex);
    drop_mutex();
}
void make_event() { tavo_osal_event_create(&g_event); }
void drop_event() { tavo_osal_event_destroy(&g_event); }

std::vector<Row> mutex_rows() {
    return {
        {"tavo_osal_mutex_create",
         {{"",
           nullptr,
           [] { return long{tavo_osal_mutex_create(&g_mutex)}; },
           [](long result) {
               expect((result == 0) == (g_mutex != nullptr), "the handle is null on a failure");
               drop_mutex();
           },
           {on({"malloc"}, {fails(TAVO_NO_MEMORY, {no_memory(), error("Mutex allocation failed.\n")})}),
            on({"pthread_mutex_init"},
               {fails(TAVO_FAILURE, {error("Mutex creation failed. Error = " + std::to_string(ENOMEM) + "\n")})})}}}},
        {"tavo_osal_mutex_lock",
         {{"",
           make_mutex,
           [] { return long{tavo_osal_mutex_lock(g_mutex)}; },
           [](long result) {
               if (result == 0) tavo_osal_mutex_unlock(g_mutex);
               drop_mutex();
           },
           {on({"pthread_mutex_lock"},
               {fails(TAVO_FAILURE, {error("Mutex lock failed. Error=" + std::to_string(EINVAL) + "\n")})})}}}},
        {"tavo_osal_mutex_try_lock",
         {{"",
           make_mutex,
           [] { return long{tavo_osal_mutex_try_lock(g_mutex)}; },
           [](long result) {
               if (result == 0) tavo_osal_mutex_unlock(g_mutex);
               drop_mutex();
           },
           {on_error("pthread_mutex_trylock", EINVAL,
                     {fails(TAVO_FAILURE, {error("Mutex lock failed. Error=" + std::to_string(EINVAL) + "\n")})}),
            on_error("pthread_mutex_trylock", EBUSY,
                     {fails(TAVO_BUSY, {error("Mutex already locked! Error=" + std::to_string(EBUSY) + "\n")})})}}}},
        {"tavo_osal_mutex_unlock",
         {{"",
           [] {
               make_mutex();
               tavo_osal_mutex_lock(g_mutex);
           },
           [] { return long{tavo_osal_mutex_unlock(g_mutex)}; },
           [](long) { drop_mutex(); },
           {on({"pthread_mutex_unlock"},
               {fails(TAVO_FAILURE, {error("Mutex unlock failed. Error=" + std::to_string(EPERM) + "\n")})})}}}},
        {"tavo_osal_mutex_destroy",
         {{"",
           make_mutex,
           [] { return long{tavo_osal_mutex_destroy(&g_mutex)}; },
           nullptr,
           {on({"pthread_mutex_destroy"},
               {fails(TAVO_FAILURE, {error("Mutex destroy failed. Error=" + std::to_string(EBUSY) + "\n")})})}}}},
    };
}

std::vector<Row> condition_rows() {
    return {
        {"tavo_osal_thread_condition_create",
         {{"",
           nullptr,
           [] { return long{tavo_osal_thread_condition_create(&g_condition)}; },
           [](long result) {
               expect((result == TAVO_NO_MEMORY) == (g_condition == nullptr), "the handle is null without memory only");
               // What only could not be initialised is the caller's to release.
               if (result == TAVO_FAILURE) {
                   tavo_osal_mem_free(g_condition);
               } else {
                   tavo_osal_thread_condition_destroy(&g_condition);
               }
           },
           {on({"malloc"},
               {fails(TAVO_NO_MEMORY, {no_memory(), error("Memory allocation for condition variable failed\n")})}),
            on({"pthread_cond_init"}, {fails(TAVO_FAILURE, {error("Condition variable initialization failed: error=" +
                                                                  std::to_string(ENOMEM) + "\n")})})}}}},
        {"tavo_osal_thread_condition_wait",
         {{"is woken",
           [] {
               make_condition();
               start_waker([] {
                   tavo_osal_mutex_lock(g_mutex);
                   tavo_osal_thread_condition_signal(g_condition);
                   tavo_osal_mutex_unlock(g_mutex);
               });
           },
           [] { return long{tavo_osal_thread_condition_wait(g_condition, g_mutex)}; },
           [](long) {
               tavo_osal_mutex_unlock(g_mutex);
               join_waker();
               tavo_osal_mutex_lock(g_mutex);
               drop_condition();
           },
           {on({"pthread_cond_wait"}, {fails(TAVO_FAILURE, {error("Wait on condition variable failed: Error=" +
                                                                  std::to_string(EINVAL) + "\n")})})}}}},
        {"tavo_osal_thread_condition_timedwait",
         {{"times out",
           make_condition,
           [] { return long{tavo_osal_thread_condition_timedwait(g_condition, g_mutex, 0)}; },
           [](long) { drop_condition(); },
           {on({"gettimeofday"}, {fails(TAVO_FAILURE, {error("Failed to get time of day.\n")})}),
            on_error("pthread_cond_timedwait", EINVAL,
                     {fails(TAVO_FAILURE,
                            {error("Wait on condition variable failed: errno=" + std::to_string(EINVAL) + "\n")})}),
            on_error("pthread_cond_timedwait", ETIMEDOUT, {fails(TAVO_CONDITION_TIMEOUT)})}}}},
        {"tavo_osal_thread_condition_signal",
         {{"",
           make_condition,
           [] { return long{tavo_osal_thread_condition_signal(g_condition)}; },
           [](long) { drop_condition(); },
           {on({"pthread_cond_signal"},
               {fails(TAVO_FAILURE, {error("Failed to unblock the thread waiting on condition variable. Error=" +
                                           std::to_string(EINVAL) + "\n")})})}}}},
        {"tavo_osal_thread_condition_broadcast",
         {{"",
           make_condition,
           [] { return long{tavo_osal_thread_condition_broadcast(g_condition)}; },
           [](long) { drop_condition(); },
           {on({"pthread_cond_broadcast"},
               {fails(TAVO_FAILURE, {error("Failed to unblock all threads waiting on condition variable. Error=" +
                                           std::to_string(EINVAL) + "\n")})})}}}},
        {"tavo_osal_thread_condition_destroy",
         {{"",
           make_condition,
           [] { return long{tavo_osal_thread_condition_destroy(&g_condition)}; },
           [](long result) {
               expect((result == 0) == (g_condition == nullptr), "the handle is kept on a failure");
               if (result != 0) tavo_osal_thread_condition_destroy(&g_condition);
               tavo_osal_mutex_unlock(g_mutex);
               drop_mutex();
           },
           {on({"pthread_cond_destroy"},
               {fails(TAVO_FAILURE, {error("Failed to destroy the condition variable: RetVal=" + std::to_string(EBUSY) +
                                           "\n")})})}}}},
    };
}

// Both waits, whose words for failures differ.
struct WaitWords {
    const char *lock, *unlock, *unlimited, *timed;
    bool asks_for_time;
};

void wake_with_event() { tavo_osal_event_set(g_event); }
void make_event_and_waker() {
    make_event();
    start_waker(wake_with_event);
}
void join_waker_and_drop(long) {
    join_waker();
    drop_event();
}

template <TAVO_Status (*Wait)(uint32_t)>
std::vector<Scenario> waits(const WaitWords& words) {
    const std::vector<Expectation> common = {
        on({"pthread_mutex_lock"}, {fails(TAVO_FAILURE, {error(words.lock)})}),
        on({"pthread_mutex_unlock"}, {fails(TAVO_FAILURE, {error(words.unlock)})}),
        // Where it is not looked at, the wait's end lies in the past.
        on({"gettimeofday"},
           words.asks_for_time
               ? std::vector<Outcome>{fails(TAVO_FAILURE, {error("Failed to get time of day.\n")})}
               : std::vector<Outcome>{same(), fails(TAVO_TIMEOUT, {{TAVO_LOG_INFO, kTag, "Time out happened.\n"}})}),
        on({"pthread_cond_wait"}, {fails(TAVO_FAILURE, {error(words.unlimited)})}),
        on_error("pthread_cond_timedwait", EINVAL, {fails(TAVO_FAILURE, {error(words.timed)})}),
        on_error("pthread_cond_timedwait", ETIMEDOUT,
                 {fails(TAVO_TIMEOUT, {{TAVO_LOG_INFO, kTag, "Time out happened.\n"}})}),
    };
    const auto make_set_event = [] {
        make_event();
        tavo_osal_event_set(g_event);
    };
    const auto drop = [](long) { drop_event(); };
    return {
        {"is set", make_set_event, [] { return long{Wait(TAVO_EVENT_FOREVER)}; }, drop, common},
        {"is set, within a time", make_set_event, [] { return long{Wait(60000)}; }, drop, common},
        {"is woken", make_event_and_waker, [] { return long{Wait(TAVO_EVENT_FOREVER)}; }, join_waker_and_drop, common},
        {"is woken, within a time", make_event_and_waker, [] { return long{Wait(100000)}; }, join_waker_and_drop,
         common},
    };
}

TAVO_Status wait_plainly(uint32_t timeout) { return tavo_osal_event_waitset(g_event, timeout); }
TAVO_Status wait_with_flag(uint32_t timeout) { return tavo_osal_event_waitset_with_flag(g_event, timeout, 1); }

std::vector<Expectation> changes(const char* lock, const char* signal, const char* unlock) {
    return {on({"pthread_mutex_lock"}, {fails(TAVO_FAILURE, {error(lock)})}),
            on({"pthread_cond_signal"}, {fails(TAVO_FAILURE, {error(signal)})}),
            on({"pthread_mutex_unlock"}, {fails(TAVO_FAILURE, {error(unlock)})})};
}

std::vector<Row> event_rows() {
    const auto drop = [](long) { drop_event(); };
    return {
        {"tavo_osal_event_create",
         {{"",
           nullptr,
           [] { return long{tavo_osal_event_create(&g_event)}; },
           [](long result) {
               expect((result == 0) == (g_event != nullptr), "the handle is null on a failure");
               if (result == 0) drop_event();
           },
           {on({"malloc"}, {fails(TAVO_NO_MEMORY, {no_memory(), error("Event handle allocation failed\n")})}),
            on({"pthread_cond_init"}, {fails(TAVO_FAILURE, {error("Condition variable creation failed. Error=" +
                                                                  std::to_string(ENOMEM) + "\n")})}),
            on({"pthread_mutex_init"},
               {fails(TAVO_FAILURE, {error("Mutex creation failed. Error=" + std::to_string(ENOMEM) + "\n")})})}}}},
        {"tavo_osal_event_waitset",
         waits<wait_plainly>({"Mutex lock failed. Error=22\n", "Mutex unlock failed. Error=1\n",
                              "Inside indefnite wait - conditional wait failed. Error=22\n",
                              "Inside timed wait - conditional timedwait failed. Returned Error= 22.\n", true})},
        {"tavo_osal_event_waitset_with_flag",
         waits<wait_with_flag>({"Mutex lock failed \n", "Mutex unlock failed\n",
                                "Inside indefnite wait - conditional wait failed \n",
                                "Inside timed wait - conditional timedwait failed 22. Errno=*.\n", false})},
        {"tavo_osal_event_set",
         {{"", make_event, [] { return long{tavo_osal_event_set(g_event)}; }, drop,
           changes("Mutex lock failed. error=22.\n", "Broadcast condition signal failed. error=22.\n",
                   "Mutex unlock failed. error=1.\n")}}},
        // These tell errno, which the platform's calls leave alone.
        {"tavo_osal_event_set_with_flag",
         {{"", make_event, [] { return long{tavo_osal_event_set_with_flag(g_event, 1)}; }, drop,
           changes("Mutex lock failed. errno=*.\n", "pthread_cond_signal() failed. errno=*.\n",
                   "Mutex unlock failed. errno=*.\n")}}},
        {"tavo_osal_event_clear",
         {{"", make_event, [] { return long{tavo_osal_event_clear(g_event)}; }, drop,
           changes("Mutex lock failed. Error =22\n", "", "Mutex unlock failed. Error =1\n")}}},
        {"tavo_osal_event_destroy",
         {{"",
           make_event,
           [] { return long{tavo_osal_event_destroy(&g_event)}; },
           [](long) { expect(g_event == nullptr, "the handle is null in any case"); },
           {on({"pthread_cond_destroy"}, {fails(TAVO_DESTROY_FAILED, {error("Condition variable cannot be destroyed. "
                                                                            "ret error = 16\n")})}),
            on({"pthread_mutex_destroy"},
               {fails(TAVO_DESTROY_FAILED, {error("Mutex cannot be destroyed. ret error = 16\n")})}),
            // Looking for waiters, of which there are none: says nothing.
            on({"pthread_mutex_lock", "pthread_mutex_unlock"}, {same()})}}}},
    };
}

std::vector<Row> semaphore_rows() {
    const auto make = [] { tavo_osal_semaphore_create(&g_semaphore, 0, 1); };
    const auto drop = [](long) { tavo_osal_semaphore_destroy(&g_semaphore); };
    const auto says = [](std::string text) { return Line{TAVO_LOG_ERROR, kSemaphoreTag, std::move(text)}; };
    return {
        {"tavo_osal_semaphore_create",
         {{"",
           nullptr,
           [] { return long{tavo_osal_semaphore_create(&g_semaphore, 0, 1)}; },
           [](long result) {
               if (result == 0) tavo_osal_semaphore_destroy(&g_semaphore);
           },
           {on({"sem_init"}, {fails(TAVO_FAILURE, {says("Creation of semaphore failed with errno 28\n")})})}}}},
        {"tavo_osal_semaphore_wait",
         {{"",
           make,
           [] { return long{tavo_osal_semaphore_wait(&g_semaphore)}; },
           drop,
           {on({"sem_wait"}, {fails(TAVO_FAILURE, {says("Semaphore lock failed with errno 4\n")})})}}}},
        {"tavo_osal_semaphore_timedwait",
         {{"",
           make,
           [] { return long{tavo_osal_semaphore_timedwait(&g_semaphore, 1000)}; },
           drop,
           {on_error("sem_timedwait", EINTR, {fails(TAVO_FAILURE, {says("Semaphore timewait failed with errno 4\n")})}),
            on_error("sem_timedwait", ETIMEDOUT,
                     {fails(TAVO_SEMAPHORE_TIMEOUT, {says("Semaphore timewait failed with errno 110\n")})})}}}},
        {"tavo_osal_semaphore_post",
         {{"",
           make,
           [] { return long{tavo_osal_semaphore_post(&g_semaphore)}; },
           drop,
           {on({"sem_post"}, {fails(TAVO_FAILURE, {says("Semaphore unlock failed with errno 75\n")})})}}}},
        {"tavo_osal_semaphore_get_value",
         {{"",
           make,
           [] {
               int value = 0;
               return long{tavo_osal_semaphore_get_value(&g_semaphore, &value)};
           },
           drop,
           {on({"sem_getvalue"}, {fails(TAVO_FAILURE, {says("Failed to get semaphore value , errno : 0x16.\n")})})}}}},
        {"tavo_osal_semaphore_trywait",
         {{"",
           make,
           [] { return long{tavo_osal_semaphore_trywait(&g_semaphore)}; },
           drop,
           {on({"sem_trywait"}, {fails(TAVO_FAILURE, {says("sem_trywait failed , errno : 0xb.\n")})})}}}},
        {"tavo_osal_semaphore_destroy",
         {{"",
           make,
           [] { return long{tavo_osal_semaphore_destroy(&g_semaphore)}; },
           nullptr,
           {on({"sem_destroy"}, {fails(TAVO_FAILURE, {says("sem_destroy failed , errno : 0x16.\n")})})}}}},
    };
}

}  // namespace

std::vector<Row> lock_rows() {
    std::vector<Row> rows = mutex_rows();
    for (auto* more : {condition_rows, event_rows, semaphore_rows}) {
        for (Row& row : more()) rows.push_back(std::move(row));
    }
    return rows;
}

}  // namespace tavo::test::faults

// Threads.
#include <pthread.h>
#include <sched.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>

#include "faults/plan.h"
#include "faults/row.h"
#include "tavo_osal/log.h"
#include "tavo_osal/thread.h"

namespace tavo::test::faults {
namespace {

constexpr char kTag[] = "OSAL_THREAD";
constexpr char kLedger[] = "the list of known threads has a lock of the default kind, which cannot fail";

Line error(std::string text) { return {TAVO_LOG_ERROR, kTag, std::move(text)}; }
Expectation ledger() { return skip({"pthread_mutex_lock", "pthread_mutex_unlock"}, kLedger); }

pthread_t g_thread;
std::atomic<bool> g_may_end;

void* end_when_told(void*) {
    while (!g_may_end) usleep(500);
    return nullptr;
}
void* end_at_once(void*) { return nullptr; }

void start_thread() {
    g_may_end = false;
    tavo_osal_thread_create(&g_thread, end_when_told, nullptr);
}
void join_thread(long) {
    g_may_end = true;
    tavo_osal_thread_join(g_thread);
}
void start_short_thread() { tavo_osal_thread_create(&g_thread, end_at_once, nullptr); }

template <TAVO_Status (*Create)()>
std::vector<Scenario> creations() {
    return {{"",
             nullptr,
             [] { return long{Create()}; },
             [](long result) {
                 if (result == 0) tavo_osal_thread_join(g_thread);
             },
             {on({"pthread_create"}, {fails(TAVO_FAILURE, {error("Thread creation failed. retval = 11\n")})}),
              // Told on standard output and standard error; the thread is there.
              on({"sigaction", "printf"}, {same()}), ledger()}}};
}
TAVO_Status create() { return tavo_osal_thread_create(&g_thread, end_at_once, nullptr); }
TAVO_Status create_with_name() { return tavo_osal_thread_create_with_name(&g_thread, end_at_once, nullptr, "name"); }

// A thread that was detached, so that its handle is looked up before it is used.
void start_detached_thread() {
    start_thread();
    tavo_osal_thread_detach(g_thread);
}
void await_detached_thread(long) {
    const pthread_t thread = g_thread;
    g_may_end = true;
    while (tavo_osal_thread_cancel(thread) == 0 && held().threads > 1) usleep(200);
}

void on_signal(int) {}

std::vector<Row> thread_life_rows() {
    return {
        {"tavo_osal_thread_create", creations<create>()},
        {"tavo_osal_thread_create_with_name", creations<create_with_name>()},
        {"tavo_osal_thread_join",
         {{"",
           start_short_thread,
           [] { return long{tavo_osal_thread_join(g_thread)}; },
           [](long result) {
               if (result != 0) tavo_osal_thread_join(g_thread);
           },
           {on({"pthread_join"}, {fails(TAVO_FAILURE, {error("Thread join failed. iRet=22\n")})}), ledger()}}}},
        {"tavo_osal_thread_detach",
         {{"",
           start_thread,
           [] { return long{tavo_osal_thread_detach(g_thread)}; },
           [](long result) {
               if (result != 0) return join_thread(0);
               await_detached_thread(0);
           },
           {on({"pthread_detach"}, {fails(TAVO_FAILURE, {error("Thread detach failed. iRet=22\n")})}),
            // Asked for the kernel's number of the thread, without which a later use of the handle is not refused.
            on({"syscall", "open", "close", "nanosleep"}, {same()}), ledger()}}}},
        {"tavo_osal_thread_exit",
         {{"",
           nullptr,
           [] {
               pthread_t thread = {};
               pthread_create(
                   &thread, nullptr,
                   [](void*) -> void* {
                       tavo_osal_thread_exit();
                       return nullptr;
                   },
                   nullptr);
               return long{pthread_join(thread, nullptr)};
           },
           nullptr,
           {},
           false,
           Side::kClient,
           true}}},
        {"tavo_osal_thread_cancel",
         {{"",
           start_thread,
           [] { return long{tavo_osal_thread_cancel(g_thread)}; },
           join_thread,
           // Whatever the platform says, the answer is success. The line is left out.
           {on({"pthread_kill"}, {fails(TAVO_SUCCESS)}), ledger()}}}},
        {"tavo_osal_thread_kill",
         // SIGKILL ends the process, so it goes to nobody.
         {{"no thread", [] { g_thread = {}; }, [] { return long{tavo_osal_thread_kill(g_thread)}; }, nullptr, {}},
          {"a thread that has ended",
           [] {
               start_short_thread();
               tavo_osal_thread_join(g_thread);
           },
           [] { return long{tavo_osal_thread_kill(g_thread)}; },
           nullptr,
           {skip({"syscall", "open"}, "the signal would go to whatever has the stale handle, and end the process"),
            on({"close", "nanosleep"}, {same()}), ledger()}}}},
        {"tavo_osal_thread_set_affinity",
         {{"", nullptr, [] { return long{tavo_osal_thread_set_affinity(pthread_self(), 1)}; }, nullptr, {}}}},
        {"tavo_osal_thread_testcancel", {{"", nullptr, [] { return tavo_osal_thread_testcancel(), 0L; }, nullptr, {}}}},
        {"tavo_osal_thread_set_real_time_priority",
         {{"",
           start_thread,
           [] { return long{tavo_osal_thread_set_real_time_priority(g_thread, 1, TAVO_THREAD_POLICY_RR)}; },
           join_thread,
           {on({"pthread_getschedparam"},
               {fails(0, {{TAVO_LOG_WARNING, kTag, "pthread_getschedparam failed\n"}}),
                fails(TAVO_FAILURE, {{TAVO_LOG_WARNING, kTag, "pthread_getschedparam failed\n"}})}),
            on({"pthread_setschedparam"}, {fails(TAVO_FAILURE, {error("Set sched_param failed. errno *\n")})}),
            ledger()}},
          {"a detached thread",
           start_detached_thread,
           [] { return long{tavo_osal_thread_set_real_time_priority(g_thread, 1, TAVO_THREAD_POLICY_RR)}; },
           await_detached_thread,
           // A running thread that the kernel does not tell of counts as one that has ended.
           {on({"syscall", "open", "close", "nanosleep"},
               {same(), fails(TAVO_FAILURE, {{TAVO_LOG_WARNING, kTag, "pthread_getschedparam failed\n"},
                                             error("Set sched_param failed. errno *\n")})}),
            on({"pthread_getschedparam"},
               {fails(0, {{TAVO_LOG_WARNING, kTag, "pthread_getschedparam failed\n"}}),
                fails(TAVO_FAILURE, {{TAVO_LOG_WARNING, kTag, "pthread_getschedparam failed\n"}})}),
            on({"pthread_setschedparam"}, {fails(TAVO_FAILURE, {error("Set sched_param failed. errno *\n")})}),
            ledger()}}}},
    };
}

std::vector<Row> sleep_rows() {
    return {
        {"tavo_osal_thread_yield",
         {{"",
           nullptr,
           [] { return long{tavo_osal_thread_yield()}; },
           nullptr,
           {on({"sched_yield"}, {fails(TAVO_FAILURE, {error("Thread yield failed. iRet=-1\n")})})}}}},
        {"tavo_osal_thread_sleep",
         {{"",
           nullptr,
           [] { return long{tavo_osal_thread_sleep(0)}; },
           nullptr,
           {on({"sleep"}, {fails(TAVO_FAILURE, {error("Sleep failed. uiRet = 1.\n")})})}}}},
        {"tavo_osal_thread_msleep",
         {{"",
           nullptr,
           [] { return long{tavo_osal_thread_msleep(1)}; },
           nullptr,
           {on({"nanosleep"},
               {fails(TAVO_FAILURE, {error("nanosleep failed, this may be because of signal handler or other reasons. "
                                           "errno 4\n")})})}}}},
        {"tavo_osal_thread_usleep",
         {{"",
           nullptr,
           [] { return long{tavo_osal_thread_usleep(1)}; },
           nullptr,
           {on({"usleep"}, {fails(TAVO_FAILURE, {error("Sleep failed.\n")})})}}}},
        {"tavo_osal_signal",
         {{"",
           nullptr,
           [] { return long{tavo_osal_signal(SIGUSR1, on_signal)}; },
           nullptr,
           {on({"signal"}, {fails(TAVO_FAILURE)})}}}},
    };
}

}  // namespace

std::vector<Row> thread_rows() {
    std::vector<Row> rows = thread_life_rows();
    for (Row& row : sleep_rows()) rows.push_back(std::move(row));
    return rows;
}

}  // namespace tavo::test::faults

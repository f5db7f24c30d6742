// Clocks and timers.
#include <unistd.h>

#include <atomic>
#include <cstddef>

#include "faults/plan.h"
#include "faults/row.h"
#include "tavo_osal/clock.h"
#include "tavo_osal/log.h"
#include "tavo_osal/timer.h"

namespace tavo::test::faults {
namespace {

constexpr char kTag[] = "OSAL_TIMER";
constexpr char kThreadTag[] = "OSAL_THREAD";
constexpr char kUnlockedTwice[] =
    "a framework whose mutex was given back without having been had stays: the platform does not destroy such a mutex";
constexpr char kLedger[] = "the list of known threads has a lock of the default kind, which cannot fail";

Line error(std::string text) { return {TAVO_LOG_ERROR, kTag, std::move(text)}; }
Line of_threads(std::string text) { return {TAVO_LOG_ERROR, kThreadTag, std::move(text)}; }

TAVO_TimerFramework* g_framework;
TAVO_Timer* g_timer;
std::atomic<int> g_fired;

void* fire(void*) {
    ++g_fired;
    return nullptr;
}
void make_framework() { tavo_osal_timer_framework_init(1, &g_framework); }
void drop_framework(long) { tavo_osal_timer_framework_uninit(g_framework); }
void make_timer() {
    make_framework();
    tavo_osal_timer_create(g_framework, "timer", TAVO_TIMER_ONE_SHOT, 60000, 0, fire, nullptr, &g_timer);
}
void start_timer() {
    make_timer();
    tavo_osal_timer_start(g_framework, g_timer, 60000);
}

std::vector<Expectation> with_mutex() {
    return {on({"pthread_mutex_lock"},
               {fails(TAVO_FAILURE, {of_threads("Mutex lock failed. Error=22\n"), error("Mutex lock failed \n")})}),
            on({"pthread_mutex_unlock"},
               {fails(TAVO_FAILURE, {of_threads("Mutex unlock failed. Error=1\n"), error("Mutex unlock failed \n")})})};
}

std::vector<Row> clock_rows() {
    const Outcome no_time = fails(TAVO_FAILURE, {error("Failed to get time of day.\n")});
    return {
        {"tavo_osal_get_current_time",
         {{"",
           nullptr,
           [] {
               TAVO_TimeVal time;
               return long{tavo_osal_get_current_time(&time)};
           },
           nullptr,
           {on({"gettimeofday"}, {no_time})}}}},
        {"tavo_osal_get_current_time_us",
         {{"",
           nullptr,
           [] {
               TAVO_INT64 time = 0;
               return long{tavo_osal_get_current_time_us(&time)};
           },
           nullptr,
           {on({"gettimeofday"}, {no_time})}}}},
        {"tavo_osal_get_current_time_ns",
         {{"",
           nullptr,
           [] {
               TAVO_INT64 time = 0;
               return long{tavo_osal_get_current_time_ns(&time)};
           },
           nullptr,
           {on({"clock_gettime"}, {fails(TAVO_FAILURE, {error("clock_gettime failed.\n")})})}}}},
    };
}

// Of what the worker says, the call has seen what came before its end.
std::vector<Outcome> said_so_far(const std::vector<Line>& lines, const char* kept = nullptr) {
    std::vector<Outcome> outcomes;
    for (size_t said = 0; said <= lines.size(); ++said) {
        outcomes.push_back(same_but({lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(said)}));
        if (kept != nullptr) outcomes.push_back(Outcome(outcomes.back()).keeping_blocks(1, kept));
    }
    return outcomes;
}

std::vector<Row> framework_rows() {
    const Line no_block = {TAVO_LOG_ERROR, "OSAL_MEM", "Memory not allocated. Size Requested: *.\n"};
    const std::vector<Line> no_lock = {of_threads("Mutex lock failed. Error=22\n"), error("Mutex lock failed.\n")};
    const Line no_unlock = of_threads("Mutex unlock failed. Error=1\n");
    std::vector<Outcome> not_unlocked = said_so_far({no_unlock, error("Mutex unlock failed \n")});
    not_unlocked.push_back(same_but({no_unlock, error("Mutex unlock failed.\n")}));
    const Expectation ledger = skip({"pthread_mutex_lock", "pthread_mutex_unlock"}, kLedger);
    return {
        {"tavo_osal_timer_framework_init",
         {{"",
           nullptr,
           [] { return long{tavo_osal_timer_framework_init(1, &g_framework)}; },
           [](long result) {
               expect((result == 0) == (g_framework != nullptr), "the handle is null on a failure");
               if (result == 0) drop_framework(0);
           },
           {on({"malloc"}, {fails(TAVO_NO_MEMORY, {no_block, error("Timer instance memory allocation failed \n")})}, 1),
            on({"malloc"},
               {fails(TAVO_NO_MEMORY,
                      {no_block, of_threads("Mutex allocation failed.\n"), error("Unable to create mutex\n")})},
               2),
            on({"pthread_mutex_init"}, {fails(TAVO_FAILURE, {of_threads("Mutex creation failed. Error = 12\n"),
                                                             error("Unable to create mutex\n")})}),
            on({"pthread_create"}, {fails(TAVO_FAILURE, {of_threads("Thread creation failed. retval = 11\n"),
                                                         error("Unable to create timer thread\n")})}),
            on({"sigaction", "printf"}, {same()}), ledger}},
          {"the worker, for a timer that fires",
           [] {
               g_fired = 0;
               make_timer();
               tavo_osal_timer_start(g_framework, g_timer, 1);
           },
           [] {
               while (g_fired == 0) usleep(200);
               return 0L;
           },
           drop_framework,
           // A round that could not be locked is gone through as if it had been; one that could not be unlocked is cut
           // short, and timers fire a tick later, but for the one that was to fire: that stays at 0 until the next.
           {on({"pthread_mutex_lock"}, said_so_far(no_lock, kUnlockedTwice)),
            on({"pthread_mutex_unlock"}, not_unlocked), on({"usleep"}, said_so_far({of_threads("Sleep failed.\n")}))},
           false,
           Side::kClient,
           true}}},
        {"tavo_osal_timer_framework_uninit",
         {{"",
           make_framework,
           [] { return long{tavo_osal_timer_framework_uninit(g_framework)}; },
           nullptr,
           {on({"pthread_join"},
               {fails(TAVO_FAILURE, {of_threads("Thread join failed. iRet=22\n"), error("Timer thread join failed \n")})
                    .keeping_blocks(2, "a framework whose worker could not be awaited stays")}),
            on({"pthread_mutex_destroy"},
               {fails(TAVO_FAILURE, {of_threads("Mutex destroy failed. Error=16\n")}),
                fails(TAVO_FAILURE, {of_threads("Mutex destroy failed. Error=16\n"), error("Mutex destroy failed \n")})
                    .keeping_blocks(1, "a framework whose mutex could not be destroyed stays, by errno's word")}),
            ledger}}}},
    };
}

std::vector<Row> slot_rows() {
    return {
        {"tavo_osal_timer_create",
         {{"", make_framework,
           [] {
               return long{tavo_osal_timer_create(g_framework, "timer", TAVO_TIMER_ONE_SHOT, 60000, 0, fire, nullptr,
                                                  &g_timer)};
           },
           drop_framework, with_mutex()}}},
        {"tavo_osal_timer_free",
         {{"", make_timer, [] { return long{tavo_osal_timer_free(g_framework, g_timer)}; }, drop_framework,
           with_mutex()}}},
        {"tavo_osal_timer_start",
         {{"", make_timer, [] { return long{tavo_osal_timer_start(g_framework, g_timer, 60000)}; }, drop_framework,
           with_mutex()}}},
        {"tavo_osal_timer_restart",
         {{"", start_timer, [] { return long{tavo_osal_timer_restart(g_framework, g_timer)}; }, drop_framework,
           with_mutex()}}},
        {"tavo_osal_timer_stop",
         {{"", start_timer, [] { return long{tavo_osal_timer_stop(g_framework, g_timer)}; }, drop_framework,
           with_mutex()}}},
        {"tavo_osal_is_timer_running",
         {{"",
           start_timer,
           [] { return long{tavo_osal_is_timer_running(g_framework, g_timer)}; },
           drop_framework,
           {}}}},
    };
}

}  // namespace

std::vector<Row> timer_rows() {
    std::vector<Row> rows = clock_rows();
    for (auto* more : {framework_rows, slot_rows}) {
        for (Row& row : more()) rows.push_back(std::move(row));
    }
    return rows;
}

}  // namespace tavo::test::faults

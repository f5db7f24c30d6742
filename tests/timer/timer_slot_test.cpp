// Timers: making, freeing, starting, restarting and stopping them, with the worker asleep.
#include <gtest/gtest.h>
#include <pthread.h>

#include <cerrno>
#include <climits>
#include <functional>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "tick_driver.h"
#include "timer/timer_slots.h"

namespace {

using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "OSAL_TIMER";
constexpr char kThreadTag[] = "OSAL_THREAD";
const ExpectedLine kInvalid{1, kTag, "Invalid parameters \n"};

class Timer : public tavo::test::DrivenTimers {
protected:
    TAVO_Status try_create(unsigned type, int duration, int reload) {
        return tavo_osal_timer_create(framework(), nullptr, type, duration, reload, count_call, &calls_, &timer_);
    }

    int calls_ = 0;
    TAVO_Timer* timer_ = nullptr;
};

TEST_F(Timer, CreateFillsTheFirstFreeSlotAndLeavesItStopped) {
    const LogCapture log;
    EXPECT_EQ(try_create(TAVO_TIMER_PERIODIC, 30, 20), TAVO_SUCCESS);
    ASSERT_EQ(timer_, &framework()->timers[0]);
    EXPECT_EQ(timer_->eType, 1U);
    EXPECT_EQ(timer_->iCount, 30);
    EXPECT_EQ(timer_->iReload, 20);
    EXPECT_EQ(timer_->callback, &count_call);
    EXPECT_EQ(timer_->argument, &calls_);
    EXPECT_EQ(timer_->in_use, 1);
    EXPECT_EQ(running(timer_), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{4, kTag, "Timer create:  eType[1] duration[30] iReload[20]\n"}}));
}

TEST_F(Timer, CreateDoesNotKeepTheName) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, nullptr);
    EXPECT_STREQ(timer->acName, "");
}

TEST_F(Timer, CreateTakesTheLowestFreeSlot) {
    TAVO_Timer* timers[4];
    for (TAVO_Timer*& timer : timers) timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, nullptr);
    EXPECT_EQ(tavo_osal_timer_free(framework(), timers[2]), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_free(framework(), timers[1]), TAVO_SUCCESS);
    EXPECT_EQ(create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, nullptr), timers[1]);
    EXPECT_EQ(create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, nullptr), timers[2]);
    EXPECT_EQ(create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, nullptr), &framework()->timers[4]);
}

TEST_F(Timer, CreateRefusesNullPointersAndOtherTypes) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_create(nullptr, "n", 0, 10, 0, count_call, nullptr, &timer_), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_create(framework(), "n", 0, 10, 0, nullptr, nullptr, &timer_), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_create(framework(), "n", 0, 10, 0, count_call, nullptr, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(try_create(2, 10, 10), TAVO_INVALID_PARAM);
    EXPECT_EQ(try_create(UINT_MAX, 10, 10), TAVO_INVALID_PARAM);
    EXPECT_EQ(timer_, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), std::vector<ExpectedLine>(5, kInvalid)));
}

TEST_F(Timer, CreateRefusesAPeriodicTimerWithoutReloadBeforeItLooksAtTheTick) {
    const LogCapture log;
    EXPECT_EQ(try_create(TAVO_TIMER_PERIODIC, 9, 0), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {kInvalid}));
}

TEST_F(Timer, CreateRefusesWhatIsShorterThanATickComparedSigned) {
    const LogCapture log(2);
    EXPECT_EQ(try_create(TAVO_TIMER_ONE_SHOT, 9, 100), TAVO_INVALID_PARAM);
    EXPECT_EQ(try_create(TAVO_TIMER_ONE_SHOT, -100, 100), TAVO_INVALID_PARAM);
    EXPECT_EQ(try_create(TAVO_TIMER_PERIODIC, 100, 9), TAVO_INVALID_PARAM);
    EXPECT_EQ(try_create(TAVO_TIMER_PERIODIC, 100, -1), TAVO_INVALID_PARAM);
    EXPECT_EQ(timer_, nullptr);
    const ExpectedLine line{1, kTag, "Duration/reload value is lesser than tick granularity \n"};
    EXPECT_TRUE(logged_exactly(log.lines(), std::vector<ExpectedLine>(4, line)));
    EXPECT_EQ(try_create(TAVO_TIMER_ONE_SHOT, 10, 0), TAVO_SUCCESS) << "exactly a tick";
    EXPECT_EQ(try_create(TAVO_TIMER_PERIODIC, 10, 10), TAVO_SUCCESS) << "exactly a tick";
}

TEST_F(Timer, CreateStoresAOneShotTimersReloadUnchecked) {
    EXPECT_EQ(try_create(TAVO_TIMER_ONE_SHOT, 10, -7), TAVO_SUCCESS);
    EXPECT_EQ(timer_->iReload, -7);
}

TEST_F(Timer, TheSixthTimerSucceedsWithTheAddressBehindTheTable) {
    for (int i = 0; i < 5; ++i) create_started(TAVO_TIMER_PERIODIC, 20, 20, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(try_create(TAVO_TIMER_ONE_SHOT, 10, 10), TAVO_SUCCESS);
    EXPECT_EQ(static_cast<void*>(timer_), static_cast<void*>(framework()->timers + 5));
    TAVO_Timer* seventh = nullptr;
    EXPECT_EQ(tavo_osal_timer_create(framework(), nullptr, 0, 10, 0, count_call, &calls_, &seventh), TAVO_SUCCESS);
    EXPECT_EQ(seventh, timer_);
    EXPECT_EQ(log.lines().size(), 2U) << "nothing but the debug messages";
}

TEST_F(Timer, TheSixthTimersHandleIsThatOfATimerForEverFree) {
    for (int i = 0; i < 5; ++i) create_started(TAVO_TIMER_PERIODIC, 20, 20, count_call, &calls_);
    ASSERT_EQ(try_create(TAVO_TIMER_ONE_SHOT, 10, 10), TAVO_SUCCESS);
    const LogCapture log(2);
    EXPECT_EQ(tavo_osal_timer_start(framework(), timer_, 20), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_restart(framework(), timer_), TAVO_SUCCESS);
    EXPECT_EQ(running(timer_), 0);
    EXPECT_EQ(tavo_osal_is_timer_running(nullptr, timer_), 0);
    EXPECT_EQ(tavo_osal_timer_stop(framework(), timer_), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_timer_free(framework(), timer_), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(framework()->tick_ms, 10) << "what lies behind the table is untouched";
    tick(3);
    EXPECT_EQ(calls_, 5);
}

TEST_F(Timer, FreeClearsTheSlotButNotItsTypeOrName) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_PERIODIC, 20, 30, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_free(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(timer->in_use, 0);
    EXPECT_EQ(running(timer), 0);
    EXPECT_EQ(timer->iCount, 0);
    EXPECT_EQ(timer->iReload, 0);
    EXPECT_EQ(timer->callback, nullptr);
    EXPECT_EQ(timer->argument, nullptr);
    EXPECT_EQ(timer->eType, 1U);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    tick(10);
    EXPECT_EQ(calls_, 0);
}

TEST_F(Timer, FreeOfAFreeTimerSucceedsAndChangesNothing) {
    TAVO_Timer* timer = &framework()->timers[3];
    timer->iCount = 77;  // to see that it stays
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_free(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(timer->iCount, 77);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(Timer, StartSetsTheCountAndLogsIt) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_start(framework(), timer, 20), TAVO_SUCCESS);
    EXPECT_EQ(running(timer), 1);
    EXPECT_EQ(timer->iCount, 20);
    EXPECT_TRUE(logged_exactly(log.lines(), {{4, kTag, "Timer start:  iCount[20]\n"}}));
}

TEST_F(Timer, StartOfARunningOrFreeTimerSucceedsAndChangesNothing) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    EXPECT_EQ(tavo_osal_timer_start(framework(), timer, 500), TAVO_SUCCESS);
    EXPECT_EQ(timer->iCount, 20);
    EXPECT_EQ(tavo_osal_timer_start(framework(), &framework()->timers[4], 500), TAVO_SUCCESS);
    EXPECT_EQ(running(&framework()->timers[4]), 0);
}

TEST_F(Timer, StartRefusesACountOfZeroAsInvalidAndASmallOneAsSmall) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_start(framework(), timer, 0), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_start(framework(), timer, 9), TAVO_INVALID_PARAM);
    EXPECT_EQ(running(timer), 0);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {kInvalid, {1, kTag, "Timer count value is lesser than tick granularity \n"}}));
}

TEST_F(Timer, RestartLoadsTheReloadWhetherOrNotTheTimerRuns) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, 50, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_restart(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(running(timer), 1);
    EXPECT_EQ(timer->iCount, 50);
    tick(2);
    EXPECT_EQ(timer->iCount, 30);
    EXPECT_EQ(tavo_osal_timer_restart(framework(), timer), TAVO_SUCCESS);
    EXPECT_EQ(timer->iCount, 50);
    const ExpectedLine line{4, kTag, "Timer restart: acName[]\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
    EXPECT_EQ(tavo_osal_timer_restart(framework(), &framework()->timers[4]), TAVO_SUCCESS);
    EXPECT_EQ(running(&framework()->timers[4]), 0) << "a free timer is left alone";
}

TEST_F(Timer, StopKeepsTheRemainingCount) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 50, 0, count_call, &calls_);
    tick(2);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_stop(framework(), timer), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(log.lines(), {{4, kTag, "Timer stop: acName[]\n"}}));
    EXPECT_EQ(running(timer), 0);
    tick(10);
    EXPECT_EQ(timer->iCount, 30);
    EXPECT_EQ(calls_, 0);
    EXPECT_EQ(tavo_osal_timer_stop(framework(), timer), TAVO_SUCCESS) << "again";
    EXPECT_EQ(tavo_osal_timer_stop(framework(), &framework()->timers[4]), TAVO_SUCCESS) << "a free one";
}

TEST_F(Timer, OperationsRefuseNullPointers) {
    TAVO_Timer* timer = create(TAVO_TIMER_ONE_SHOT, 10, 0, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_timer_free(nullptr, timer), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_free(framework(), nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_start(nullptr, timer, 10), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_start(framework(), nullptr, 10), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_restart(nullptr, timer), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_restart(framework(), nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_stop(nullptr, timer), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_timer_stop(framework(), nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), std::vector<ExpectedLine>(8, kInvalid)));
}

TEST_F(Timer, IsRunningRefusesOnlyTwoNullPointers) {
    TAVO_Timer* timer = create_started(TAVO_TIMER_ONE_SHOT, 20, 0, count_call, &calls_);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_is_timer_running(nullptr, timer), 1);
    EXPECT_EQ(tavo_osal_is_timer_running(framework(), nullptr), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
    EXPECT_EQ(tavo_osal_is_timer_running(nullptr, nullptr), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameters\n"}}));
}

// Every operation that takes the framework's mutex, each with an effect to look for.
class TimerMutexFailure : public Timer {
protected:
    struct Operation {
        const char* name;
        std::function<TAVO_Status()> run;
        std::function<bool()> done;
    };

    void SetUp() override {
        stopped_ = create(TAVO_TIMER_ONE_SHOT, 10, 50, count_call, &calls_);
        started_ = create_started(TAVO_TIMER_ONE_SHOT, 50, 50, count_call, &calls_);
        other_ = create(TAVO_TIMER_ONE_SHOT, 10, 50, count_call, &calls_);
    }

    std::vector<Operation> operations() {
        return {
            {"create", [&] { return try_create(TAVO_TIMER_ONE_SHOT, 10, 0); }, [&] { return timer_ != nullptr; }},
            {"start", [&] { return tavo_osal_timer_start(framework(), stopped_, 20); },
             [&] { return running(stopped_) == 1; }},
            {"stop", [&] { return tavo_osal_timer_stop(framework(), started_); },
             [&] { return running(started_) == 0; }},
            {"restart", [&] { return tavo_osal_timer_restart(framework(), other_); },
             [&] { return running(other_) == 1; }},
            {"free", [&] { return tavo_osal_timer_free(framework(), other_); }, [&] { return other_->in_use == 0; }},
        };
    }

    TAVO_Timer* stopped_ = nullptr;
    TAVO_Timer* started_ = nullptr;
    TAVO_Timer* other_ = nullptr;
};

TEST_F(TimerMutexFailure, OfTheLockGivesTheMutexsStatusAndChangesNothing) {
    const PlatformHook hook(
        kLibrary, "pthread_mutex_lock", +[](pthread_mutex_t*) { return EINVAL; });
    for (const Operation& operation : operations()) {
        const LogCapture log(2);
        EXPECT_EQ(operation.run(), TAVO_FAILURE) << operation.name;
        EXPECT_FALSE(operation.done()) << operation.name;
        EXPECT_TRUE(logged_exactly(
            log.lines(), {{1, kThreadTag, "Mutex lock failed. Error=22\n"}, {1, kTag, "Mutex lock failed \n"}}));
    }
}

TEST_F(TimerMutexFailure, OfTheUnlockGivesTheMutexsStatusAndKeepsTheChange) {
    const PlatformHook hook(
        kLibrary, "pthread_mutex_unlock", +[](pthread_mutex_t* mutex) {
            pthread_mutex_unlock(mutex);
            return EPERM;
        });
    for (const Operation& operation : operations()) {
        const LogCapture log(2);
        EXPECT_EQ(operation.run(), TAVO_FAILURE) << operation.name;
        EXPECT_TRUE(operation.done()) << operation.name;
        EXPECT_TRUE(logged_exactly(
            log.lines(), {{1, kThreadTag, "Mutex unlock failed. Error=1\n"}, {1, kTag, "Mutex unlock failed \n"}}));
    }
}

}  // namespace

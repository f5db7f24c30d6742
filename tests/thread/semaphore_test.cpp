#include "tavo_osal/semaphore.h"

#include <gtest/gtest.h>
#include <pthread.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cstdio>
#include <ctime>
#include <limits>
#include <string>
#include <thread>

#include "asleep.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::Bedside;
using tavo::test::ExpectedLine;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kTag[] = "TAVO_OSAL";
const ExpectedLine kEntered{6, kTag, "++Entered \n"};
const ExpectedLine kExiting{6, kTag, "--Exiting \n"};
const ExpectedLine kInvalid{1, kTag, "Invalid argument passed \n"};

ExpectedLine address_line(const void* address) {
    char text[64];
    snprintf(text, sizeof text, "pvSemaphore : %p \n", address);
    return {5, kTag, text};
}

class Semaphore : public testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(tavo_osal_semaphore_create(&semaphore_, 0, 0), TAVO_SUCCESS); }
    void TearDown() override { EXPECT_EQ(tavo_osal_semaphore_destroy(&semaphore_), TAVO_SUCCESS); }

    int value() {
        int value = -1;
        EXPECT_EQ(sem_getvalue(&semaphore_, &value), 0);
        return value;
    }

    sem_t semaphore_;
};

uint64_t now_ms() {
    timespec now = {};
    clock_gettime(CLOCK_REALTIME, &now);
    return static_cast<uint64_t>(now.tv_sec) * 1000 + static_cast<uint64_t>(now.tv_nsec) / 1000000;
}

TEST_F(Semaphore, CreateGivesTheInitialValueAndLogsNothing) {
    const LogCapture log;
    sem_t semaphore;
    EXPECT_EQ(tavo_osal_semaphore_create(&semaphore, 0, 3), TAVO_SUCCESS);
    int value = 0;
    EXPECT_EQ(sem_getvalue(&semaphore, &value), 0);
    EXPECT_EQ(value, 3);
    EXPECT_EQ(sem_destroy(&semaphore), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(Semaphore, CreateReportsAValueThatIsTooLarge) {
    const LogCapture log;
    sem_t semaphore;
    EXPECT_EQ(tavo_osal_semaphore_create(&semaphore, 0, UINT32_MAX), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Creation of semaphore failed with errno 22\n"}}));
}

TEST_F(Semaphore, PostAndWaitCountUpAndDown) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_semaphore_post(&semaphore_), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_semaphore_post(&semaphore_), TAVO_SUCCESS);
    EXPECT_EQ(value(), 2);
    EXPECT_EQ(tavo_osal_semaphore_wait(&semaphore_), TAVO_SUCCESS);
    EXPECT_EQ(value(), 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(Semaphore, WaitSleepsUntilAPost) {
    Bedside bedside;
    std::thread waiter([&] {
        bedside.going_to_sleep();
        EXPECT_EQ(tavo_osal_semaphore_wait(&semaphore_), TAVO_SUCCESS);
    });
    bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_semaphore_post(&semaphore_), TAVO_SUCCESS);
    waiter.join();
}

TEST_F(Semaphore, WaitsAreEndedByASignalAndNotRestarted) {
    struct sigaction action = {};
    action.sa_handler = [](int) {};
    sigaction(SIGUSR1, &action, nullptr);
    const LogCapture log;
    Bedside bedside;
    std::thread waiter([&] {
        bedside.going_to_sleep();
        EXPECT_EQ(tavo_osal_semaphore_wait(&semaphore_), TAVO_FAILURE);
        bedside.going_to_sleep();
        EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, now_ms() + 60000), TAVO_FAILURE);
    });
    bedside.wait_until_asleep();
    pthread_kill(waiter.native_handle(), SIGUSR1);
    bedside.wait_until_asleep();
    pthread_kill(waiter.native_handle(), SIGUSR1);
    waiter.join();
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Semaphore lock failed with errno 4\n"},
                                             {1, kTag, "Semaphore timewait failed with errno 4\n"}}));
}

TEST_F(Semaphore, TimedWaitTakesACountWhateverTheDeadline) {
    ASSERT_EQ(tavo_osal_semaphore_post(&semaphore_), TAVO_SUCCESS);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, 0), TAVO_SUCCESS);
    EXPECT_EQ(value(), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {}));
}

TEST_F(Semaphore, TimedWaitTakesAPointInTimeSoThatSmallValuesAreLongPast) {
    const LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, 0), TAVO_SEMAPHORE_TIMEOUT);
    EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, 60000), TAVO_SEMAPHORE_TIMEOUT);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(30));
    const ExpectedLine line{1, kTag, "Semaphore timewait failed with errno 110\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
}

TEST_F(Semaphore, TimedWaitWaitsForItsPointInTime) {
    const LogCapture log(0);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, now_ms() + 2000), TAVO_SEMAPHORE_TIMEOUT);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(1900));
}

TEST_F(Semaphore, TimedWaitConvertsTheDeadlineFieldByField) {
    static timespec deadline;
    const PlatformHook hook(
        kLibrary, "sem_timedwait", +[](sem_t*, const timespec* given) {
            deadline = *given;
            return 0;
        });
    EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, 1700000000999ULL), TAVO_SUCCESS);
    EXPECT_EQ(deadline.tv_sec, 1700000000);
    EXPECT_EQ(deadline.tv_nsec, 999000000L);
    EXPECT_EQ(tavo_osal_semaphore_timedwait(&semaphore_, UINT64_MAX), TAVO_SUCCESS);
    EXPECT_EQ(deadline.tv_sec, std::min<int64_t>(UINT64_MAX / 1000, std::numeric_limits<time_t>::max()));
}

TEST_F(Semaphore, PostReportsACountThatIsTooLarge) {
    sem_t semaphore;
    ASSERT_EQ(sem_init(&semaphore, 0, SEM_VALUE_MAX), 0);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_semaphore_post(&semaphore), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Semaphore unlock failed with errno 75\n"}}));
    EXPECT_EQ(sem_destroy(&semaphore), 0);
}

TEST_F(Semaphore, GetValueReadsTheCountAndTracesBothAddresses) {
    ASSERT_EQ(tavo_osal_semaphore_post(&semaphore_), TAVO_SUCCESS);
    const LogCapture log;
    int count = -1;
    EXPECT_EQ(tavo_osal_semaphore_get_value(&semaphore_, &count), TAVO_SUCCESS);
    EXPECT_EQ(count, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered, address_line(&semaphore_), address_line(&count), kExiting}));
}

TEST_F(Semaphore, GetValueRefusesNullAddressesAfterTracingThem) {
    const LogCapture log;
    int count = 7;
    EXPECT_EQ(tavo_osal_semaphore_get_value(&semaphore_, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_osal_semaphore_get_value(nullptr, &count), TAVO_INVALID_PARAM);
    EXPECT_EQ(count, 7);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {kEntered, address_line(&semaphore_), address_line(nullptr), kInvalid, kExiting,
                                     kEntered, address_line(nullptr), address_line(&count), kInvalid, kExiting}));
}

TEST_F(Semaphore, GetValueReportsThePlatformsErrorInHexadecimal) {
    const LogCapture log(4);
    const PlatformHook hook(
        kLibrary, "sem_getvalue", +[](sem_t*, int*) {
            errno = EINVAL;
            return -1;
        });
    int count = 0;
    EXPECT_EQ(tavo_osal_semaphore_get_value(&semaphore_, &count), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Failed to get semaphore value , errno : 0x16.\n"}}));
}

TEST_F(Semaphore, TryWaitTakesACountOrFailsAndTraces) {
    ASSERT_EQ(tavo_osal_semaphore_post(&semaphore_), TAVO_SUCCESS);
    const LogCapture log;
    EXPECT_EQ(tavo_osal_semaphore_trywait(&semaphore_), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_semaphore_trywait(&semaphore_), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_semaphore_trywait(nullptr), TAVO_INVALID_PARAM);
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered,
                                             kExiting,
                                             kEntered,
                                             {1, kTag, "sem_trywait failed , errno : 0xb.\n"},
                                             kExiting,
                                             kEntered,
                                             kInvalid,
                                             kExiting}));
}

TEST_F(Semaphore, DestroyTracesRefusesNullAndReportsThePlatformsError) {
    const LogCapture log;
    sem_t semaphore;
    ASSERT_EQ(tavo_osal_semaphore_create(&semaphore, 0, 0), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_semaphore_destroy(&semaphore), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_semaphore_destroy(nullptr), TAVO_INVALID_PARAM);
    {
        const PlatformHook hook(
            kLibrary, "sem_destroy", +[](sem_t*) {
                errno = EBUSY;
                return -1;
            });
        EXPECT_EQ(tavo_osal_semaphore_destroy(&semaphore_), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {kEntered,
                                             kExiting,
                                             kEntered,
                                             kInvalid,
                                             kExiting,
                                             kEntered,
                                             {1, kTag, "sem_destroy failed , errno : 0x10.\n"},
                                             kExiting}));
}

TEST_F(Semaphore, WithTheSharedFlagItWorksAcrossProcesses) {
    void* memory = mmap(nullptr, sizeof(sem_t), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(memory, MAP_FAILED);
    auto* shared = static_cast<sem_t*>(memory);
    ASSERT_EQ(tavo_osal_semaphore_create(shared, 1, 0), TAVO_SUCCESS);
    const pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) _exit(tavo_osal_semaphore_post(shared) == TAVO_SUCCESS ? 0 : 1);
    EXPECT_EQ(tavo_osal_semaphore_wait(shared), TAVO_SUCCESS);
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(tavo_osal_semaphore_destroy(shared), TAVO_SUCCESS);
    munmap(memory, sizeof(sem_t));
}

}  // namespace

#include "tavo_osal/ipc_semaphore.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <climits>
#include <cstdio>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "ipc/ipc_semaphore_test.h"
#include "support/log_capture.h"
#include "support/process.h"
#include "tavo_osal/thread.h"
#include "thread/asleep.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::count_of;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::open_semaphore;
using tavo::test::Process;
using tavo::test::semaphore_of;
using tavo::test::status_of;

constexpr auto& kTag = tavo::test::kSemaphoreTag;
constexpr auto& kPath = tavo::test::kSemaphoreFile;
constexpr TAVO_INT64 kUntouched = 0x5A5A5A5A;

std::string pointer_text(TAVO_INT64 handle) {
    char text[32];
    snprintf(text, sizeof text, "%p", static_cast<void*>(semaphore_of(handle)));
    return text;
}

TEST(IpcSemaphoreKeyCreate, DoesNothing) {
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_key_create(), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
    EXPECT_EQ(access(kPath, F_OK), -1);
}

TEST(IpcSemaphore, IsMadeInAFileNamedByItsKeyWithACountOfOne) {
    const mode_t mask = umask(077);
    const LogCapture log;
    const TAVO_INT64 handle = open_semaphore();
    umask(mask);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {4, kTag, "Semaphore created " + pointer_text(handle) + " \n"}}));
    EXPECT_EQ(count_of(handle), 1);
    const struct stat status = status_of(kPath);
    EXPECT_EQ(status.st_size, static_cast<off_t>(sizeof(sem_t)));
    EXPECT_EQ(status.st_mode & 07777, 0775U);
    EXPECT_EQ(tavo_semaphore_delete(handle), TAVO_SUCCESS);
}

TEST(IpcSemaphore, TakesKeysAsUnsignedNumbers) {
    open_semaphore(0);
    open_semaphore(UINT32_MAX);
    EXPECT_TRUE(S_ISREG(status_of("/sdcard/0").st_mode));
    EXPECT_TRUE(S_ISREG(status_of("/sdcard/4294967295").st_mode));
}

TEST(IpcSemaphore, AcquiresAndReleasesWithoutALine) {
    const TAVO_INT64 handle = open_semaphore();
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_of(handle), 0);
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_of(handle), 1);
    EXPECT_TRUE(log.lines().empty());
}

TEST(IpcSemaphore, IsOneForAllMappingsOfAProcess) {
    const TAVO_INT64 first = open_semaphore();
    const TAVO_INT64 second = open_semaphore();
    EXPECT_NE(first, second);
    EXPECT_EQ(tavo_semaphore_acquire(first), TAVO_SUCCESS);
    EXPECT_EQ(count_of(second), 0);
    EXPECT_EQ(tavo_semaphore_release(second), TAVO_SUCCESS);
    EXPECT_EQ(count_of(first), 1);
}

TEST_ROLE(acquirer) {
    const TAVO_INT64 handle = open_semaphore();
    puts("ready");
    if (tavo_semaphore_acquire(handle) != TAVO_SUCCESS) return 1;
    std::ofstream("/sdcard/acquired") << "yes";
    puts("acquired");
    getchar();
    return tavo_semaphore_release(handle);
}

TEST(IpcSemaphore, BlocksAnotherProcessUntilItIsReleased) {
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    Process other = Process::start("acquirer");
    EXPECT_EQ(other.read_line(), "ready");
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    EXPECT_NE(access("/sdcard/acquired", F_OK), 0);
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(other.read_line(), "acquired");
    EXPECT_EQ(count_of(handle), 0);
    other.write_line("");
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    EXPECT_EQ(other.wait(), 0);
}

TEST(IpcSemaphore, ReusesAFileLeftBehindWithTheCountItHolds) {
    Process earlier = Process::start("acquirer");
    EXPECT_EQ(earlier.read_line(), "ready");
    EXPECT_EQ(earlier.read_line(), "acquired");
    earlier.kill(SIGKILL);
    EXPECT_EQ(earlier.wait(), -SIGKILL);

    const struct stat before = status_of(kPath);
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(count_of(handle), 0);
    EXPECT_EQ(status_of(kPath).st_ino, before.st_ino);
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(tavo_semaphore_delete(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_of(open_semaphore()), 2);
}

TEST(IpcSemaphore, DeleteUnmapsAndLeavesTheFileAndTheCount) {
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_mappings(0, kPath), 1U);
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_delete(handle), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
    EXPECT_EQ(count_mappings(0, kPath), 0U);
    EXPECT_EQ(status_of(kPath).st_size, static_cast<off_t>(sizeof(sem_t)));
    EXPECT_EQ(count_of(open_semaphore()), 0);
}

TEST(IpcSemaphore, DeleteOfNothingSucceeds) {
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_delete(0), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines().empty());
}

TEST(IpcSemaphore, DeleteReportsWhatCannotBeUnmapped) {
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_delete(open_semaphore() + 1), TAVO_SEM_DELETE_FAILED);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_TRUE(logged_exactly({log.lines().back()}, {{1, kTag, "Deleting the semaphore failed. errno is 0x16.\n"}}));
}

TEST(IpcSemaphore, HoldsNoDescriptor) {
    const size_t before = count_descriptors();
    const TAVO_INT64 made = open_semaphore();
    const TAVO_INT64 found = open_semaphore();
    TAVO_INT64 failed = kUntouched;
    mkdir("/sdcard/10", 0777);
    EXPECT_EQ(tavo_semaphore_init(10, &failed), TAVO_FAILURE);
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_EQ(tavo_semaphore_delete(made), TAVO_SUCCESS);
    EXPECT_EQ(tavo_semaphore_delete(found), TAVO_SUCCESS);
}

TEST(IpcSemaphore, CountsAnInterruptionAsAFailure) {
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    struct sigaction action = {};
    action.sa_handler = [](int) {};
    ASSERT_EQ(sigaction(SIGALRM, &action, nullptr), 0);
    const timeval interval = {0, 20000};
    const itimerval timer = {interval, interval};
    const LogCapture log;
    ASSERT_EQ(setitimer(ITIMER_REAL, &timer, nullptr), 0);
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_FAILURE);
    EXPECT_EQ(errno, EINTR);
    const itimerval off = {};
    setitimer(ITIMER_REAL, &off, nullptr);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Semaphore Wait failed !"}}));
    EXPECT_EQ(count_of(handle), 0);
}

TEST(IpcSemaphore, ReportsAReleaseThatWouldOverflow) {
    const TAVO_INT64 handle = open_semaphore();
    ASSERT_EQ(sem_init(semaphore_of(handle), 1, SEM_VALUE_MAX), 0);
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_FAILURE);
    EXPECT_EQ(errno, EOVERFLOW);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Release failed !"}}));
}

TEST(IpcSemaphore, FailsForHandlesThatAreNone) {
    std::vector<TAVO_INT64> handles = {0, -1};
    // Callers may have kept the same in 32 unsigned bits, or may pass what is no address at all.
    if (sizeof(void*) == 4) handles.insert(handles.end(), {0xFFFFFFFF, 0x100000000});
    for (const TAVO_INT64 handle : handles) {
        const LogCapture log;
        errno = 0;
        EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_FAILURE);
        EXPECT_EQ(errno, EINVAL);
        EXPECT_EQ(tavo_semaphore_release(handle), TAVO_FAILURE);
        EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Semaphore Wait failed !"}, {1, kTag, "Release failed !"}}));
    }
}

struct Waiter {
    const TAVO_INT64 handle;
    tavo::test::Bedside bedside;
};

TEST(IpcSemaphore, LetsAThreadThatWaitsBeCancelled) {
    Waiter waiter = {open_semaphore(), {}};
    EXPECT_EQ(tavo_semaphore_acquire(waiter.handle), TAVO_SUCCESS);
    const auto wait = [](void* opaque) -> void* {
        auto* self = static_cast<Waiter*>(opaque);
        self->bedside.going_to_sleep();
        tavo_semaphore_acquire(self->handle);
        return opaque;
    };
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, wait, &waiter), TAVO_SUCCESS);
    waiter.bedside.wait_until_asleep();
    EXPECT_EQ(tavo_osal_thread_cancel(thread), TAVO_SUCCESS);
    void* result = &waiter;
    EXPECT_EQ(pthread_join(thread, &result), 0);
    EXPECT_EQ(result, nullptr);
    EXPECT_EQ(tavo_semaphore_release(waiter.handle), TAVO_SUCCESS);
    EXPECT_EQ(count_of(waiter.handle), 1);
}

}  // namespace

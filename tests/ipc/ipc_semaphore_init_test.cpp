#include <fcntl.h>
#include <gtest/gtest.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>

#include "ipc/ipc_semaphore_test.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/ipc_semaphore.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::count_of;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::open_semaphore;
using tavo::test::PlatformHook;
using tavo::test::semaphore_of;
using tavo::test::status_of;

constexpr auto& kTag = tavo::test::kSemaphoreTag;
constexpr auto kKey = tavo::test::kSemaphoreKey;
constexpr auto& kPath = tavo::test::kSemaphoreFile;
constexpr TAVO_INT64 kUntouched = 0x5A5A5A5A;

std::string pointer_text(TAVO_INT64 handle) {
    char text[32];
    snprintf(text, sizeof text, "%p", static_cast<void*>(semaphore_of(handle)));
    return text;
}

TEST(IpcSemaphoreInit, RefusesANullPointer) {
    const LogCapture log;
    EXPECT_EQ(tavo_semaphore_init(kKey, nullptr), TAVO_INVALID_PARAM);
    EXPECT_NE(access(kPath, F_OK), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"}, {1, kTag, "Invalid parameter\n"}}));
}

// The call fails with this message, and hands nothing out.
void expect_failure(const std::string& message) {
    const LogCapture log;
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(tavo_semaphore_init(kKey, &handle), TAVO_FAILURE);
    EXPECT_EQ(handle, kUntouched);
    EXPECT_EQ(count_mappings(0, kPath), 0U);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"}, {1, kTag, message}}));
}

constexpr char kOpenFailed[] = "Error in open shm_file /sdcard/4660\n";
constexpr char kMakeFailed[] = "Failed to create Semaphore\n";

TEST(IpcSemaphoreInit, ReportsAFileThatCannotBeOpened) {
    ASSERT_EQ(mkdir(kPath, 0777), 0);
    expect_failure(kOpenFailed);
}

int fail_to_create(const char* path, int flags, ...) {
    if ((flags & O_CREAT) == 0) return open(path, flags);
    errno = EROFS;
    return -1;
}

TEST(IpcSemaphoreInit, ReportsAFileThatCannotBeCreated) {
    const PlatformHook hook("libtavoosal.so", "open", fail_to_create);
    expect_failure(kOpenFailed);
}

TEST(IpcSemaphoreInit, RefusesWhatIsNoFile) {
    ASSERT_EQ(mkfifo(kPath, 0777), 0);
    expect_failure(kOpenFailed);
}

class ForeignFile : public testing::TestWithParam<size_t> {};

TEST_P(ForeignFile, IsRefusedAndLeftAlone) {
    const std::string contents(GetParam(), 'x');
    std::ofstream(kPath) << contents;
    expect_failure(kOpenFailed);
    std::ifstream file(kPath);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), contents);
}

INSTANTIATE_TEST_SUITE_P(Lengths, ForeignFile,
                         testing::Values(1, sizeof(sem_t) - 1, sizeof(sem_t) + 2, 2 * sizeof(sem_t), 4096));

int g_opens;

int miss_the_file_at_first(const char* path, int flags, ...) {
    if (++g_opens > 1) return open(path, flags, 0666);
    errno = ENOENT;
    return -1;
}

TEST(IpcSemaphoreInit, OpensWhatTheWinnerOfARaceCreated) {
    const TAVO_INT64 winner = open_semaphore();
    EXPECT_EQ(tavo_semaphore_acquire(winner), TAVO_SUCCESS);
    g_opens = 0;
    const PlatformHook hook("libtavoosal.so", "open", miss_the_file_at_first);
    const TAVO_INT64 loser = open_semaphore();
    EXPECT_EQ(g_opens, 3);
    EXPECT_EQ(count_of(loser), 0);
}

TEST(IpcSemaphoreInit, ReportsAFailedMappingOnCreateAndTheNextCallMakesIt) {
    {
        const PlatformHook hook(
            "libtavoosal.so", "mmap", +[](void*, size_t, int, int, int, off_t) {
                errno = ENOMEM;
                return MAP_FAILED;
            });
        expect_failure(kMakeFailed);
    }
    EXPECT_TRUE(S_ISREG(status_of(kPath).st_mode));
    EXPECT_EQ(count_of(open_semaphore()), 1);
}

TEST(IpcSemaphoreInit, ReportsAFailedInitialisationAndTheNextCallMakesIt) {
    {
        const PlatformHook hook(
            "libtavoosal.so", "sem_init", +[](sem_t*, int, unsigned) {
                errno = ENOSPC;
                return -1;
            });
        const size_t descriptors = count_descriptors();
        expect_failure(kMakeFailed);
        EXPECT_EQ(count_descriptors(), descriptors);
    }
    EXPECT_TRUE(S_ISREG(status_of(kPath).st_mode));
    EXPECT_EQ(count_of(open_semaphore()), 1);
}

TEST(IpcSemaphoreInit, AsksForASharedSemaphoreOfOne) {
    static int shared;
    static unsigned count;
    const PlatformHook hook(
        "libtavoosal.so", "sem_init", +[](sem_t* semaphore, int is_shared, unsigned value) {
            shared = is_shared;
            count = value;
            return sem_init(semaphore, is_shared, value);
        });
    open_semaphore();
    EXPECT_EQ(shared, 1);
    EXPECT_EQ(count, 1U);
}

TEST(IpcSemaphoreInit, LeavesTheFileUnlocked) {
    const TAVO_INT64 made = open_semaphore();
    const int file = open(kPath, O_RDWR | O_CLOEXEC);
    ASSERT_GE(file, 0);
    EXPECT_EQ(flock(file, LOCK_EX | LOCK_NB), 0);
    close(file);
    EXPECT_EQ(tavo_semaphore_delete(made), TAVO_SUCCESS);
}

class FullDisk : public testing::TestWithParam<rlim_t> {};

TEST_P(FullDisk, IsReportedAndTheNextCallMakesTheSemaphore) {
    signal(SIGXFSZ, SIG_IGN);
    rlimit before = {};
    ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &before), 0);
    const rlimit little = {GetParam(), before.rlim_max};
    ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &little), 0);
    expect_failure(kMakeFailed);
    ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &before), 0);
    EXPECT_EQ(status_of(kPath).st_size, 0);
    EXPECT_EQ(count_of(open_semaphore()), 1);
}

INSTANTIATE_TEST_SUITE_P(WithRoomFor, FullDisk, testing::Values(0, 1, sizeof(sem_t)));

TEST(IpcSemaphoreInit, ReportsAFileThatCannotBeFinished) {
    {
        const PlatformHook hook(
            "libtavoosal.so", "ftruncate", +[](int, off_t) {
                errno = EIO;
                return -1;
            });
        expect_failure(kMakeFailed);
    }
    EXPECT_EQ(count_of(open_semaphore()), 1);
}

TEST(IpcSemaphoreInit, DoesNotLookAtTheMappingOfAnExistingFile) {
    open_semaphore();
    const PlatformHook hook(
        "libtavoosal.so", "mmap", +[](void*, size_t, int, int, int, off_t) {
            errno = ENOMEM;
            return MAP_FAILED;
        });
    const LogCapture log;
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(tavo_semaphore_init(kKey, &handle), TAVO_SUCCESS);
    EXPECT_EQ(handle, -1);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{6, kTag, "++Entered\n"}, {4, kTag, "Semaphore created " + pointer_text(-1) + " \n"}}));
    EXPECT_EQ(tavo_semaphore_delete(handle), TAVO_SEM_DELETE_FAILED);
}

TEST(IpcSemaphoreInit, WorksWhereFilesCannotBeLocked) {
    const PlatformHook hook(
        "libtavoosal.so", "flock", +[](int, int) {
            errno = ENOLCK;
            return -1;
        });
    const TAVO_INT64 made = open_semaphore();
    EXPECT_EQ(count_of(made), 1);
    EXPECT_EQ(tavo_semaphore_acquire(made), TAVO_SUCCESS);
    EXPECT_EQ(count_of(open_semaphore()), 0);
}

}  // namespace

#include "tavo_osal/ipc_semaphore.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <climits>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <thread>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;
using tavo::test::Process;

constexpr char kTag[] = "TAVO_OSAL";
constexpr uint32_t kKey = 4660;
constexpr char kPath[] = "/sdcard/4660";
constexpr TAVO_INT64 kUntouched = 0x5A5A5A5A;

TAVO_INT64 open_semaphore(uint32_t key = kKey) {
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(tavo_semaphore_init(key, &handle), TAVO_SUCCESS);
    return handle;
}

sem_t* semaphore_of(TAVO_INT64 handle) { return reinterpret_cast<sem_t*>(static_cast<intptr_t>(handle)); }

int count_of(TAVO_INT64 handle) {
    int count = -1;
    EXPECT_EQ(sem_getvalue(semaphore_of(handle), &count), 0);
    return count;
}

struct stat status_of(const char* path) {
    struct stat status = {};
    EXPECT_EQ(stat(path, &status), 0) << path;
    return status;
}

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
    const LogCapture log;
    for (const TAVO_INT64 handle : {TAVO_INT64{0}, TAVO_INT64{-1}}) {
        errno = 0;
        EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_FAILURE);
        EXPECT_EQ(errno, EINVAL);
        EXPECT_EQ(tavo_semaphore_release(handle), TAVO_FAILURE);
    }
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Semaphore Wait failed !"},
                                             {1, kTag, "Release failed !"},
                                             {1, kTag, "Semaphore Wait failed !"},
                                             {1, kTag, "Release failed !"}}));
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

TEST(IpcSemaphoreInit, ReportsAFullDiskInsteadOfMappingIt) {
    signal(SIGXFSZ, SIG_IGN);
    rlimit before = {};
    ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &before), 0);
    const rlimit none = {0, before.rlim_max};
    ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &none), 0);
    expect_failure(kMakeFailed);
    ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &before), 0);
    EXPECT_EQ(count_of(open_semaphore()), 1);
}

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

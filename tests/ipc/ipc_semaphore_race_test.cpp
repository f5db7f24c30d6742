// Several processes that make one semaphore at once, and creators that never come to the end.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <sched.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include "ipc/ipc_semaphore_test.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/thread.h"
#include "thread/asleep.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::count_of;
using tavo::test::expect_working;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::open_semaphore;
using tavo::test::PlatformHook;
using tavo::test::Process;
using tavo::test::status_of;

constexpr auto kKey = tavo::test::kSemaphoreKey;
constexpr auto& kPath = tavo::test::kSemaphoreFile;

// Replacements for a platform call that end the process in front of it or behind it.
template <auto Call>
struct Killing;

template <typename Result, typename... Arguments, bool kNoexcept, Result (*Call)(Arguments...) noexcept(kNoexcept)>
struct Killing<Call> {
    static Result before(Arguments... arguments) {
        kill(getpid(), SIGKILL);
        return Call(arguments...);
    }
    static Result after(Arguments... arguments) {
        const Result result = Call(arguments...);
        kill(getpid(), SIGKILL);
        return result;
    }
};

int create_and_be_killed(const char* path, int flags, ...) {
    const int fd = open(path, flags, 0666);
    if ((flags & O_CREAT) != 0) kill(getpid(), SIGKILL);
    return fd;
}

struct KillPoint {
    const char* name;
    const char* function;
    void* replacement;
};

template <typename Function>
KillPoint kill_point(const char* name, const char* function, Function* replacement) {
    return {name, function, reinterpret_cast<void*>(replacement)};
}

const std::vector<KillPoint>& kill_points() {
    static const std::vector<KillPoint> points = {
        kill_point("AfterOpen", "open", &create_and_be_killed),
        kill_point("BeforeFlock", "flock", &Killing<&flock>::before),
        kill_point("AfterFlock", "flock", &Killing<&flock>::after),
        kill_point("AfterFchmod", "fchmod", &Killing<&fchmod>::after),
        kill_point("BeforePwrite", "pwrite", &Killing<&pwrite>::before),
        kill_point("AfterPwrite", "pwrite", &Killing<&pwrite>::after),
        kill_point("AfterMmap", "mmap", &Killing<&mmap>::after),
        kill_point("BeforeSemInit", "sem_init", &Killing<&sem_init>::before),
        kill_point("AfterSemInit", "sem_init", &Killing<&sem_init>::after),
        kill_point("BeforeFtruncate", "ftruncate", &Killing<&ftruncate>::before),
        kill_point("AfterFtruncate", "ftruncate", &Killing<&ftruncate>::after),
        kill_point("BeforeClose", "close", &Killing<&close>::before),
    };
    return points;
}

TEST_ROLE(killed_creator) {
    const KillPoint& point = kill_points()[std::stoul(arguments[0])];
    const PlatformHook hook("libtavoosal.so", point.function, point.replacement);
    open_semaphore();
    return 0;
}

class KilledCreator : public testing::TestWithParam<size_t> {};

TEST_P(KilledCreator, LeavesAFileThatTheNextOneFinishesAtOnce) {
    Process creator = Process::start("killed_creator", {std::to_string(GetParam())});
    ASSERT_EQ(creator.wait(), -SIGKILL);
    ASSERT_EQ(access(kPath, F_OK), 0);

    // Nothing waits for a process that is gone, so not even the loop that waits may sleep.
    static bool slept;
    slept = false;
    const PlatformHook hook(
        "libtavoosal.so", "nanosleep", +[](const timespec*, timespec*) {
            slept = true;
            return 0;
        });
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_FALSE(slept);
    expect_working(handle);
    struct stat status = {};
    ASSERT_EQ(stat(kPath, &status), 0);
    EXPECT_EQ(status.st_size, static_cast<off_t>(sizeof(sem_t)));
    EXPECT_EQ(status.st_mode & 07777, 0775U);
    EXPECT_EQ(count_of(open_semaphore()), 1);
}

INSTANTIATE_TEST_SUITE_P(At, KilledCreator, testing::Range(size_t{0}, kill_points().size()),
                         [](const auto& test) { return std::string(kill_points()[test.param].name); });

// Says where it is and goes on with the next line from its parent.
void stop_here() {
    puts("stopped");
    getchar();
}

// Replacements that stop the creator in front of a call, the first time only.
struct StopPoint {
    const char* function;
    void* replacement;
};

const std::map<std::string, StopPoint>& stop_points() {
    static bool stopped = false;
    static const std::map<std::string, StopPoint> points = {
        {"lock", {"flock", reinterpret_cast<void*>(+[](int fd, int operation) {
                      if (!std::exchange(stopped, true)) stop_here();
                      return flock(fd, operation);
                  })}},
        {"initialisation", {"sem_init", reinterpret_cast<void*>(+[](sem_t* semaphore, int shared, unsigned value) {
                                stop_here();
                                return sem_init(semaphore, shared, value);
                            })}},
    };
    return points;
}

TEST_ROLE(stopped_creator) {
    const StopPoint& point = stop_points().at(arguments[0]);
    const PlatformHook hook("libtavoosal.so", point.function, point.replacement);
    const TAVO_INT64 handle = open_semaphore();
    printf("%d\n", count_of(handle));
    return 0;
}

TEST_ROLE(opener) {
    puts("opening");
    const TAVO_INT64 handle = open_semaphore();
    printf("%d\n", count_of(handle));
    return 0;
}

TEST(IpcSemaphoreRace, AnOpenerWaitsForACreatorThatIsStillAtIt) {
    Process creator = Process::start("stopped_creator", {"initialisation"});
    ASSERT_EQ(creator.read_line(), "stopped");
    Process opener = Process::start("opener");
    ASSERT_EQ(opener.read_line(), "opening");
    creator.write_line("");
    EXPECT_EQ(creator.read_line(), "1");
    EXPECT_EQ(opener.read_line(), "1");
    EXPECT_EQ(creator.wait(), 0);
    EXPECT_EQ(opener.wait(), 0);
    expect_working(open_semaphore());
}

TEST(IpcSemaphoreRace, OpenersThatWaitTakeOverFromACreatorThatIsKilled) {
    Process creator = Process::start("stopped_creator", {"initialisation"});
    ASSERT_EQ(creator.read_line(), "stopped");
    Process first = Process::start("opener");
    Process second = Process::start("opener");
    ASSERT_EQ(first.read_line(), "opening");
    ASSERT_EQ(second.read_line(), "opening");
    creator.kill(SIGKILL);
    EXPECT_EQ(creator.wait(), -SIGKILL);
    EXPECT_EQ(first.read_line(), "1");
    EXPECT_EQ(second.read_line(), "1");
    EXPECT_EQ(first.wait(), 0);
    EXPECT_EQ(second.wait(), 0);
    expect_working(open_semaphore());
}

TEST(IpcSemaphoreRace, AnOpenerGivesACreatorUpThatStaysStopped) {
    Process creator = Process::start("stopped_creator", {"initialisation"});
    ASSERT_EQ(creator.read_line(), "stopped");
    LogCapture log;
    TAVO_INT64 handle = 42;
    EXPECT_EQ(tavo_semaphore_init(kKey, &handle), TAVO_FAILURE);
    EXPECT_EQ(handle, 42);
    EXPECT_TRUE(logged(log.lines(), {1, "TAVO_OSAL", "Error in open shm_file /sdcard/4660\n"}));

    creator.kill(SIGKILL);
    EXPECT_EQ(creator.wait(), -SIGKILL);
    expect_working(open_semaphore());
}

TEST(IpcSemaphoreRace, AThreadThatIsCancelledWhileItCreatesFinishesFirst) {
    const size_t descriptors = count_descriptors();
    const PlatformHook hook(
        "libtavoosal.so", "sem_init", +[](sem_t* semaphore, int shared, unsigned value) {
            tavo_osal_thread_cancel(pthread_self());
            return sem_init(semaphore, shared, value);
        });
    static bool returned;
    returned = false;
    const auto create = [](void*) -> void* {
        TAVO_INT64 handle = 0;
        tavo_semaphore_init(kKey, &handle);
        returned = true;
        return nullptr;
    };
    pthread_t thread = {};
    ASSERT_EQ(tavo_osal_thread_create(&thread, create, nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_thread_join(thread), TAVO_SUCCESS);
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(status_of(kPath).st_size, static_cast<off_t>(sizeof(sem_t)));
    // ThreadSanitizer delivers signals late.
    EXPECT_TRUE(!returned || tavo::test::kThreadSanitizer);

    // Another process is not held up by the lock of this one, which lives.
    Process opener = Process::start("opener");
    EXPECT_EQ(opener.read_line(), "opening");
    EXPECT_EQ(opener.read_line(), "1");
}

TEST(IpcSemaphoreRace, ACreatorThatIsOvertakenDoesNotInitialiseAgain) {
    Process creator = Process::start("stopped_creator", {"lock"});
    ASSERT_EQ(creator.read_line(), "stopped");
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    creator.write_line("");
    EXPECT_EQ(creator.read_line(), "0");
    EXPECT_EQ(creator.wait(), 0);
    EXPECT_EQ(count_of(handle), 0);
}

constexpr unsigned kRacers = 8;
constexpr uint32_t kRounds = 200;

// What the racers share, in a file of their own.
struct Track {
    pthread_barrier_t barrier;
    std::atomic<unsigned> failures;
    std::atomic<int> inside;
    unsigned visits;  // counted inside only, where there is one at a time
};

Track& open_track() {
    const int fd = open("/sdcard/track", O_RDWR | O_CREAT | O_CLOEXEC, 0666);
    if (ftruncate(fd, sizeof(Track)) != 0) abort();
    void* track = mmap(nullptr, sizeof(Track), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    close(fd);
    return *static_cast<Track*>(track);
}

TEST_ROLE(racer) {
    Track& track = open_track();
    const bool is_first = arguments[0] == "0";
    const auto check = [&track](bool good) { track.failures += !good; };
    for (uint32_t round = 0; round < kRounds; ++round) {
        TAVO_INT64 handle = 0;
        pthread_barrier_wait(&track.barrier);
        check(tavo_semaphore_init(1000 + round, &handle) == TAVO_SUCCESS);
        check(tavo_semaphore_acquire(handle) == TAVO_SUCCESS);
        check(++track.inside == 1);
        const unsigned visits = track.visits;
        sched_yield();
        track.visits = visits + 1;
        check(--track.inside == 0);
        check(tavo_semaphore_release(handle) == TAVO_SUCCESS);
        pthread_barrier_wait(&track.barrier);
        if (is_first) check(count_of(handle) == 1);
        check(tavo_semaphore_delete(handle) == TAVO_SUCCESS);
    }
    return 0;
}

TEST(IpcSemaphoreRace, EightProcessesInitialiseEachNewKeyExactlyOnce) {
    Track& track = open_track();
    pthread_barrierattr_t attributes;
    pthread_barrierattr_init(&attributes);
    pthread_barrierattr_setpshared(&attributes, PTHREAD_PROCESS_SHARED);
    ASSERT_EQ(pthread_barrier_init(&track.barrier, &attributes, kRacers), 0);
    std::vector<Process> racers;
    for (unsigned i = 0; i < kRacers; ++i) racers.push_back(Process::start("racer", {std::to_string(i)}));
    for (Process& racer : racers) EXPECT_EQ(racer.wait(), 0);
    EXPECT_EQ(track.failures, 0U);
    EXPECT_EQ(track.visits, kRacers * kRounds);
}

}  // namespace

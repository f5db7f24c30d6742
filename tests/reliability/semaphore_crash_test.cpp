// Holders and users of semaphores that are killed. No service is asked, so there is none.
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include <string>
#include <vector>

#include "ipc/ipc_semaphore_test.h"
#include "reliability/crash_point.h"
#include "reliability/peer.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::count_mappings;
using tavo::test::count_of;
using tavo::test::expect_working;
using tavo::test::kDone;
using tavo::test::kSemaphoreFile;
using tavo::test::open_semaphore;
using tavo::test::Peer;
using tavo::test::status_of;
using tavo::test::waits_in;

constexpr char kOpen[] = "semaphore 4660";

TEST(SemaphoreCrash, HolderLeavesTheCountDownUntilSomebodyReleases) {
    Peer holder(kOpen);
    EXPECT_EQ(holder.ask("lock"), kDone);
    Peer waiter(kOpen);
    waiter.tell("lock");
    ASSERT_TRUE(waits_in(waiter.pid(), SYS_futex));
    holder.kill();

    // Nobody releases for it: the one who waits goes on waiting, and who comes anew finds the same count.
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(count_of(handle), 0);
    ASSERT_TRUE(waits_in(waiter.pid(), SYS_futex));
    // Whoever knows better may.
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(waiter.answer(), kDone);
    EXPECT_EQ(count_of(handle), 0);
    EXPECT_EQ(waiter.ask("unlock"), kDone);
    expect_working(handle);
}

TEST(SemaphoreCrash, WaiterTakesNothing) {
    const TAVO_INT64 handle = open_semaphore();
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    Peer waiter(kOpen);
    waiter.tell("lock");
    ASSERT_TRUE(waits_in(waiter.pid(), SYS_futex));
    Peer other(kOpen);
    other.tell("lock");
    ASSERT_TRUE(waits_in(other.pid(), SYS_futex));
    waiter.kill();
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(other.answer(), kDone);
    EXPECT_EQ(other.ask("unlock"), kDone);
    expect_working(handle);
}

TEST(SemaphoreCrash, HolderInFrontOfItsReleaseLeavesTheCountDown) {
    Peer holder(kOpen);
    EXPECT_EQ(holder.ask("lock"), kDone);
    holder.crash("libtavoosal.so sem_post before 1", "unlock");
    EXPECT_EQ(count_of(open_semaphore()), 0);
}

TEST(SemaphoreCrash, HolderBehindItsReleaseLeavesTheCountUp) {
    Peer holder(kOpen);
    EXPECT_EQ(holder.ask("lock"), kDone);
    holder.crash("libtavoosal.so sem_post after 1", "unlock");
    expect_working(open_semaphore());
}

// Those who wait for it find out at once, and one of them makes what it has not.
class CreatorCrash : public testing::TestWithParam<const char*> {};

TEST_P(CreatorCrash, IsReplacedByOneOfThoseWhoWaitForIt) {
    Peer creator;
    creator.stop(GetParam() + std::string(" 1"), kOpen);
    std::vector<Peer> openers(4);
    for (Peer& opener : openers) opener.tell(kOpen);
    creator.kill();
    for (Peer& opener : openers) EXPECT_EQ(opener.answer(), kDone);
    // All of them have the same one.
    EXPECT_EQ(openers[0].ask("lock"), kDone);
    openers[1].tell("lock");
    ASSERT_TRUE(waits_in(openers[1].pid(), SYS_futex));
    EXPECT_EQ(openers[2].ask("unlock"), kDone);
    EXPECT_EQ(openers[1].answer(), kDone);
    EXPECT_EQ(openers[3].ask("unlock"), kDone);
    EXPECT_EQ(status_of(kSemaphoreFile).st_size, static_cast<off_t>(sizeof(sem_t)));
    const size_t descriptors = count_descriptors();
    expect_working(open_semaphore());
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_EQ(count_descriptors(openers[0].pid()), count_descriptors(openers[3].pid()));
    EXPECT_EQ(count_mappings(openers[0].pid(), kSemaphoreFile), 1U);
}

INSTANTIATE_TEST_SUITE_P(At, CreatorCrash,
                         testing::Values("libtavoosal.so flock before", "libtavoosal.so flock after",
                                         "libtavoosal.so mmap after", "libtavoosal.so sem_init after",
                                         "libtavoosal.so ftruncate before", "libtavoosal.so ftruncate after"),
                         [](const auto& test) { return std::to_string(test.index); });

}  // namespace

// tavo sem. Semaphores need no service.
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "support/process.h"
#include "tools/program.h"

namespace {

using tavo::test::failed;
using tavo::test::Running;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::ToolTest;

class Sem : public ToolTest {
protected:
    static std::string count(const char* key = "5") { return tavo({"sem", "get", key}).out; }
};

TEST_F(Sem, InitMakesOneThatIsFree) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_EQ(count(), "1\n");
    EXPECT_EQ(access("/sdcard/5", F_OK), 0);
}

TEST_F(Sem, InitLeavesOneThatIsThereAsItIs) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_EQ(count(), "0\n");
}

TEST_F(Sem, WaitTakesAndPostReleases) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5"})));
    EXPECT_EQ(count(), "0\n");
    EXPECT_TRUE(succeeded(tavo({"sem", "post", "5"})));
    EXPECT_EQ(count(), "1\n");
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5", "--timeout", "30"})));
    EXPECT_EQ(count(), "0\n");
}

TEST_F(Sem, WaitWaits) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5"})));
    EXPECT_TRUE(failed(tavo({"sem", "wait", "5", "-t", "0.05"}), 1, "semaphore 5 was not released in time"));
    EXPECT_TRUE(failed(tavo({"sem", "wait", "5", "-t", "0"}), 1, "semaphore 5 was not released in time"));
    Running waiter({"sem", "wait", "5"});
    EXPECT_TRUE(succeeded(tavo({"sem", "post", "5"})));
    EXPECT_EQ(waiter.wait(), 0);
    EXPECT_EQ(count(), "0\n");
}

TEST_F(Sem, AWaitIsEndedByASignal) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5"})));
    Running waiter({"sem", "wait", "5"});
    waiter.signal(SIGINT);
    EXPECT_EQ(waiter.wait(), -SIGINT);
}

TEST_F(Sem, UnknownKeysAreTold) {
    for (const char* command : {"wait", "post", "get", "destroy"}) {
        EXPECT_TRUE(failed(tavo({"sem", command, "5"}), 1,
                           "there is no semaphore 5 (/sdcard/5): make it with 'tavo sem init 5'"));
    }
    EXPECT_NE(access("/sdcard/5", F_OK), 0);
}

TEST_F(Sem, BadKeysAreMisuse) {
    for (const char* key : {"-1", "five", "4294967296", ""}) {
        EXPECT_TRUE(failed(
            tavo({"sem", "init", "--", key}), 2,
            std::string("'") + key + "' is no key of a semaphore: these are whole numbers from 0 to 4294967295"));
    }
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "0"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "4294967295"})));
    EXPECT_EQ(count("0"), "1\n");
}

TEST_F(Sem, FilesThatHoldNoneAreRefusedAndLeftAlone) {
    std::ofstream("/sdcard/5") << "somebody else's notes";
    constexpr char kForeign[] = "/sdcard/5 holds no semaphore, and is left as it is: take another key";
    for (const char* command : {"init", "wait", "post", "get", "destroy"}) {
        EXPECT_TRUE(failed(tavo({"sem", command, "5"}), 1, kForeign)) << command;
    }
    ASSERT_EQ(mkdir("/sdcard/6", 0700), 0);
    EXPECT_TRUE(failed(tavo({"sem", "destroy", "6"}), 1,
                       "/sdcard/6 holds no semaphore, and is left as it is: take another key"));
}

TEST_F(Sem, AFileThatMustNotBeReadIsTold) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    tavo::test::without_the_rights_of_root();
    ASSERT_EQ(chmod("/sdcard/5", 0), 0);
    for (const char* command : {"init", "wait", "post", "get", "destroy"}) {
        EXPECT_TRUE(
            failed(tavo({"sem", command, "5"}), 1, "cannot read /sdcard/5: Permission denied, or it is out of order"));
    }
    ASSERT_EQ(chmod("/sdcard/5", 0400), 0);
    EXPECT_EQ(count(), "1\n");
    EXPECT_EQ(tavo({"sem", "wait", "5"}).err, "tavo: cannot use semaphore 5 (/sdcard/5): Permission denied\n");
}

TEST_F(Sem, OneThatWasNotFinishedIsFinishedByTheNextUser) {
    std::ofstream("/sdcard/5").flush();
    EXPECT_TRUE(failed(tavo({"sem", "get", "5"}), 1,
                       "semaphore 5 was not finished by whoever made it: 'tavo sem init' does that"));
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5", "--timeout", "0"})));
    EXPECT_EQ(count(), "0\n");
}

TEST_F(Sem, DestroyRemovesTheFile) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "destroy", "5"})));
    EXPECT_NE(access("/sdcard/5", F_OK), 0);
}

TEST_F(Sem, DestroySparesUsersUnlessForced) {
    EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"})));
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5"})));
    Running waiter({"sem", "wait", "5"});
    while (tavo::test::count_mappings(waiter.pid(), "/sdcard/5") == 0) {
    }
    EXPECT_TRUE(failed(tavo({"sem", "destroy", "5"}), 1,
                       "process " + std::to_string(waiter.pid()) +
                           " uses semaphore 5: end it first, or use --force, which leaves it with a semaphore that "
                           "nobody else finds"));
    EXPECT_TRUE(succeeded(tavo({"sem", "destroy", "5", "--force"})));
    EXPECT_NE(access("/sdcard/5", F_OK), 0);
}

TEST_F(Sem, WithoutAVerbIsMisuse) { EXPECT_EQ(tavo({"sem"}).status, 2); }

}  // namespace

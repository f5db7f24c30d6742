// Users of shared memory that are killed.
#include <string>

#include "reliability/service_uses.h"

namespace {

using tavo::test::comes_back_to;
using tavo::test::comes_true;
using tavo::test::count_memory_files;
using tavo::test::Holdings;
using tavo::test::kDone;
using tavo::test::kill_everywhere;
using tavo::test::Peer;
using tavo::test::take_block_uses;

class BlockCrash : public tavo::test::CrashTest {
protected:
    BlockCrash() {
        expect_service();
        EXPECT_TRUE(comes_true([&] { return count_memory_files(server_.pid()) == 0; }));
    }
};

class AcquireCrash : public BlockCrash, public testing::WithParamInterface<const char*> {};

TEST_P(AcquireCrash, AnywhereInAnAcquireLeavesAtMostItsUse) {
    expect_at_most_its_use_left(GetParam(), "acquire 7 100000", [] { return take_block_uses(7); });
}

INSTANTIATE_TEST_SUITE_P(At, AcquireCrash,
                         testing::Values("libbinder.so sendmsg before", "libbinder.so sendmsg after",
                                         "libbinder.so recvmsg before", "libbinder.so recvmsg after",
                                         "libbinder.so mmap before", "libbinder.so mmap after"),
                         [](const auto& test) { return tavo::test::words(test.param); });

struct GivingBack {
    const char* calls;
    const char* command;
};
class ReleaseCrash : public BlockCrash, public testing::WithParamInterface<GivingBack> {};

TEST_P(ReleaseCrash, AnywhereInGivingABlockBackLeavesItToTheOthers) {
    Peer other("acquire 7 100000");
    EXPECT_EQ(other.ask("set 7 65"), kDone);
    const int points = kill_everywhere(GetParam().calls, "acquire 7 100000", GetParam().command, [&] {
        EXPECT_EQ(other.ask("see 7"), "65");
        EXPECT_EQ(count_memory_files(server_.pid()), 1U);
    });
    EXPECT_GE(points, 1);
    // One use of the others', none or one of each that was killed, and none twice; the last client ended by itself.
    EXPECT_EQ(other.ask("release 7"), kDone);
    const int taken = take_block_uses(7);
    EXPECT_GE(taken, 1);
    EXPECT_LE(taken, points + 2);
    expect_service();
}

INSTANTIATE_TEST_SUITE_P(At, ReleaseCrash,
                         testing::Values(GivingBack{"libbinder.so sendmsg before", "delete 7 100000"},
                                         GivingBack{"libbinder.so sendmsg after", "delete 7 100000"},
                                         GivingBack{"libbinder.so recvmsg before", "delete 7 100000"},
                                         GivingBack{"libbinder.so recvmsg after", "delete 7 100000"},
                                         GivingBack{"libbinder.so munmap before", "release 7"},
                                         GivingBack{"libbinder.so munmap after", "release 7"},
                                         GivingBack{"libbinder.so sendmsg before", "release 7"}),
                         [](const auto& test) {
                             return tavo::test::words(std::string(test.param.command).substr(0, 7) + test.param.calls);
                         });

TEST_F(BlockCrash, UserWithABlockMappedLeavesItsContentsAndItsUse) {
    const Holdings server(server_.pid());
    Peer other("acquire 7 100000");
    {
        Peer user("acquire 7 100000");
        EXPECT_EQ(user.ask("set 7 65"), kDone);
        user.kill();
    }
    EXPECT_EQ(other.ask("see 7"), "65");
    EXPECT_EQ(other.ask("set 7 66"), kDone);
    Peer next("acquire 7 100000");
    EXPECT_EQ(next.ask("see 7"), "66");
    other.kill();
    next.kill();
    // The service counts uses, not users: three acquisitions were never deleted.
    EXPECT_EQ(take_block_uses(7), 3);
    EXPECT_TRUE(comes_back_to(server, server_.pid()));
}

TEST_F(BlockCrash, MemoryOfADeletedBlockGoesWithItsLastUserThatIsKilled) {
    const Holdings server(server_.pid());
    Peer user("acquire 7 100000");
    EXPECT_EQ(user.ask("delete 7 100000"), kDone);
    EXPECT_EQ(count_memory_files(server_.pid()), 1U);
    user.kill();
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server_.pid()) == 0; }));
    EXPECT_TRUE(comes_back_to(server, server_.pid()));
    expect_service();
}

}  // namespace

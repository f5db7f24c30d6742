// The runner of `./dev bench --peers`, with peers made for it: whose turn it is, what is recorded, and what ends a run.
#include "bench/peers/runner.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <vector>

namespace {

using namespace tavo::peers;

constexpr Plan kPlan = {1, 4, 0.01};

enum class Fault { none, loses, forges, ends };

// Who was timed, in the order of the turns; in memory that all processes have.
struct Turns {
    std::atomic<size_t> count;
    int names[1 << 16];
};

// Sends numbers to a partner that is not there: what it would have sent back is known.
class Sender : public Party {
public:
    Sender(Fault fault, int name, Turns* turns) : fault_(fault), name_(name), turns_(turns) {}

    void run(size_t operations) override {
        if (turns_ != nullptr) turns_->names[turns_->count++] = name_;
        if (fault_ == Fault::ends) _exit(0);
        for (size_t i = 0; i < operations; ++i) {
            tally_.out.add(i);
            tally_.in.add(i);
        }
        if (fault_ == Fault::loses) --tally_.in.count;
        if (fault_ == Fault::forges) ++tally_.in.checksum;
    }
    Tally tally() override { return tally_; }

private:
    const Fault fault_;
    const int name_;
    Turns* const turns_;
    Tally tally_;
};

class Alone : public Setting {
public:
    Alone(Fault fault, int name, Turns* turns) : fault_(fault), name_(name), turns_(turns) {}
    std::unique_ptr<Party> driver() override { return std::make_unique<Sender>(fault_, name_, turns_); }
    bool has_partner() const override { return false; }

private:
    const Fault fault_;
    const int name_;
    Turns* const turns_;
};

Peer peer(const char* name, Role role, Fault fault = Fault::none, int number = 0, Turns* turns = nullptr) {
    return {name, role, [=] { return std::make_unique<Alone>(fault, number, turns); }};
}

Contest contest(std::vector<Peer> others) {
    Contest result = {"family", "operation", 64, 1, {peer("bare", Role::limit), peer("mine", Role::ours)}};
    for (Peer& other : others) result.peers.push_back(std::move(other));
    return result;
}

nlohmann::json named(const nlohmann::json& record, const std::string& name) {
    for (const auto& one : record["peers"]) {
        if (one["name"] == name) return one;
    }
    return {};
}

TEST(PeerRunner, RecordsTimesAndRatiosOfEveryPeer) {
    const nlohmann::json record = run(contest({peer("other", Role::peer)}), kPlan);
    EXPECT_EQ(record["family"], "family");
    EXPECT_EQ(record["operation"], "operation");
    EXPECT_EQ(record["size"], 64);
    EXPECT_EQ(record["cpus"], 1);
    ASSERT_EQ(record["peers"].size(), 3U);
    for (const auto& one : record["peers"]) {
        EXPECT_GT(one["operations"], 0);
        EXPECT_GE(one["ahead_of_ours"], 0.0);
        EXPECT_LE(one["ahead_of_ours"], 1.0);
        for (const char* figure : {"nanoseconds", "to_limit", "to_ours"}) {
            EXPECT_GT(one[figure]["low"], 0) << figure;
            EXPECT_LE(one[figure]["low"], one[figure]["median"]) << figure;
            EXPECT_LE(one[figure]["median"], one[figure]["high"]) << figure;
        }
    }
    EXPECT_EQ(named(record, "mine")["ahead_of_ours"], 0.0);
    EXPECT_EQ(named(record, "bare")["role"], "limit");
    EXPECT_EQ(named(record, "bare")["to_limit"]["high"], 1.0);
    EXPECT_EQ(named(record, "mine")["role"], "ours");
    EXPECT_EQ(named(record, "mine")["to_ours"]["low"], 1.0);
    EXPECT_EQ(named(record, "other")["role"], "peer");
}

TEST(PeerRunner, RecordsWhyAPeerCannotTakePartAndDoesNotSetItUp) {
    const Peer cannot = {"other", Role::peer, [] { return std::unique_ptr<Setting>(); }, "too small"};
    const nlohmann::json other = named(run(contest({cannot}), kPlan), "other");
    EXPECT_EQ(other["impossible"], "too small");
    EXPECT_FALSE(other.contains("nanoseconds"));
}

TEST(PeerRunner, LetsEveryPeerHaveATurnInEachRoundAndBeginsEachWithAnother) {
    void* const memory = mmap(nullptr, sizeof(Turns), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(memory, MAP_FAILED);
    auto* const turns = new (memory) Turns;
    run({"family",
         "operation",
         {},
         1,
         {peer("0", Role::limit, Fault::none, 0, turns), peer("1", Role::ours, Fault::none, 1, turns),
          peer("2", Role::peer, Fault::none, 2, turns)}},
        kPlan);
    const size_t measured = kPlan.rounds * 3;
    ASSERT_GE(turns->count, measured);
    const std::vector<int> last(turns->names + (turns->count - measured), turns->names + turns->count);
    EXPECT_EQ(last, std::vector<int>({0, 1, 2, 1, 2, 0, 2, 0, 1, 0, 1, 2}));
    munmap(memory, sizeof(Turns));
}

TEST(PeerRunner, StartsThePeersAnewAsOftenAsPlanned) {
    int starts = 0;
    const Peer other = {"other", Role::peer, [&starts] {
                            ++starts;
                            return std::make_unique<Alone>(Fault::none, 0, nullptr);
                        }};
    run(contest({other}), {3, 2, 0.01});
    EXPECT_EQ(starts, 3);
}

TEST(PeerRunnerDeathTest, EndsWhenAPeerLosesSomething) {
    EXPECT_EXIT(run(contest({peer("other", Role::peer, Fault::loses)}), kPlan), testing::ExitedWithCode(1),
                "other: it has lost, added or changed something");
}

TEST(PeerRunnerDeathTest, EndsWhenAPeerChangesSomething) {
    EXPECT_EXIT(run(contest({peer("other", Role::peer, Fault::forges)}), kPlan), testing::ExitedWithCode(1),
                "other: it has lost, added or changed something");
}

TEST(PeerRunnerDeathTest, EndsWhenAPeerEnds) {
    EXPECT_EXIT(run(contest({peer("other", Role::peer, Fault::ends)}), kPlan), testing::ExitedWithCode(1),
                "other: it has ended");
}

}  // namespace

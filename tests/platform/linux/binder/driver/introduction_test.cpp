// Objects that get to processes by way of others.
#include <signal.h>
#include <unistd.h>

#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

// This process, and two others: b and c.
class DriverIntroduction : public testing::Test {
protected:
    Process process_b_ = start_server("b");
    Process process_c_ = start_server("c");
    sp<IBinder> b_ = find_service("b");
    sp<IBinder> c_ = find_service("c");
};

TEST_F(DriverIntroduction, LetsTheReceiverCall) {
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    Parcel data;
    data.writeInt32(TestService::kThreadId);
    const int32_t thread = ask(c_, TestService::kCallKept, data);
    EXPECT_EQ(access(("/proc/" + std::to_string(process_b_.pid()) + "/task/" + std::to_string(thread)).c_str(), F_OK),
              0);
}

TEST_F(DriverIntroduction, TellsTheOwnerWhoCalls) {
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    Parcel data;
    data.writeInt32(TestService::kCallerIds);
    EXPECT_EQ(ask(c_, TestService::kCallKept, data), process_c_.pid());
}

TEST_F(DriverIntroduction, TellsTheObjectsOfTheIntroducerApartFromTheOwners) {
    start_pool();
    ASSERT_EQ(ask(c_, TestService::kKeep, new TestService), 0);
    Parcel data;
    data.writeInt32(TestService::kCallerIds);
    EXPECT_EQ(ask(c_, TestService::kCallKept, data), process_c_.pid());
}

TEST_F(DriverIntroduction, OfTheSameObjectAgainGivesTheSameProxy) {
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    EXPECT_EQ(ask(c_, TestService::kIsKept, b_), 1);
    EXPECT_EQ(ask(c_, TestService::kIsKept, c_), 0);
}

TEST_F(DriverIntroduction, AndALookUpGiveTheSameProxy) {
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    // c looks b's name up and is given what it found.
    Parcel data, reply;
    data.writeString16(String16("b"));
    ASSERT_EQ(c_->transact(TestService::kCheck, data, &reply), OK);
    EXPECT_EQ(reply.readStrongBinder(), b_);
    Parcel name;
    name.writeString16(String16("b"));
    EXPECT_EQ(ask(c_, TestService::kIsKeptNamed, name), 1);
}

TEST_F(DriverIntroduction, AfterALookUpGivesTheSameProxy) {
    Parcel name;
    name.writeString16(String16("b"));
    ASSERT_EQ(ask(c_, TestService::kIsKeptNamed, name), 0) << "c knows b by name from here on";
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    EXPECT_EQ(ask(c_, TestService::kIsKeptNamed, name), 1);
}

TEST_F(DriverIntroduction, ToTheOwnerGivesTheObjectItself) {
    start_pool();
    // Each of the two knows the other by name: what one is sent goes back along another connection than it came.
    const sp<IBinder> own = new TestService;
    ASSERT_EQ(defaultServiceManager()->addService(String16("a"), own), OK);
    Parcel name;
    name.writeString16(String16("a"));
    Parcel reply;
    ASSERT_EQ(b_->transact(TestService::kCheck, name, &reply), OK);
    EXPECT_EQ(reply.readStrongBinder(), own);
    ASSERT_EQ(ask(b_, TestService::kKeep, own), 0);
    EXPECT_EQ(ask(b_, TestService::kIsKeptNamed, name), 1) << "and is one object away from home";
    EXPECT_EQ(ask_for_object(b_, TestService::kKept), own);
}

TEST_F(DriverIntroduction, GoesOnFromHandToHand) {
    const Process process_d = start_server("d");
    const sp<IBinder> d = find_service("d");
    // b's object comes to d by way of this process and c.
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    const sp<IBinder> from_c = ask_for_object(c_, TestService::kKept);
    EXPECT_EQ(from_c, b_);
    ASSERT_EQ(ask(d, TestService::kKeep, from_c), 0);
    process_c_.kill(SIGKILL);
    process_c_.wait();
    EXPECT_EQ(ask(d, TestService::kPingKept), OK) << "which does not depend on who passed it on";
}

TEST_F(DriverIntroduction, KeepsTheObjectAlive) {
    start_pool();
    ASSERT_EQ(ask(b_, TestService::kKeep, new TestService), 0);
    {
        // b passes this process's object on to c, and forgets it.
        Parcel data;
        data.writeInt32(TestService::kEcho);
        const sp<IBinder> kept = ask_for_object(b_, TestService::kKept);
        EXPECT_NE(kept->localBinder(), nullptr);
    }
    ASSERT_EQ(ask(b_, TestService::kPassKept, c_), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(TestService::count(), 1);
    EXPECT_EQ(ask(c_, TestService::kPingKept), OK);
    ASSERT_EQ(ask(c_, TestService::kKeep, nullptr), 0);
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
}

TEST_F(DriverIntroduction, TellsOfTheOwnersDeath) {
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    ASSERT_EQ(ask(c_, TestService::kWatchKept), OK);
    process_b_.kill(SIGKILL);
    EXPECT_TRUE(comes_true([&] { return ask(c_, TestService::kDeaths) == 1; }));
    EXPECT_EQ(ask(c_, TestService::kPingKept), DEAD_OBJECT);
}

TEST_F(DriverIntroduction, TellsOfADeathOnceWhenKnownTwice) {
    ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
    Parcel name;
    name.writeString16(String16("b"));
    ASSERT_EQ(ask(c_, TestService::kIsKeptNamed, name), 1) << "on a link of its own as well";
    ASSERT_EQ(ask(c_, TestService::kWatchKept), OK);
    process_b_.kill(SIGKILL);
    EXPECT_TRUE(comes_true([&] { return ask(c_, TestService::kDeaths) == 1; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    EXPECT_EQ(ask(c_, TestService::kDeaths), 1);
}

TEST_F(DriverIntroduction, LeavesNoConnectionBehind) {
    const auto descriptors = [this] {
        return std::vector<size_t>{count_descriptors(), count_descriptors(process_b_.pid()),
                                   count_descriptors(process_c_.pid())};
    };
    const auto pass = [this] {
        ASSERT_EQ(ask(c_, TestService::kKeep, b_), 0);
        ASSERT_EQ(ask(c_, TestService::kPingKept), OK);
        ASSERT_EQ(ask(c_, TestService::kKeep, nullptr), 0);
    };
    for (int i = 0; i < 3; ++i) pass();
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    const std::vector<size_t> before = descriptors();
    for (int i = 0; i < 50; ++i) pass();
    EXPECT_TRUE(comes_true([&] {
        const std::vector<size_t> now = descriptors();
        return now[0] <= before[0] && now[1] <= before[1] && now[2] <= before[2];
    })) << testing::PrintToString(before)
        << ", then " << testing::PrintToString(descriptors());
}

TEST_F(DriverIntroduction, OfManyObjectsAtOnceIsPossible) {
    std::vector<Process> processes;
    Parcel data, reply;
    for (int i = 0; i < 8; ++i) {
        processes.push_back(start_server("s" + std::to_string(i)));
        for (int n = 0; n < 4; ++n) data.writeStrongBinder(find_service("s" + std::to_string(i)));
    }
    ASSERT_EQ(c_->transact(TestService::kEcho, data, &reply), OK);
    for (int i = 0; i < 8; ++i) {
        for (int n = 0; n < 4; ++n) EXPECT_EQ(reply.readStrongBinder(), find_service("s" + std::to_string(i)));
    }
}

TEST_F(DriverIntroduction, RacesWithLookUpsAndEndings) {
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&] {
            Parcel name;
            name.writeString16(String16("b"));
            for (int n = 0; n < 50; ++n) {
                EXPECT_EQ(ask(c_, TestService::kKeep, b_), 0);
                Parcel reply;
                EXPECT_EQ(c_->transact(TestService::kCheck, name, &reply), OK);
                EXPECT_EQ(reply.readStrongBinder(), b_);
                EXPECT_EQ(ask(c_, TestService::kKeep, nullptr), 0);
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
}

}  // namespace

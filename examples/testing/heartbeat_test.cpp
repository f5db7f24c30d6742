// Unit tests of a component that uses the library: no device, no server process, no waiting, no rights.
#include "heartbeat.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <tavo_osal.hpp>
#include <tavo_osal/testing/failing_call.hpp>
#include <tavo_osal/testing/gtest.hpp>
#include <tavo_osal/testing/manual_ticks.hpp>
#include <tavo_osal/testing/private_storage.hpp>

using namespace tavo::test;

namespace {

constexpr int kKey = 12;

// The test itself is the server, in a storage of its own.
class HeartbeatTest : public testing::Test {
protected:
    HeartbeatTest() { EXPECT_EQ(tavo_osal_init(4, 4), TAVO_SUCCESS); }

    PrivateStorage storage_;
    ManualTicks ticks_;
};

TEST_F(HeartbeatTest, BeatsEveryThirdTick) {
    tavo::MessageQueue supervisor(kKey);
    Heartbeat heartbeat;
    ASSERT_EQ(heartbeat.start(kKey), TAVO_SUCCESS);
    ticks_.tick(2);  // 100 ms are two ticks, and timers fire one tick after their count has ended
    EXPECT_EQ(heartbeat.beats(), 0);
    ticks_.tick();
    EXPECT_EQ(heartbeat.beats(), 1);
    ticks_.tick(3);
    EXPECT_EQ(heartbeat.beats(), 2);
    const auto message = supervisor.get();
    EXPECT_EQ(std::string(message.begin(), message.end()), "alive 1");
}

TEST_F(HeartbeatTest, ALostBeatIsAWarningAndTheNextOneIsTried) {
    Heartbeat heartbeat;
    ASSERT_EQ(heartbeat.start(kKey), TAVO_SUCCESS);
    const LogCapture log;
    const FailingCall<tavo_msg_queue_put> fault(1, -1);
    ticks_.tick(3);
    EXPECT_TRUE(logged(log.lines(), {TAVO_LOG_WARNING, "HEARTBEAT", "A beat was lost\n"}));
    EXPECT_EQ(heartbeat.beats(), 0);
    ticks_.tick(3);
    EXPECT_EQ(heartbeat.beats(), 1);
}

TEST_F(HeartbeatTest, WithoutMemoryItDoesNotStart) {
    const LogCapture log;
    const FailingCall<tavo_osal_mutex_create> fault(1, TAVO_NO_MEMORY);
    Heartbeat heartbeat;
    EXPECT_EQ(heartbeat.start(kKey), TAVO_NO_MEMORY);
    EXPECT_TRUE(logged(log.lines("HEARTBEAT"), {TAVO_LOG_ERROR, "HEARTBEAT", "No heartbeat for key 12: 0x9003\n"}));
}

TEST_F(HeartbeatTest, WithoutAThreadItGivesTheQueueUpAgain) {
    const PlatformHook no_threads(
        "libtavoosal.so", "pthread_create",
        +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) { return EAGAIN; });
    const FailingCall<tavo_msg_queue_close> closing(kNoCall, TAVO_SUCCESS);
    Heartbeat heartbeat;
    EXPECT_EQ(heartbeat.start(kKey), TAVO_FAILURE);
    EXPECT_EQ(closing.calls(), 1U);
}

TEST(HeartbeatAlone, WithoutAServerItDoesNotStart) {
    const PrivateStorage storage;
    Heartbeat heartbeat;
    EXPECT_EQ(heartbeat.start(kKey), static_cast<TAVO_Status>(tavo::Errc::not_reachable));
}

}  // namespace

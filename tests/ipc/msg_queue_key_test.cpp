#include "tavo_osal/msg_queue_key.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ipc.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <fstream>
#include <string>

#include "ipc/server.h"
#include "support/eventually.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/msg_queue.h"

namespace {

using tavo::test::comes_true;
using tavo::test::count_descriptors;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;
using tavo::test::Server;

constexpr char kTag[] = "OSAL_MSG_QUEUE";
constexpr char kKeyFile[] = "/sdcard/key_gen_file.txt";
constexpr int32_t kUntouched = 0x5A5A5A5A;

int fail_to_open(const char*, int, ...) {
    errno = EACCES;
    return -1;
}

mode_t current_mask() {
    const mode_t mask = umask(0);
    umask(mask);
    return mask;
}

TEST(MsgQueueKeyCreate, MakesTheKeyOfTheFileAndTheNumber) {
    const LogCapture log;
    int32_t key = kUntouched;
    EXPECT_EQ(tavo_msg_queue_key_create(&key, 65), TAVO_SUCCESS);
    EXPECT_EQ(key, ftok(kKeyFile, 65));
    EXPECT_NE(key, -1);
    EXPECT_TRUE(
        logged_exactly(log.lines(), {{3, kTag, "Generating an IPC key with args /sdcard/key_gen_file.txt and 65.\n"},
                                     {3, kTag, "IPC key generation succeeded.\n"},
                                     {3, kTag, "Msg queue key obtained is " + std::to_string(key) + ".\n"}}));
}

TEST(MsgQueueKeyCreate, LeavesTheProcessWithoutAFileMask) {
    umask(022);
    int32_t key = 0;
    EXPECT_EQ(tavo_msg_queue_key_create(&key, 1), TAVO_SUCCESS);
    EXPECT_EQ(current_mask(), 0U);
    struct stat status = {};
    ASSERT_EQ(stat(kKeyFile, &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0666U);
}

TEST(MsgQueueKeyCreate, EmptiesTheFileAndKeepsItsIdentity) {
    std::ofstream(kKeyFile) << "something";
    const int before = ftok(kKeyFile, 9);
    int32_t key = 0;
    EXPECT_EQ(tavo_msg_queue_key_create(&key, 9), TAVO_SUCCESS);
    EXPECT_EQ(key, before);
    struct stat status = {};
    ASSERT_EQ(stat(kKeyFile, &status), 0);
    EXPECT_EQ(status.st_size, 0);
}

TEST(MsgQueueKeyCreate, IsTheSameForTheSameNumberAndTakesItsLowBitsOnly) {
    int32_t first = 0, second = 0, other = 0, wrapped = 0;
    EXPECT_EQ(tavo_msg_queue_key_create(&first, 7), TAVO_SUCCESS);
    EXPECT_EQ(tavo_msg_queue_key_create(&second, 7), TAVO_SUCCESS);
    EXPECT_EQ(tavo_msg_queue_key_create(&other, 8), TAVO_SUCCESS);
    EXPECT_EQ(tavo_msg_queue_key_create(&wrapped, 7 + 256), TAVO_SUCCESS);
    EXPECT_EQ(first, second);
    EXPECT_NE(first, other);
    EXPECT_EQ(first, wrapped);
}

TEST(MsgQueueKeyCreate, CarriesOnWithAFileItCannotWrite) {
    std::ofstream(kKeyFile) << "something";
    const PlatformHook hook("libtavoosal.so", "open", fail_to_open);
    const LogCapture log;
    int32_t key = kUntouched;
    EXPECT_EQ(tavo_msg_queue_key_create(&key, 3), TAVO_SUCCESS);
    EXPECT_EQ(key, ftok(kKeyFile, 3));
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Keygen file /sdcard/key_gen_file.txt could not be opened in write mode.\n"},
                                {3, kTag, "Generating an IPC key with args /sdcard/key_gen_file.txt and 3.\n"},
                                {3, kTag, "IPC key generation succeeded.\n"},
                                {3, kTag, "Msg queue key obtained is " + std::to_string(key) + ".\n"}}));
}

TEST(MsgQueueKeyCreate, FailsWithoutAFileAndStillDropsTheMask) {
    const PlatformHook hook("libtavoosal.so", "open", fail_to_open);
    umask(027);
    const LogCapture log;
    int32_t key = kUntouched;
    EXPECT_EQ(tavo_msg_queue_key_create(&key, 3), TAVO_MQ_KEY_FAILED);
    EXPECT_EQ(key, kUntouched);
    EXPECT_EQ(current_mask(), 0U);
    EXPECT_TRUE(logged_exactly(log.lines(),
                               {{1, kTag, "Keygen file /sdcard/key_gen_file.txt could not be opened in write mode.\n"},
                                {3, kTag, "Generating an IPC key with args /sdcard/key_gen_file.txt and 3.\n"},
                                {1, kTag, "IPC key generation failed. errno=2.\n"}}));
}

TEST(MsgQueueKeyCreate, RefusesANullPointerAndTouchesNothing) {
    umask(027);
    const LogCapture log;
    EXPECT_EQ(tavo_msg_queue_key_create(nullptr, 3), TAVO_INVALID_PARAM);
    EXPECT_EQ(current_mask(), 027U);
    EXPECT_NE(access(kKeyFile, F_OK), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, kTag, "Invalid parameter\n"}}));
}

TEST(MsgQueueKeyCreate, LeavesNoDescriptorOpen) {
    int32_t key = 0;
    const size_t before = count_descriptors();
    for (int i = 0; i < 5; ++i) EXPECT_EQ(tavo_msg_queue_key_create(&key, i), TAVO_SUCCESS);
    EXPECT_EQ(count_descriptors(), before);
}

// The bytes are sent without being changed, but the functions take them as changeable.
unsigned char* bytes(const char* text) { return reinterpret_cast<unsigned char*>(const_cast<char*>(text)); }

TAVO_INT64 open_queue(int key) {
    TAVO_INT64 queue = -1;
    EXPECT_EQ(tavo_msg_queue_init(key, &queue), TAVO_SUCCESS);
    return queue;
}

TAVO_INT64 open_queue(const char* key) {
    std::string text = key;
    TAVO_INT64 queue = -1;
    EXPECT_EQ(tavo_msg_queue_sender_init(text.data(), &queue), TAVO_SUCCESS);
    return queue;
}

std::string receive(TAVO_INT64 queue) {
    unsigned char buffer[64] = {};
    unsigned int size = sizeof buffer;
    EXPECT_EQ(tavo_msg_queue_receivemessage(queue, &size, buffer), TAVO_SUCCESS);
    return {reinterpret_cast<char*>(buffer), size};
}

struct KeyAndText {
    int key;
    const char* text;
};

class MsgQueueKeys : public testing::TestWithParam<KeyAndText> {};

TEST_P(MsgQueueKeys, OpenTheQueueOfTheirText) {
    const Server server;
    const TAVO_INT64 by_number = open_queue(GetParam().key);
    const TAVO_INT64 by_text = open_queue(GetParam().text);
    ASSERT_GT(by_number, 0);
    ASSERT_GT(by_text, 0);
    EXPECT_EQ(tavo_msg_queue_sendmessage(by_number, 6, bytes("number")), TAVO_SUCCESS);
    EXPECT_EQ(receive(by_text), "number");
    EXPECT_EQ(tavo_msg_queue_put(by_text, bytes("text"), 4), TAVO_SUCCESS);
    EXPECT_EQ(receive(by_number), "text");
    EXPECT_EQ(tavo_msg_queue_close(by_number), TAVO_SUCCESS);
    EXPECT_EQ(tavo_msg_queue_destroy(by_text), TAVO_SUCCESS);
}

INSTANTIATE_TEST_SUITE_P(Keys, MsgQueueKeys,
                         testing::Values(KeyAndText{7, "7"}, KeyAndText{-5, "-5"}, KeyAndText{INT_MAX, "2147483647"},
                                         KeyAndText{INT_MIN, "-2147483648"}),
                         [](const auto& test) { return "Case" + std::to_string(test.index); });

TEST(MsgQueueByKey, IgnoresFlags) {
    const Server server;
    const TAVO_INT64 plain = open_queue(7);
    TAVO_INT64 flagged = -1;
    EXPECT_EQ(tavo_msg_queue_init_with_flags(7, 0x1FF, &flagged), TAVO_SUCCESS);
    ASSERT_GT(plain, 0);
    ASSERT_GT(flagged, 0);
    EXPECT_NE(plain, flagged);
    EXPECT_EQ(tavo_msg_queue_sendmessage(flagged, 3, bytes("abc")), TAVO_SUCCESS);
    EXPECT_EQ(receive(plain), "abc");
    EXPECT_EQ(tavo_msg_queue_close(plain), TAVO_SUCCESS);
    EXPECT_EQ(tavo_msg_queue_close(flagged), TAVO_SUCCESS);
}

TEST(MsgQueueByKey, TakesTheSizeBeforeTheBuffer) {
    const Server server;
    const TAVO_INT64 queue = open_queue(7);
    ASSERT_GT(queue, 0);
    EXPECT_EQ(tavo_msg_queue_sendmessage(queue, 3, bytes("abcdef")), TAVO_SUCCESS);
    unsigned char buffer[16];
    memset(buffer, '.', sizeof buffer);
    unsigned int size = 0;
    EXPECT_EQ(tavo_msg_queue_receivemessage(queue, &size, buffer), TAVO_SUCCESS);
    EXPECT_EQ(size, 3U);
    EXPECT_EQ(memcmp(buffer, "abc", 3), 0);
    EXPECT_EQ(tavo_msg_queue_close(queue), TAVO_SUCCESS);
}

TEST(MsgQueueByKey, CloseDropsTheUseInTheService) {
    const Server server;
    EXPECT_EQ(tavo_msg_queue_close(open_queue(8)), TAVO_SUCCESS);  // makes the way to the service, which stays
    const size_t here = count_descriptors();
    const TAVO_INT64 first = open_queue(7);
    const TAVO_INT64 second = open_queue(7);
    const size_t with_queue = count_descriptors(server.pid());
    EXPECT_EQ(tavo_msg_queue_close(first), TAVO_SUCCESS);
    EXPECT_EQ(count_descriptors(server.pid()), with_queue);
    EXPECT_EQ(tavo_msg_queue_close(second), TAVO_SUCCESS);
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server.pid()) <= with_queue - 2; }));
    EXPECT_EQ(count_descriptors(), here);
}

TEST(MsgQueueByKey, PassesFailuresThrough) {
    TAVO_INT64 queue = kUntouched;
    EXPECT_EQ(tavo_msg_queue_init(7, nullptr), TAVO_MQ_INVALID_POINTER);
    EXPECT_EQ(tavo_msg_queue_init(7, &queue), 1);
    EXPECT_EQ(tavo_msg_queue_init_with_flags(7, 0, &queue), 1);
    EXPECT_EQ(queue, kUntouched);
    EXPECT_EQ(tavo_msg_queue_close(0), TAVO_FAILURE);
    EXPECT_EQ(tavo_msg_queue_close(-1), TAVO_FAILURE);

    const Server server;
    queue = open_queue(7);
    ASSERT_GT(queue, 0);
    EXPECT_EQ(tavo_msg_queue_sendmessage(queue, 1, nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(tavo_msg_queue_sendmessage(queue, TAVO_MSG_QUEUE_MAX_SIZE + 1, bytes("a")), TAVO_MQ_MSG_TOO_LARGE);
    unsigned int size = 0;
    EXPECT_EQ(tavo_msg_queue_receivemessage(queue, &size, nullptr), TAVO_MQ_FAILURE);
    EXPECT_EQ(tavo_msg_queue_receivemessage(queue, nullptr, bytes("a")), TAVO_MQ_FAILURE);
    EXPECT_EQ(tavo_msg_queue_close(queue), TAVO_SUCCESS);
}

TEST(MsgQueueByKey, HasNoQueueForKeyZero) {
    const Server server;
    TAVO_INT64 queue = kUntouched;
    EXPECT_EQ(tavo_msg_queue_init(0, &queue), TAVO_MQ_NOT_AVAILABLE);
    EXPECT_EQ(queue, kUntouched);
}

TEST(MsgQueueByKey, LogsNothingOfItsOwn) {
    const Server server;
    const LogCapture log;
    const TAVO_INT64 queue = open_queue(7);
    EXPECT_EQ(tavo_msg_queue_sendmessage(queue, 1, bytes("a")), TAVO_SUCCESS);
    receive(queue);
    EXPECT_EQ(tavo_msg_queue_close(queue), TAVO_SUCCESS);
    EXPECT_TRUE(log.lines(kTag).empty());
    size_t entered = 0;
    for (const auto& line : log.lines("MSGQUEUE_BINDER")) {
        entered += line.priority == tavo::test::priority_of(6) && line.message() == "++Entered\n";
    }
    EXPECT_EQ(entered, 4U);
}

}  // namespace

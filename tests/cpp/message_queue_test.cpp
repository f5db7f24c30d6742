#include "tavo_osal/cpp/message_queue.hpp"

#include <gtest/gtest.h>

#include <string>

#include "cpp/no_memory.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/init.h"

namespace {

using tavo::Errc;
using tavo::MessageQueue;
using tavo::test::count_descriptors;
using tavo::test::PlatformHook;

static_assert(std::is_nothrow_move_constructible_v<MessageQueue> && !std::is_copy_constructible_v<MessageQueue>);

std::string text(const std::vector<unsigned char>& message) { return {message.begin(), message.end()}; }

class CppMessageQueue : public testing::Test {
protected:
    CppMessageQueue() { EXPECT_EQ(tavo_osal_init(16, 16), TAVO_SUCCESS); }
};

TEST(CppMessageQueueAlone, WithoutAServiceThereIsNone) {
    std::error_code error;
    const MessageQueue queue(7, error);
    EXPECT_EQ(error, Errc::not_reachable);
    EXPECT_FALSE(queue);
    EXPECT_THROW(MessageQueue(7), std::system_error);
}

TEST_F(CppMessageQueue, CarriesMessagesFromOneAttachmentToAnother) {
    MessageQueue sender(7);
    MessageQueue receiver(7);
    sender.put("hello");
    sender.put(std::string_view());
    const unsigned char bytes[] = {0, 1, 2};
    sender.put(bytes, sizeof bytes);
    EXPECT_EQ(text(receiver.get()), "hello");
    EXPECT_EQ(text(receiver.get()), "");
    std::vector<unsigned char> message(100, 'x');
    receiver.get(message);
    EXPECT_EQ(message, (std::vector<unsigned char>{0, 1, 2}));
}

TEST_F(CppMessageQueue, CarriesTheLongestMessageAndNoLonger) {
    MessageQueue queue(7);
    std::string longest(MessageQueue::max_size, 'l');
    queue.put(longest);
    EXPECT_EQ(text(queue.get()), longest);
    longest += 'x';
    std::error_code error;
    queue.put(longest, error);
    EXPECT_EQ(error, Errc::message_too_large);
    // The size must not be cut to 32 bits on its way.
    constexpr uint64_t kMoreThan32Bits = uint64_t{1} << 32 | 1;
    if constexpr (sizeof(size_t) >= sizeof kMoreThan32Bits) {
        queue.put("x", static_cast<size_t>(kMoreThan32Bits), error);
        EXPECT_EQ(error, Errc::message_too_large);
    }
    EXPECT_THROW(queue.put(longest), std::system_error);
}

TEST_F(CppMessageQueue, NullMessagesAreRefused) {
    MessageQueue queue(7);
    std::error_code error;
    queue.put(nullptr, 3, error);
    EXPECT_EQ(error, Errc::invalid_param);
}

TEST_F(CppMessageQueue, KeyZeroHasNoQueue) {
    std::error_code error;
    const MessageQueue queue(0, error);
    EXPECT_EQ(error, Errc::queue_not_available);
    EXPECT_FALSE(queue);
}

TEST_F(CppMessageQueue, GivesItsDescriptorsUpOnce) {
    const MessageQueue keeps_the_key(7);
    const size_t before = count_descriptors();
    {
        MessageQueue first(7);
        MessageQueue second(std::move(first));
        EXPECT_FALSE(first);
        EXPECT_GT(count_descriptors(), before);
        second.close();
        EXPECT_EQ(count_descriptors(), before);
        std::error_code error = Errc::failure;
        second.close(error);
        EXPECT_FALSE(error);
        MessageQueue third(7);
        third = MessageQueue(7);
    }
    EXPECT_EQ(count_descriptors(), before);
}

TEST_F(CppMessageQueue, AnEmptyOneRefusesToBeUsed) {
    MessageQueue queue(7);
    queue.close();
    EXPECT_EQ(queue.native_handle(), 0);
    std::error_code error;
    queue.put("x", error);
    EXPECT_EQ(error, Errc::invalid_param);
    std::vector<unsigned char> message(3);
    queue.get(message, error);
    EXPECT_EQ(error, Errc::invalid_param);
    EXPECT_TRUE(message.empty());
    EXPECT_THROW(queue.put("x"), std::system_error);
    EXPECT_THROW(queue.get(), std::system_error);
}

TEST_F(CppMessageQueue, FailuresOfThePipeAreReported) {
    MessageQueue queue(7);
    std::error_code error;
    {
        // A put that fails keeps its buffer for good, as it always has: here it gets one that nobody misses.
        const PlatformHook allocate(
            "libtavoosal.so", "tavo_osal_mem_malloc", +[](unsigned int) -> void* {
                static unsigned char buffer[64];
                return buffer;
            });
        const PlatformHook hook(
            "libtavoosal.so", "write", +[](int, const void*, size_t) -> ssize_t {
                errno = EPIPE;
                return -1;
            });
        queue.put("x", error);
    }
    EXPECT_EQ(error, Errc::write_failed);
    const PlatformHook hook(
        "libtavoosal.so", "read", +[](int, void*, size_t) -> ssize_t {
            errno = EIO;
            return -1;
        });
    std::vector<unsigned char> message;
    queue.get(message, error);
    EXPECT_EQ(error, Errc::queue_failure);
}

TEST_F(CppMessageQueue, WithoutMemoryAMessageStaysInTheQueue) {
    MessageQueue queue(7);
    queue.put("stays");
    {
        const tavo::test::NoMemory hook;
        std::error_code error;
        std::vector<unsigned char> message(3);
        queue.get(message, error);
        EXPECT_EQ(error, Errc::no_memory);
        EXPECT_TRUE(message.empty());
    }
    EXPECT_EQ(text(queue.get()), "stays");
    queue.close();
}

TEST_F(CppMessageQueue, AFailedCloseKeepsTheAttachment) {
    MessageQueue queue(7);
    {
        // The marker that says there is a service.
        const PlatformHook hook(
            "libtavoosal.so", "access", +[](const char*, int) { return -1; });
        std::error_code error;
        queue.close(error);
        EXPECT_EQ(error, Errc::failure);
    }
    queue.put("still there");
    EXPECT_EQ(text(queue.get()), "still there");
    queue.close();
}

}  // namespace

// Senders, receivers and the server, each a process of its own.
#include <cstdio>
#include <iostream>
#include <map>

#include "ipc/descriptors.h"
#include "ipc/msg_queue_test.h"

namespace {

using tavo::test::attached;
using tavo::test::count_pipe_ends;
using tavo::test::drop;
using tavo::test::file_of;
using tavo::test::get;
using tavo::test::Process;
using tavo::test::put;
using tavo::test::queue_of;
using tavo::test::Server;

uint64_t mix(uint64_t value) {
    value = (value ^ (value >> 30)) * 0xbf58476d1ce4e5b9;
    value = (value ^ (value >> 27)) * 0x94d049bb133111eb;
    return value ^ (value >> 31);
}

// Sizes on both sides of every limit there is: of an atomic write, of a pipe, of a message.
size_t mixed_size(uint32_t index) {
    constexpr size_t kSizes[] = {8, 4092, 4093, 9, 65532, 65533, 64, 409600, 4096, 8192, 100000, 1000};
    return kSizes[index % std::size(kSizes)];
}
// In one atomic write, so that several senders may send them.
size_t small_size(uint32_t index) { return index % 100 == 0 ? 4092 : 8 + static_cast<size_t>(mix(index) % 200); }

// A message that says who sent it and which it is, and is otherwise as good as random.
std::string message_of(uint32_t sender, uint32_t index, size_t size) {
    std::string message(size, '\0');
    memcpy(message.data(), &sender, sizeof sender);
    memcpy(message.data() + sizeof sender, &index, sizeof index);
    uint64_t state = mix((uint64_t{sender} << 32) + index + 1);
    for (size_t i = sizeof sender + sizeof index; i < size; ++i) {
        if (i % 8 == 0) state = mix(state + i);
        message[i] = static_cast<char>(state >> (i % 8 * 8));
    }
    return message;
}

using Size = size_t (*)(uint32_t index);
Size size_called(const std::string& name) { return name == "mixed" ? mixed_size : small_size; }

uint64_t checksum(uint64_t before, const std::string& message) {
    for (const char byte : message) before = (before ^ static_cast<unsigned char>(byte)) * 0x100000001b3;
    return before;
}

// KEY SENDER COUNT SIZES: sends so many messages and says their checksum.
TEST_ROLE(sender) {
    const TAVO_INT64 handle = attached(arguments.at(0));
    const auto name = static_cast<uint32_t>(std::stoul(arguments.at(1)));
    const auto count = static_cast<uint32_t>(std::stoul(arguments.at(2)));
    const Size size = size_called(arguments.at(3));
    uint64_t sum = 0;
    for (uint32_t i = 0; i < count; ++i) {
        const std::string message = message_of(name, i, size(i));
        if (put(handle, message) != TAVO_SUCCESS) return 1;
        sum = checksum(sum, message);
    }
    std::cout << sum << std::endl;
    return tavo_msg_queue_destroy(handle) == TAVO_SUCCESS ? 0 : 2;
}

// KEY SENDERS COUNT SIZES: says when it is attached, and then receives so many messages of each sender, in each one's
// order and to the byte.
TEST_ROLE(receiver) {
    const TAVO_INT64 handle = attached(arguments.at(0));
    std::cout << "attached" << std::endl;
    const auto senders = static_cast<uint32_t>(std::stoul(arguments.at(1)));
    const auto count = static_cast<uint32_t>(std::stoul(arguments.at(2)));
    const Size size = size_called(arguments.at(3));
    std::map<uint32_t, uint32_t> next;
    uint64_t sum = 0;
    for (uint64_t i = 0; i < uint64_t{senders} * count; ++i) {
        const std::string message = get(handle);
        uint32_t sender = 0;
        if (message.size() < sizeof sender) return 1;
        memcpy(&sender, message.data(), sizeof sender);
        const uint32_t index = next[sender]++;
        if (sender >= senders || message != message_of(sender, index, size(index))) return 2;
        sum = checksum(sum, message);
    }
    for (uint32_t sender = 0; sender < senders; ++sender) {
        if (next[sender] != count) return 3;
    }
    std::cout << sum << std::endl;
    if (tavo_msg_queue_destroy(handle) == TAVO_SUCCESS) return 0;
    drop(handle);
    return 4;
}

// KEY: holds the queue until a line comes.
TEST_ROLE(holder) {
    const TAVO_INT64 handle = attached(arguments.at(0));
    std::cout << "attached" << std::endl;
    std::string line;
    std::getline(std::cin, line);
    if (line == "destroy" && tavo_msg_queue_destroy(handle) != TAVO_SUCCESS) return 1;
    std::cout << "done" << std::endl;
    std::getline(std::cin, line);
    return 0;
}

class QueueProcesses : public tavo::test::MsgQueueTest {
protected:
    Server server_;
};

TEST_F(QueueProcesses, CarryMessagesOfAllSizesInOrder) {
    Process receiver = Process::start("receiver", {"7", "1", "240", "mixed"});
    Process sender = Process::start("sender", {"7", "0", "240", "mixed"});
    const std::string sent = sender.read_line();
    EXPECT_EQ(receiver.read_line(), "attached");
    EXPECT_EQ(receiver.read_line(), sent);
    EXPECT_NE(sent, "");
    EXPECT_EQ(sender.wait(), 0);
    EXPECT_EQ(receiver.wait(), 0);
    EXPECT_EQ(server_.exit(), 0);
}

TEST_F(QueueProcesses, CarryTheMessagesOfTwoSendersWithoutLosingOrTearingOne) {
    Process receiver = Process::start("receiver", {"7", "2", "10000", "small"});
    Process first = Process::start("sender", {"7", "0", "10000", "small"});
    Process second = Process::start("sender", {"7", "1", "10000", "small"});
    EXPECT_EQ(first.wait(), 0);
    EXPECT_EQ(second.wait(), 0);
    EXPECT_EQ(receiver.wait(), 0);
}

TEST_F(QueueProcesses, LeaveTheMessagesOfASenderThatHasGone) {
    const TAVO_INT64 handle = attached("7");
    Process sender = Process::start("sender", {"7", "3", "5", "small"});
    EXPECT_EQ(sender.wait(), 0);
    for (uint32_t i = 0; i < 5; ++i) EXPECT_EQ(get(handle), message_of(3, i, small_size(i)));
    tavo_msg_queue_destroy(handle);
}

TEST_F(QueueProcesses, KeepTheirQueuesApartByKey) {
    const TAVO_INT64 seven = attached("7");
    const TAVO_INT64 eight = attached("8");
    Process to_eight = Process::start("sender", {"8", "1", "1", "small"});
    EXPECT_EQ(to_eight.wait(), 0);
    Process to_seven = Process::start("sender", {"7", "2", "1", "small"});
    EXPECT_EQ(to_seven.wait(), 0);
    EXPECT_EQ(get(seven), message_of(2, 0, small_size(0)));
    EXPECT_EQ(get(eight), message_of(1, 0, small_size(0)));
    tavo_msg_queue_destroy(seven);
    tavo_msg_queue_destroy(eight);
}

TEST_F(QueueProcesses, KeepTheServersPipeUntilTheLastOneHasGivenItBack) {
    const TAVO_INT64 handle = attached("7");
    const ino_t pipe = file_of(queue_of(handle).iReadFd);
    Process first = Process::start("holder", {"7"});
    Process second = Process::start("holder", {"7"});
    EXPECT_EQ(first.read_line(), "attached");
    EXPECT_EQ(second.read_line(), "attached");
    EXPECT_EQ(count_pipe_ends(pipe, first.pid()), 2U);
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 2U);
    first.write_line("destroy");
    EXPECT_EQ(first.read_line(), "done");
    EXPECT_EQ(count_pipe_ends(pipe, first.pid()), 0U);
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 2U);
    second.write_line("destroy");
    EXPECT_EQ(second.read_line(), "done");
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 0U);
}

TEST_F(QueueProcesses, KeepTheUsesOfOnesThatDied) {
    // The service counts uses, not users: nobody drops those of a process that was killed.
    Process holder = Process::start("holder", {"7"});
    EXPECT_EQ(holder.read_line(), "attached");
    holder.kill(9);
    holder.wait();
    const TAVO_INT64 handle = attached("7");
    const ino_t pipe = file_of(queue_of(handle).iReadFd);
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_pipe_ends(pipe, server_.pid()), 2U);
}

TEST_F(QueueProcesses, ShareThePipeAfterTheServerDied) {
    const TAVO_INT64 handle = attached("7");
    Process receiver = Process::start("receiver", {"7", "1", "50", "mixed"});
    ASSERT_EQ(receiver.read_line(), "attached");
    server_.kill();
    for (uint32_t i = 0; i < 50; ++i) ASSERT_EQ(put(handle, message_of(0, i, mixed_size(i))), TAVO_SUCCESS);
    EXPECT_NE(receiver.read_line(), "");
    EXPECT_EQ(receiver.wait(), 4);  // all received, but the queue could not be given back
    drop(handle);
}

}  // namespace

// Many messages between processes and between threads: every one whole, in order, and none lost.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "message_queue_test.h"
#include "support/pace.h"
#include "support/process.h"

namespace {

using android::TAVO_MessageQueue;
using namespace tavo::test;

// Sanitizers and emulators slow the copies and comparisons down, not the pipe: a twentieth shows the same.
uint64_t share() { return is_slow() ? 20 : 1; }

std::vector<int> allowed_cpus() {
    cpu_set_t set;
    std::vector<int> cpus;
    if (sched_getaffinity(0, sizeof set, &set) != 0) return cpus;
    for (int cpu = 0; cpu < CPU_SETSIZE; ++cpu) {
        if (CPU_ISSET(cpu, &set)) cpus.push_back(cpu);
    }
    return cpus;
}

void run_on(int cpu) {
    cpu_set_t set;
    CPU_ZERO(&set);
    CPU_SET(cpu, &set);
    EXPECT_EQ(sched_setaffinity(0, sizeof set, &set), 0);
}

// Gives the test program its CPUs back.
class Affinity {
public:
    Affinity() { sched_getaffinity(0, sizeof set_, &set_); }
    ~Affinity() { sched_setaffinity(0, sizeof set_, &set_); }
    Affinity(const Affinity&) = delete;
    Affinity& operator=(const Affinity&) = delete;

private:
    cpu_set_t set_;
};

// The same messages on both sides: a number, then bytes from a pool, from a place that depends on the number.
class Messages {
public:
    explicit Messages(size_t size) : size_(size), pool_(size + kPlaces) {
        uint32_t state = 1;
        for (unsigned char& byte : pool_)
            byte = static_cast<unsigned char>((state = state * 1664525 + 1013904223) >> 24);
    }
    void fill(uint64_t number, unsigned char* message) const {
        memcpy(message, &number, sizeof number);
        memcpy(message + sizeof number, content(number), size_ - sizeof number);
    }
    bool matches(uint64_t number, const unsigned char* message) const {
        return memcmp(message, &number, sizeof number) == 0 &&
               memcmp(message + sizeof number, content(number), size_ - sizeof number) == 0;
    }

private:
    static constexpr size_t kPlaces = 4096;
    const unsigned char* content(uint64_t number) const { return pool_.data() + number % kPlaces; }

    size_t size_;
    std::vector<unsigned char> pool_;
};

// A queue with the write end that a process was started with.
void take_write_end(TAVO_MessageQueue& queue, const std::string& fd) {
    queue.tavo_android_msg_queue_set_fd(-1);
    queue.tavo_android_msg_queue_set_write_fd(std::stoi(fd));
}

// Starts a process that writes to the queue; the role's first argument is the write end.
Process start_writer(const TAVO_MessageQueue& queue, const std::string& role, std::vector<std::string> arguments) {
    const int inherited = dup(queue.iWriteFd);
    arguments.insert(arguments.begin(), std::to_string(inherited));
    Process writer = Process::start(role, arguments);
    close(inherited);
    return writer;
}

TEST_ROLE(stream_writer) {
    TAVO_MessageQueue queue;
    take_write_end(queue, arguments[0]);
    const size_t size = std::stoul(arguments[1]);
    const uint64_t count = std::stoull(arguments[2]);
    run_on(std::stoi(arguments[3]));
    if (arguments[4] == "default") queue.uiRoomFor = 32;  // put leaves the pipe as it is
    const Messages messages(size);
    std::vector<unsigned char> message(size);
    for (uint64_t number = 0; number < count; ++number) {
        messages.fill(number, message.data());
        if (queue.tavo_android_msg_queue_put(message.data(), static_cast<unsigned>(size)) != 0) return 1;
    }
    return 0;
}

struct Stream {
    size_t size;
    uint64_t count;
    bool two_cpus;
    const char* pipe = "roomy";  // or "default", as where the user is granted no more: no frame arrives whole
};

void PrintTo(const Stream& stream, std::ostream* out) {
    *out << stream.count << " messages of " << stream.size << " bytes on "
         << (stream.two_cpus ? "two CPUs, " : "one CPU, ") << stream.pipe << " pipe";
}

class MessageQueueStream : public testing::TestWithParam<Stream> {};

TEST_P(MessageQueueStream, DeliversEveryMessageWhole) {
    const Stream stream = GetParam();
    const Affinity kept;
    const std::vector<int> cpus = allowed_cpus();
    if (stream.two_cpus && cpus.size() < 2) GTEST_SKIP() << "only one CPU may be used";
    const uint64_t count = stream.count / share();
    const int writers_cpu = stream.two_cpus ? cpus.back() : cpus.front();

    TAVO_MessageQueue queue;
    Process writer =
        start_writer(queue, "stream_writer",
                     {std::to_string(stream.size), std::to_string(count), std::to_string(writers_cpu), stream.pipe});
    queue.tavo_android_msg_queue_set_write_fd(-1);  // so that a writer that fails ends the stream
    run_on(cpus.front());
    const Messages messages(stream.size);
    std::vector<unsigned char> buffer(TAVO_MessageQueue::MAX_MESSAGE_SIZE);
    for (uint64_t number = 0; number < count; ++number) {
        auto size = static_cast<unsigned>(buffer.size());
        ASSERT_EQ(queue.tavo_android_msg_queue_get(buffer.data(), &size), static_cast<int>(stream.size)) << number;
        ASSERT_TRUE(messages.matches(number, buffer.data())) << number;
    }
    EXPECT_EQ(writer.wait(), 0);
    EXPECT_EQ(get(queue), "");
}

INSTANTIATE_TEST_SUITE_P(OneCpu, MessageQueueStream,
                         testing::Values(Stream{4100, 200000, false}, Stream{65536, 20000, false},
                                         Stream{409600, 2000, false}, Stream{409600, 1000, false, "default"}));
INSTANTIATE_TEST_SUITE_P(TwoCpus, MessageQueueStream,
                         testing::Values(Stream{4100, 200000, true}, Stream{65536, 20000, true},
                                         Stream{409600, 2000, true}, Stream{65536, 5000, true, "default"},
                                         Stream{409600, 1000, true, "default"}));

// Sizes from the smallest to the largest that goes out in one atomic write.
size_t small_size(uint64_t number) { return static_cast<size_t>(16 + number * 37 % (4092 - 16 + 1)); }

void fill_small(unsigned char* message, uint64_t writer, uint64_t number) {
    memcpy(message, &writer, sizeof writer);
    memcpy(message + 8, &number, sizeof number);
    memset(message + 16, static_cast<int>(writer * 100 + number % 100), small_size(number) - 16);
}

TEST_ROLE(small_writer) {
    TAVO_MessageQueue queue;
    take_write_end(queue, arguments[0]);
    const uint64_t writer = std::stoull(arguments[1]);
    const uint64_t count = std::stoull(arguments[2]);
    unsigned char message[4092];
    for (uint64_t number = 0; number < count; ++number) {
        fill_small(message, writer, number);
        if (queue.tavo_android_msg_queue_put(message, static_cast<unsigned>(small_size(number))) != 0) return 1;
    }
    return 0;
}

TEST(MessageQueueWriters, TwoProcessesLoseAndTearNoSmallMessage) {
    constexpr uint64_t kCount = 10000;
    TAVO_MessageQueue queue;
    Process first = start_writer(queue, "small_writer", {"0", std::to_string(kCount)});
    Process second = start_writer(queue, "small_writer", {"1", std::to_string(kCount)});
    queue.tavo_android_msg_queue_set_write_fd(-1);
    uint64_t next[2] = {0, 0};
    for (uint64_t i = 0; i < 2 * kCount; ++i) {
        unsigned char buffer[4096], expected[4092];
        unsigned int size = sizeof buffer;
        ASSERT_GE(queue.tavo_android_msg_queue_get(buffer, &size), 16);
        uint64_t writer = 0;
        memcpy(&writer, buffer, sizeof writer);
        ASSERT_LT(writer, 2U);
        const uint64_t number = next[writer]++;
        ASSERT_EQ(size, small_size(number));
        fill_small(expected, writer, number);
        ASSERT_EQ(memcmp(buffer, expected, size), 0) << writer << ", " << number;
    }
    EXPECT_EQ(first.wait(), 0);
    EXPECT_EQ(second.wait(), 0);
    EXPECT_EQ(next[0], kCount);
    EXPECT_EQ(next[1], kCount);
}

TEST(MessageQueueWriters, ThreadsMayPutThroughOneObject) {
    TAVO_MessageQueue queue;
    std::vector<std::thread> writers;
    // Larger than a page, so that each makes room; few enough to fit without mixing.
    for (const char c : {'a', 'b'})
        writers.emplace_back([&queue, c] { EXPECT_EQ(put(queue, std::string(5000, c)), 0); });
    for (std::thread& writer : writers) writer.join();
    std::vector<std::string> messages = {get(queue), get(queue)};
    std::sort(messages.begin(), messages.end());
    EXPECT_EQ(messages[0], std::string(5000, 'a'));
    EXPECT_EQ(messages[1], std::string(5000, 'b'));
}

TEST(MessageQueueWriters, AProcessThatDiesInsideAFrameLeavesTheShortCount) {
    TAVO_MessageQueue queue;
    Process writer = start_writer(queue, "dying_writer", {});
    queue.tavo_android_msg_queue_set_write_fd(-1);
    EXPECT_EQ(writer.read_line(), "written");
    writer.kill(SIGKILL);
    EXPECT_EQ(writer.wait(), -SIGKILL);
    EXPECT_EQ(get(queue), "half");
    EXPECT_EQ(get(queue), "");
}

TEST_ROLE(dying_writer) {
    const char half[] = "\x0a\0\0\0half";
    if (write(std::stoi(arguments[0]), half, 8) != 8) return 1;
    puts("written");
    pause();
    return 0;
}

}  // namespace

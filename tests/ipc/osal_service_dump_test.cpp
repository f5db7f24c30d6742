// What the service tells about itself, asked in its own process.
#include "ipc/osal_service_dump_test.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>

#include <atomic>
#include <nlohmann/json.hpp>

#include "ipc/TAVO_MessageQueue.h"
#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/osal_service_test.h"
#include "support/eventually.h"
#include "support/process.h"

namespace {

using android::IMemoryHeap;
using android::sp;
using nlohmann::json;
using tavo::test::AllocationFault;
using tavo::test::count_descriptors;
using tavo::test::DescriptorLimit;
using tavo::test::Dump;
using tavo::test::dump_arguments;
using tavo::test::dump_of;

class OsalServiceDump : public tavo::test::OsalServiceTest {
protected:
    json figures() {
        const Dump dump = dump_of(service_, {"--json"});
        EXPECT_EQ(dump.status, 0);
        return json::parse(dump.text);
    }
    android::status_t dump_to(int fd) { return service_->dump(fd, dump_arguments({})); }
};

// A pipe that takes nothing more, and that nobody reads.
struct FullPipe {
    FullPipe() {
        EXPECT_EQ(pipe2(ends, O_CLOEXEC | O_NONBLOCK), 0);
        const std::string page(4096, 'x');
        while (write(ends[1], page.data(), page.size()) > 0) {
        }
        fcntl(ends[1], F_SETFL, 0);  // whoever writes waits
    }
    ~FullPipe() {
        close(ends[0]);
        close(ends[1]);
    }
    int ends[2];
};

TEST_F(OsalServiceDump, SaysNothingWithoutMemory) {
    start(16, 8);
    service_->create_message_queue(7);
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC | O_NONBLOCK), 0);
    {
        const AllocationFault fault(AllocationFault::kNew, 1);
        EXPECT_EQ(dump_to(ends[1]), android::NO_MEMORY);
    }
    char byte = 0;
    EXPECT_EQ(read(ends[0], &byte, 1), -1);
    EXPECT_EQ(dump_to(ends[1]), android::NO_ERROR);
    EXPECT_EQ(read(ends[0], &byte, 1), 1);
    close(ends[0]);
    close(ends[1]);
}

TEST_F(OsalServiceDump, TellsPeopleOfQueuesAndBlocks) {
    start(16, 8);
    service_->create_message_queue(7);
    service_->create_message_queue(7);
    service_->create_message_queue(-5);
    const sp<IMemoryHeap> block = service_->get_shared_mem(9, 5000);
    ASSERT_EQ(write(service_->get_write_fd(7), "hello", 5), 5);
    const std::string pipe7 = std::to_string(fcntl(service_->get_fd(7), F_GETPIPE_SZ));
    const std::string pipe5 = std::to_string(fcntl(service_->get_fd(-5), F_GETPIPE_SZ));

    const auto padded = [](const std::string& text, size_t width) {
        return std::string(width - text.size(), ' ') + text;
    };
    const auto fd = [&](int number) { return " " + padded(std::to_string(number), 10); };
    const Dump dump = dump_of(service_);
    EXPECT_EQ(dump.status, 0);
    EXPECT_EQ(dump.text, "service android.tavo.osal, process " + std::to_string(getpid()) +
                             "\n"
                             "message queues: 2, room for 16, uses: 3, bytes pending: 5 of " +
                             std::to_string(std::stoi(pipe7) + std::stoi(pipe5)) +
                             "\n"
                             "         key       uses   read end  write end   capacity    pending\n"
                             "           7          2" +
                             fd(service_->get_fd(7)) + fd(service_->get_write_fd(7)) + " " + padded(pipe7, 10) +
                             "          5\n"
                             "          -5          1" +
                             fd(service_->get_fd(-5)) + fd(service_->get_write_fd(-5)) + " " + padded(pipe5, 10) +
                             "          0\n"
                             "shared-memory blocks: 1, limit 8, uses: 1, bytes: 5000\n"
                             "         key       uses       size references\n"
                             "           9          1       5000          3\n");
}

TEST_F(OsalServiceDump, TellsProgramsTheSame) {
    start(16, 8);
    service_->create_message_queue(7);
    service_->create_message_queue(7);
    const sp<IMemoryHeap> first = service_->get_shared_mem(9, 5000);
    const sp<IMemoryHeap> second = service_->get_shared_mem(9, 1);
    ASSERT_EQ(write(service_->get_write_fd(7), "hello", 5), 5);

    const json told = figures();
    EXPECT_EQ(told, (json{{"service", "android.tavo.osal"},
                          {"process", getpid()},
                          {"queue_table", true},
                          {"queue_room", 16},
                          {"queues", json::array({{{"key", 7},
                                                   {"uses", 2},
                                                   {"read_end", service_->get_fd(7)},
                                                   {"write_end", service_->get_write_fd(7)},
                                                   {"capacity", fcntl(service_->get_fd(7), F_GETPIPE_SZ)},
                                                   {"pending", 5}}})},
                          {"block_list", true},
                          {"block_limit", 8},
                          {"blocks", json::array({{{"key", 9}, {"uses", 2}, {"size", 5000}, {"references", 4}}})},
                          {"totals",
                           {{"queues", 1},
                            {"queue_uses", 2},
                            {"capacity", fcntl(service_->get_fd(7), F_GETPIPE_SZ)},
                            {"pending", 5},
                            {"blocks", 1},
                            {"block_uses", 2},
                            {"size", 5000}}}}));
}

TEST_F(OsalServiceDump, IsOneLineOfJson) {
    start();
    const std::string text = dump_of(service_, {"--json"}).text;
    EXPECT_EQ(text.find('\n'), text.size() - 1);
}

TEST_F(OsalServiceDump, ExplainsItsArgument) {
    start();
    for (const char* option : {"-h", "--help"}) {
        EXPECT_EQ(dump_of(service_, {option}).text,
                  "The figures of the message queues and shared-memory blocks. --json gives them as JSON.\n");
    }
}

TEST_F(OsalServiceDump, IgnoresThePlatformsArguments) {
    start();
    EXPECT_EQ(dump_of(service_, {"-a", "--proto"}).text, dump_of(service_).text);
    EXPECT_EQ(dump_of(service_, {"-a", "--json"}).text, dump_of(service_, {"--json"}).text);
}

TEST_F(OsalServiceDump, OfAServiceThatWasNotInitialisedSaysSo) {
    const json told = figures();
    EXPECT_FALSE(told["queue_table"]);
    EXPECT_FALSE(told["block_list"]);
    EXPECT_TRUE(told["queues"].empty());
    EXPECT_TRUE(told["blocks"].empty());
    EXPECT_EQ(dump_of(service_).text, "service android.tavo.osal, process " + std::to_string(getpid()) +
                                          "\n"
                                          "no table of message queues: the service could not be initialised\n"
                                          "message queues: 0, room for 0, uses: 0, bytes pending: 0 of 0\n"
                                          "no list of shared-memory blocks: the service could not be initialised\n"
                                          "shared-memory blocks: 0, limit 0, uses: 0, bytes: 0\n");
}

TEST_F(OsalServiceDump, WithoutAFreeDescriptorLeavesThePipesOut) {
    start();
    service_->create_message_queue(7);
    // A sanitizer that sees a class for the first time needs a descriptor to look at it.
    ASSERT_EQ(dump_of(service_, {"--json"}).status, 0);
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    {
        const DescriptorLimit one(1);
        const int last = open("/dev/null", O_RDONLY | O_CLOEXEC);
        ASSERT_GE(last, 0);
        EXPECT_EQ(service_->dump(ends[1], dump_arguments({"--json"})), 0);
        EXPECT_EQ(service_->dump(ends[1], dump_arguments({})), 0);
        close(last);
    }
    close(ends[1]);
    const std::string text = tavo::test::read_to_end(ends[0]);
    close(ends[0]);
    const json told = json::parse(text.substr(0, text.find('\n')));
    EXPECT_TRUE(told["queues"][0]["capacity"].is_null());
    EXPECT_TRUE(told["queues"][0]["pending"].is_null());
    EXPECT_EQ(told["totals"]["pending"], 0);
    EXPECT_NE(text.find("          ?          ?\n"), std::string::npos) << text;
}

TEST_F(OsalServiceDump, OfHundredsOfQueuesArrivesWhole) {
    start();
    constexpr int kQueues = 400;
    for (int key = 1; key <= kQueues; ++key) ASSERT_GE(service_->create_message_queue(key), 0);
    const size_t descriptors = count_descriptors();
    const json told = figures();
    EXPECT_EQ(told["queues"].size(), size_t{kQueues});
    EXPECT_EQ(told["queues"][kQueues - 1]["key"], kQueues);
    EXPECT_EQ(count_descriptors(), descriptors);
}

TEST_F(OsalServiceDump, LeavesTheDescriptorOpen) {
    start();
    FullPipe pipe;
    char scratch[8192];
    ASSERT_GT(read(pipe.ends[0], scratch, sizeof scratch), 0);
    EXPECT_EQ(dump_to(pipe.ends[1]), 0);
    EXPECT_TRUE(tavo::test::is_open(pipe.ends[1]));
}

TEST_F(OsalServiceDump, ToAPipeWithoutAReaderFailsAndHurtsNobody) {
    start();
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    close(ends[0]);
    signal(SIGPIPE, SIG_DFL);
    EXPECT_EQ(dump_to(ends[1]), -EPIPE);
    close(ends[1]);
    sigset_t pending;
    ASSERT_EQ(sigpending(&pending), 0);
    EXPECT_EQ(sigismember(&pending, SIGPIPE), 0);
    sigset_t blocked;
    ASSERT_EQ(pthread_sigmask(SIG_BLOCK, nullptr, &blocked), 0);
    EXPECT_EQ(sigismember(&blocked, SIGPIPE), 0);
}

TEST_F(OsalServiceDump, LeavesABrokenPipeSignalThatWasWaitingBefore) {
    start();
    sigset_t broken_pipe;
    sigemptyset(&broken_pipe);
    sigaddset(&broken_pipe, SIGPIPE);
    pthread_sigmask(SIG_BLOCK, &broken_pipe, nullptr);
    raise(SIGPIPE);
    EXPECT_EQ(dump_of(service_).status, 0);
    sigset_t pending;
    ASSERT_EQ(sigpending(&pending), 0);
    EXPECT_EQ(sigismember(&pending, SIGPIPE), 1);
}

TEST_F(OsalServiceDump, ToNoDescriptorFails) {
    start();
    EXPECT_EQ(dump_to(-1), -EBADF);
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    close(ends[0]);
    close(ends[1]);
    EXPECT_EQ(dump_to(ends[1]), -EBADF);
}

TEST_F(OsalServiceDump, ToAFileThatCannotBeWrittenFails) {
    start();
    const int file = open("/sdcard/shm_key_index_file.txt", O_RDONLY | O_CLOEXEC);
    ASSERT_GE(file, 0);
    EXPECT_EQ(dump_to(file), -EBADF);
    close(file);
    const int full = open("/dev/full", O_WRONLY | O_CLOEXEC);
    ASSERT_GE(full, 0);
    EXPECT_EQ(dump_to(full), -ENOSPC);
    close(full);
}

TEST_F(OsalServiceDump, GivesUpWhenNobodyReads) {
    start();
    FullPipe pipe;
    EXPECT_EQ(dump_to(pipe.ends[1]), android::TIMED_OUT);

    int sockets[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, sockets), 0);
    const std::string page(4096, 'x');
    while (send(sockets[0], page.data(), page.size(), MSG_DONTWAIT) > 0) {
    }
    EXPECT_EQ(dump_to(sockets[0]), android::TIMED_OUT);
    close(sockets[0]);
    close(sockets[1]);
}

TEST_F(OsalServiceDump, ThatNobodyReadsHoldsUpNothingElse) {
    start();
    service_->create_message_queue(7);
    FullPipe pipe;
    std::atomic<bool> done{false};
    std::thread stuck([&] {
        EXPECT_EQ(dump_to(pipe.ends[1]), android::TIMED_OUT);
        done = true;
    });
    int rounds = 0;
    do {
        EXPECT_EQ(service_->create_message_queue(7), 0);
        EXPECT_EQ(service_->delete_message_queue(7), 0);
        EXPECT_EQ(dump_of(service_).status, 0);
        ++rounds;
    } while (!done);
    stuck.join();
    EXPECT_GT(rounds, 1);
}

TEST_F(OsalServiceDump, ThatNobodyReadsIsRefusedToTooMany) {
    start();
    FullPipe pipe;
    std::atomic<int> refused{0}, timed_out{0};
    std::vector<std::thread> stuck;
    // All are there before the first has given up, unless the machine stands still; then there are others.
    const bool came = tavo::test::comes_true([&] {
        stuck.emplace_back([&] { ++(dump_to(pipe.ends[1]) == android::WOULD_BLOCK ? refused : timed_out); });
        return refused > 0;
    });
    for (std::thread& thread : stuck) thread.join();
    EXPECT_TRUE(came);
    EXPECT_GE(timed_out, 4);
    EXPECT_EQ(dump_of(service_).status, 0);
}

TEST_F(OsalServiceDump, IsValidWhileQueuesAndBlocksComeAndGo) {
    start(1, 1);
    constexpr int kChangers = 3;
    constexpr int kRounds = 200;
    std::atomic<int> left{kChangers};
    std::vector<std::thread> threads;
    for (int i = 0; i < kChangers; ++i) {
        threads.emplace_back([&, i] {
            for (int round = 0; round < kRounds; ++round) {
                const int key = 1 + (i + round) % 5;
                service_->create_message_queue(key);
                const sp<IMemoryHeap> block = service_->get_shared_mem(key, 100);
                service_->delete_message_queue(key);
                service_->delete_shared_mem(key);
                if (i == 0 && round % 50 == 49) service_->TavoOsalServiceInit(1, 1);
            }
            --left;
        });
    }
    const size_t at_least = 20;
    for (size_t dumps = 0; left > 0 || dumps < at_least; ++dumps) {
        const json told = figures();
        EXPECT_LE(told["queues"].size(), 5U);
        EXPECT_EQ(told["queues"].size(), told["totals"]["queues"]);
        for (const json& queue : told["queues"]) {
            EXPECT_GE(queue["uses"], 1);
            EXPECT_GT(queue["capacity"], 0);
        }
        for (const json& block : told["blocks"]) EXPECT_EQ(block["size"], 100);
    }
    for (std::thread& thread : threads) thread.join();
}

}  // namespace

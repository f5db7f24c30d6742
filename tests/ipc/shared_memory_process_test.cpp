// Blocks between processes: what crosses, what survives, what goes, and what a hostile process cannot do.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <string>

#include "ipc/server.h"
#include "ipc/shared_memory_test.h"
#include "support/eventually.h"
#include "support/pace.h"
#include "support/process.h"

namespace {

using tavo::test::acquire;
using tavo::test::Block;
using tavo::test::comes_true;
using tavo::test::count_blocks;
using tavo::test::count_descriptors;
using tavo::test::count_memory_files;
using tavo::test::is_slow;
using tavo::test::make_handle;
using tavo::test::Process;
using tavo::test::Server;

constexpr uint32_t kKey = 7;

uint32_t number(const std::string& text) { return static_cast<uint32_t>(std::stoul(text)); }

// Acquires a block; then, line by line, says what its first and last byte are, or sets them. Ends with its input.
TEST_ROLE(client) {
    const uint32_t size = number(arguments[1]);
    auto* const bytes = static_cast<unsigned char*>(acquire(number(arguments[0]), size));
    printf("%d\n", bytes != nullptr);
    char command[64];
    while (fgets(command, sizeof command, stdin) != nullptr) {
        if (unsigned value = 0; sscanf(command, "set %u", &value) == 1) {
            bytes[0] = bytes[size - 1] = static_cast<unsigned char>(value);
            puts("set");
        } else if (strcmp(command, "release\n") == 0) {
            printf("%d\n", tavo_shm_release(bytes));
        } else if (strcmp(command, "delete\n") == 0) {
            printf("%d\n", tavo_shm_delete(make_handle(number(arguments[0]), size)));
        } else {
            printf("%d %d\n", bytes[0], bytes[size - 1]);
        }
    }
    return 0;
}

class Client {
public:
    Client(uint32_t key, uint32_t size)
        : process_(Process::start("client", {std::to_string(key), std::to_string(size)})) {
        EXPECT_EQ(process_.read_line(), "1");
    }
    std::string ask(const std::string& command) {
        process_.write_line(command);
        return process_.read_line();
    }
    pid_t pid() const { return process_.pid(); }
    void kill() {
        process_.kill(SIGKILL);
        process_.wait();
    }

private:
    Process process_;
};

class SharedMemorySizes : public testing::TestWithParam<uint32_t> {};

TEST_P(SharedMemorySizes, AreSharedFromTheFirstByteToTheLast) {
    const uint32_t size = GetParam();
    const Server server;
    const Block block(kKey, size);
    ASSERT_NE(block.address(), nullptr);
    Client other(kKey, size);
    EXPECT_EQ(other.ask("get"), "0 0");
    block.bytes()[0] = block.bytes()[size - 1] = 65;
    EXPECT_EQ(other.ask("get"), "65 65");
    EXPECT_EQ(other.ask("set 200"), "set");
    EXPECT_EQ(block.bytes()[0], 200);
    EXPECT_EQ(block.bytes()[size - 1], 200);
}

INSTANTIATE_TEST_SUITE_P(Bytes, SharedMemorySizes, testing::Values(1, 2, 4095, 4096, 4097, 1 << 20, 64 << 20));

TEST(SharedMemoryProcesses, EveryByteOfTheLargestBlockIsThere) {
    constexpr uint32_t kSize = 64 << 20;
    const Server server;
    const Block block(kKey, kSize);
    memset(block.address(), 1, kSize);
    uint64_t sum = 0;
    for (uint32_t i = 0; i < kSize; ++i) sum += block.bytes()[i];
    EXPECT_EQ(sum, kSize);
}

TEST(SharedMemoryProcesses, ABlockShowsItsNameInTheMapsOfServerAndClients) {
    const Server server;
    const Block block(kKey, 100);
    EXPECT_EQ(count_blocks(kKey), 1U);
    EXPECT_EQ(count_blocks(kKey, server.pid()), 1U);
}

TEST(SharedMemoryProcesses, ABlockSurvivesItsDeletionWhileItIsMapped) {
    const Server server;
    const Block block(kKey, 100);
    Client other(kKey, 100);
    EXPECT_EQ(other.ask("delete"), "0");
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    block.bytes()[0] = block.bytes()[99] = 66;
    EXPECT_EQ(other.ask("get"), "66 66");
    EXPECT_EQ(other.ask("set 67"), "set");
    EXPECT_EQ(block.bytes()[99], 67);
}

TEST(SharedMemoryProcesses, AKeyThatIsUsedAgainAfterItsDeletionIsAnUnrelatedBlock) {
    const Server server;
    const Block old(kKey, 100);
    old.bytes()[0] = 66;
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    const Block young(kKey, 100);
    Client other(kKey, 100);
    EXPECT_NE(young.address(), old.address());
    EXPECT_EQ(young.bytes()[0], 0);
    EXPECT_EQ(other.ask("set 67"), "set");
    EXPECT_EQ(young.bytes()[0], 67);
    EXPECT_EQ(old.bytes()[0], 66);
    EXPECT_EQ(count_blocks(kKey), 2U);
}

TEST(SharedMemoryProcesses, TheServiceKeepsABlockUntilItWasDeletedAsOftenAsAcquired) {
    const Server server;
    void* const first = acquire(kKey, 100);
    static_cast<char*>(first)[0] = 'x';
    acquire(kKey, 100);
    EXPECT_EQ(tavo_shm_release(first), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_release(first), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    {
        const Block again(kKey, 100);
        EXPECT_EQ(again.bytes()[0], 'x');
    }
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    const Block young(kKey, 100);
    EXPECT_EQ(young.bytes()[0], 0);
}

TEST(SharedMemoryProcesses, AMappingSurvivesTheServer) {
    Server server;
    const Block block(kKey, 100);
    Client other(kKey, 100);
    server.kill();
    EXPECT_EQ(other.ask("set 68"), "set");
    EXPECT_EQ(block.bytes()[0], 68);
    EXPECT_EQ(other.ask("release"), "0");
    EXPECT_EQ(count_blocks(kKey, other.pid()), 0U);
}

TEST(SharedMemoryProcesses, AServerThatTookOverHasBlocksOfItsOwn) {
    Server first;
    const Block old(kKey, 100);
    old.bytes()[0] = 66;
    first.kill();
    const Server second;
    const Block young(kKey, 100);
    EXPECT_EQ(young.bytes()[0], 0);
    EXPECT_EQ(old.bytes()[0], 66);
}

TEST(SharedMemoryProcesses, TheMemoryIsGivenBackWithTheLastUser) {
    const Server server;
    const size_t server_descriptors = count_descriptors(server.pid());
    {
        const Block block(kKey, 100);
        Client other(kKey, 100);
        EXPECT_EQ(count_memory_files(server.pid()), 1U);
        EXPECT_EQ(other.ask("delete"), "0");
        EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
        EXPECT_EQ(other.ask("release"), "0");
        EXPECT_EQ(count_blocks(kKey, other.pid()), 0U);
        EXPECT_EQ(count_memory_files(other.pid()), 0U);
        EXPECT_EQ(count_memory_files(server.pid()), 1U);
        EXPECT_EQ(count_blocks(kKey, server.pid()), 1U);
    }
    EXPECT_EQ(count_blocks(kKey), 0U);
    EXPECT_EQ(count_memory_files(), 0U);
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid()) == 0; }));
    EXPECT_TRUE(comes_true([&] { return count_blocks(kKey, server.pid()) == 0; }));
    // The server keeps a way to each client that is still there: this process.
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server.pid()) <= server_descriptors + 3; }));
}

TEST(SharedMemoryProcesses, TheMemoryIsGivenBackWhenTheLastUserIsKilled) {
    const Server server;
    Client other(kKey, 100);
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    EXPECT_EQ(count_memory_files(server.pid()), 1U);
    other.kill();
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid()) == 0; }));
    EXPECT_TRUE(comes_true([&] { return count_blocks(kKey, server.pid()) == 0; }));
}

TEST_ROLE(leaves_blocks_mapped) {
    acquire(kKey, 100);
    acquire(kKey + 1, 100);
    return 0;
}

TEST(SharedMemoryProcesses, AProcessMayEndWithBlocksMapped) {
    const Server server;
    Process process = Process::start("leaves_blocks_mapped");
    EXPECT_EQ(process.wait(), 0);
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 100)), TAVO_SUCCESS);
    EXPECT_EQ(tavo_shm_delete(make_handle(kKey + 1, 100)), TAVO_SUCCESS);
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid()) == 0; }));
}

// A descriptor for the memory file of a block, opened anew from this process's own.
int open_memory_file(int flags) {
    for (int fd = 0; fd < 256; ++fd) {
        const std::string path = "/proc/self/fd/" + std::to_string(fd);
        char link[256] = {};
        if (readlink(path.c_str(), link, sizeof link - 1) < 0 || strstr(link, "/memfd:SharedMemory_") == nullptr) {
            continue;
        }
        return open(path.c_str(), flags | O_CLOEXEC);
    }
    errno = ENOENT;
    return -1;
}

TEST_ROLE(hostile_client) {
    acquire(kKey, 8192);
    const int fd = open_memory_file(O_RDWR);
    const auto refused = [](int result, int error) { return result == -1 && errno == error ? '1' : '0'; };
    std::string result;
    result += fd >= 0 ? '1' : '0';
    result += refused(ftruncate(fd, 0), EPERM);
    result += refused(ftruncate(fd, 4096), EPERM);
    result += refused(ftruncate(fd, 1 << 20), EPERM);
    result += refused(open_memory_file(O_RDWR | O_TRUNC), EPERM);
    result += refused(fcntl(fd, F_ADD_SEALS, F_SEAL_WRITE), EPERM);
    result += refused(fallocate(fd, 0, 8192, 4096), EPERM);
    // Bytes can be taken out in between, which only makes them zeros.
    result += fallocate(fd, FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, 0, 8192) == 0 ? '1' : '0';
    puts(result.c_str());
    return 0;
}

TEST(SharedMemoryProcesses, AClientCannotTakeTheMemoryAwayFromTheOthers) {
    const Server server;
    const Block block(kKey, 8192);
    Client other(kKey, 8192);
    EXPECT_EQ(other.ask("set 65"), "set");
    Process hostile = Process::start("hostile_client");
    EXPECT_EQ(hostile.read_line(), "11111111");
    EXPECT_EQ(hostile.wait(), 0);
    // Neither of these dies of it, and the service still reads the block when it is deleted.
    EXPECT_EQ(other.ask("get"), "0 0");
    EXPECT_EQ(block.bytes()[8191], 0);
    for (int use = 0; use < 3; ++use) EXPECT_EQ(tavo_shm_delete(make_handle(kKey, 8192)), TAVO_SUCCESS);
    EXPECT_EQ(other.ask("set 66"), "set");
    EXPECT_EQ(block.bytes()[0], 66);
    const Block young(kKey, 100);
    EXPECT_EQ(young.bytes()[0], 0);
}

size_t resident_kib(pid_t pid) {
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.rfind("VmRSS:", 0) == 0) return std::stoul(line.substr(6));
    }
    return 0;
}

void play_rounds(int count) {
    for (int i = 0; i < count; ++i) {
        TavoShmHandle* handle = make_handle(kKey, 10000);
        void* address = nullptr;
        ASSERT_EQ(tavo_shm_acquire(handle, &address), TAVO_SUCCESS);
        memset(address, i, 10000);
        ASSERT_EQ(tavo_shm_release(address), TAVO_SUCCESS);
        ASSERT_EQ(tavo_shm_delete(handle), TAVO_SUCCESS);
    }
}

TEST(SharedMemoryProcesses, HoldNothingBackAfterThousandsOfRounds) {
    const Server server;
    const int rounds = is_slow() ? 500 : 10000;
    play_rounds(rounds / 10);
    const size_t descriptors = count_descriptors();
    const size_t server_descriptors = count_descriptors(server.pid());
    const size_t resident = resident_kib(getpid());
    const size_t server_resident = resident_kib(server.pid());
    play_rounds(rounds);
    EXPECT_EQ(count_descriptors(), descriptors);
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server.pid()) <= server_descriptors; }));
    EXPECT_TRUE(comes_true([&] { return count_memory_files(server.pid()) == 0; }));
    EXPECT_EQ(count_blocks(kKey), 0U);
    EXPECT_TRUE(comes_true([&] { return count_blocks(kKey, server.pid()) == 0; }));
    printf("resident: client %zu -> %zu, server %zu -> %zu KiB\n", resident, resident_kib(getpid()), server_resident,
           resident_kib(server.pid()));
    // A leak of 32 bytes a round would show. The sanitizers' own bookkeeping grows; they look for leaks themselves. So
    // does the code that an emulator has translated.
    if (is_slow()) return;
    EXPECT_LE(resident_kib(getpid()), resident + 256);
    EXPECT_LE(resident_kib(server.pid()), server_resident + 256);
}

}  // namespace

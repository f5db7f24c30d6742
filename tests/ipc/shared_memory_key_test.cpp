#include <gtest/gtest.h>
#include <sys/ipc.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <set>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/init.h"
#include "tavo_osal/shared_memory.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::LogCapture;
using tavo::test::logged;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kTag[] = "TAVO_OSAL_SHARED_MEM";
constexpr char kIndexFile[] = "/sdcard/shm_key_index_file.txt";
constexpr char kKeyFile[] = "/sdcard/shm_key_gen_file.txt";
constexpr uint32_t kFallbackKey = 0xFFFFFFFF;

void write_file(const char* path, const std::string& bytes) { std::ofstream(path, std::ios::binary) << bytes; }

std::string read_file(const char* path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::string bytes_of(int32_t number) {
    std::string bytes(sizeof number, '\0');
    memcpy(bytes.data(), &number, sizeof number);
    return bytes;
}

uint32_t key_of(int index) { return static_cast<uint32_t>(ftok(kKeyFile, index)); }

// The address of the open file in a line cannot be known.
std::string without_address(const std::string& text) {
    const size_t address = text.find("fp = 0x");
    return address == std::string::npos ? text : text.substr(0, address) + "fp = ADDRESS.\n";
}

class SharedMemoryKey : public testing::Test {
protected:
    void SetUp() override {
        std::remove(kIndexFile);
        write_file(kKeyFile, "");
    }
    static uint32_t create() {
        uint32_t key = 0;
        EXPECT_EQ(tavo_osal_shared_memory_key_create(&key), TAVO_SUCCESS);
        return key;
    }
};

TEST_F(SharedMemoryKey, IsTheFallbackWithoutAnIndexFile) {
    LogCapture log;
    uint32_t key = 0x1234;
    EXPECT_EQ(tavo_osal_shared_memory_key_create(&key), TAVO_SUCCESS);
    EXPECT_EQ(key, kFallbackKey);
    EXPECT_NE(access(kIndexFile, F_OK), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{6, kTag, "++Entered\n"},
                                             {5, kTag, " key  = 0x1234\n"},
                                             {3, kTag, "Opening file in read mode, fp = (nil).\n"},
                                             {1, kTag, "Opening file in read mode failed with errno =2\n"},
                                             {3, kTag, "boFileBased = 0\n"},
                                             {3, kTag, "Older way\n"},
                                             {3, kTag, "Key = 4294967295\n"},
                                             {6, kTag, "--Exiting\n"}}));
}

TEST_F(SharedMemoryKey, CountsTheIndexUpAndIsMadeOfTheKeyFile) {
    write_file(kIndexFile, bytes_of(1));
    const LogCapture log;
    uint32_t key = 0;
    EXPECT_EQ(tavo_osal_shared_memory_key_create(&key), TAVO_SUCCESS);
    EXPECT_EQ(key, key_of(2));
    EXPECT_NE(key, kFallbackKey);
    EXPECT_EQ(read_file(kIndexFile), bytes_of(2));

    auto lines = log.lines();
    for (auto& line : lines) line.text = without_address(line.text);
    EXPECT_TRUE(logged_exactly(lines, {{6, kTag, "++Entered\n"},
                                       {5, kTag, " key  = 0\n"},
                                       {3, kTag, "Opening file in read mode, fp = ADDRESS.\n"},
                                       {3, kTag, "After reading, iRet = 1, index = 1.\n"},
                                       {3, kTag, "Opening file in write mode, fp = ADDRESS.\n"},
                                       {3, kTag, "After Writing, iRet = 1, index = 2.\n"},
                                       {3, kTag, "Closed the file\n"},
                                       {3, kTag, "boFileBased = TRUE\n"},
                                       {3, kTag, "boFileBased = 1\n"},
                                       {3, kTag, "File based\n"},
                                       {3, kTag, "Key = " + std::to_string(key) + "\n"},
                                       {6, kTag, "--Exiting\n"}}));
}

TEST_F(SharedMemoryKey, LeavesTheIndexFileOpenToAllWhateverTheMask) {
    write_file(kIndexFile, bytes_of(1));
    ASSERT_EQ(chmod(kIndexFile, 0600), 0);
    const mode_t before = umask(077);
    create();
    umask(before);
    struct stat status = {};
    ASSERT_EQ(stat(kIndexFile, &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0777U);
}

TEST_F(SharedMemoryKey, TakesAnEmptyIndexFileAsOne) {
    write_file(kIndexFile, "");
    const LogCapture log;
    EXPECT_EQ(create(), key_of(2));
    EXPECT_EQ(read_file(kIndexFile), bytes_of(2));
    EXPECT_TRUE(logged(log.lines(), {3, kTag, "After reading, iRet = 0, index = 1.\n"}));
}

TEST_F(SharedMemoryKey, TakesAnIndexFileThatIsTooShortAsOne) {
    write_file(kIndexFile, "\x07\x07\x07");
    EXPECT_EQ(create(), key_of(2));
    EXPECT_EQ(read_file(kIndexFile), bytes_of(2));
}

TEST_F(SharedMemoryKey, DropsWhatFollowsTheIndex) {
    write_file(kIndexFile, bytes_of(5) + "more");
    EXPECT_EQ(create(), key_of(6));
    EXPECT_EQ(read_file(kIndexFile), bytes_of(6));
}

TEST_F(SharedMemoryKey, WrapsTheLargestIndex) {
    write_file(kIndexFile, bytes_of(INT32_MAX));
    create();
    EXPECT_EQ(read_file(kIndexFile), bytes_of(INT32_MIN));
}

TEST_F(SharedMemoryKey, RepeatsAfter256) {
    write_file(kIndexFile, bytes_of(1));
    std::set<uint32_t> keys;
    const uint32_t first = create();
    keys.insert(first);
    for (int i = 1; i < 256; ++i) keys.insert(create());
    EXPECT_EQ(keys.size(), 256U);
    EXPECT_EQ(create(), first);
    EXPECT_EQ(read_file(kIndexFile), bytes_of(258));
}

TEST_F(SharedMemoryKey, IsTheFallbacksValueWithoutTheKeyFileThoughTheIndexCounts) {
    write_file(kIndexFile, bytes_of(7));
    ASSERT_EQ(std::remove(kKeyFile), 0);
    const LogCapture log;
    EXPECT_EQ(create(), kFallbackKey);
    EXPECT_EQ(read_file(kIndexFile), bytes_of(8));
    EXPECT_TRUE(logged(log.lines(), {3, kTag, "File based\n"}));
    EXPECT_TRUE(logged(log.lines(), {3, kTag, "Key = 4294967295\n"}));
}

TEST_F(SharedMemoryKey, IsTheFallbackWhenTheIndexCannotBeWritten) {
    write_file(kIndexFile, bytes_of(7));
    static std::string asked;
    static int asked_index = 0;
    const PlatformHook ftok_hook(
        "libtavoosal.so", "ftok", +[](const char* path, int index) {
            asked = path;
            asked_index = index;
            return ftok(path, index);
        });
    const PlatformHook hook(
        "libtavoosal.so", "fopen", +[](const char* path, const char* mode) -> FILE* {
            if (mode[0] == 'r') return fopen(path, mode);
            errno = EROFS;
            return nullptr;
        });
    const LogCapture log;
    EXPECT_EQ(create(), kFallbackKey);
    EXPECT_EQ(read_file(kIndexFile), bytes_of(7));
    // The newline is part of the path, which must never exist; the index is the one that could not be written.
    EXPECT_EQ(asked, "/system/lib/libdevmgr_interface.so\n");
    EXPECT_EQ(asked_index, 8);

    auto lines = log.lines();
    for (auto& line : lines) line.text = without_address(line.text);
    EXPECT_TRUE(logged_exactly(lines, {{6, kTag, "++Entered\n"},
                                       {5, kTag, " key  = 0\n"},
                                       {3, kTag, "Opening file in read mode, fp = ADDRESS.\n"},
                                       {3, kTag, "After reading, iRet = 1, index = 7.\n"},
                                       {1, kTag, "Opening file in write mode failed with errno =30\n"},
                                       {3, kTag, "boFileBased = 0\n"},
                                       {3, kTag, "Older way\n"},
                                       {3, kTag, "Key = 4294967295\n"},
                                       {6, kTag, "--Exiting\n"}}));
}

TEST_F(SharedMemoryKey, IsOfTheIndexEvenWhenTheDiskIsFull) {
    write_file(kIndexFile, bytes_of(7));
    const PlatformHook hook(
        "libtavoosal.so", "fwrite", +[](const void*, size_t, size_t, FILE*) -> size_t {
            errno = ENOSPC;
            return 0;
        });
    const LogCapture log;
    EXPECT_EQ(create(), key_of(8));
    EXPECT_TRUE(logged(log.lines(), {3, kTag, "After Writing, iRet = 0, index = 8.\n"}));
}

TEST_F(SharedMemoryKey, RefusesANullPointerAndLeavesTheFile) {
    write_file(kIndexFile, bytes_of(7));
    const LogCapture log;
    EXPECT_EQ(tavo_osal_shared_memory_key_create(nullptr), TAVO_INVALID_PARAM);
    EXPECT_EQ(read_file(kIndexFile), bytes_of(7));
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{6, kTag, "++Entered\n"}, {1, kTag, "Invalid parameters \n"}, {6, kTag, "--Exiting\n"}}));
}

TEST_F(SharedMemoryKey, StartsAtTwoWhenTheServiceHasStarted) {
    ASSERT_EQ(tavo_osal_init(2, 2), TAVO_SUCCESS);
    EXPECT_EQ(read_file(kIndexFile), bytes_of(1));
    EXPECT_EQ(create(), key_of(2));
}

TEST_F(SharedMemoryKey, LeavesNoDescriptorOpen) {
    create();  // without an index file
    write_file(kIndexFile, bytes_of(1));
    const size_t before = count_descriptors();
    for (int i = 0; i < 10; ++i) create();
    ASSERT_EQ(std::remove(kIndexFile), 0);
    create();
    EXPECT_EQ(count_descriptors(), before);
}

}  // namespace

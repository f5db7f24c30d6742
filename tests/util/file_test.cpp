#include "tavo_osal/file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <string>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/log.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kPath[] = "/sdcard/file";
constexpr char kMissing[] = "/sdcard/missing";

// The descriptors that a test starts with are those it ends with.
class File : public testing::Test {
protected:
    File() { std::ofstream(kPath) << "first line\nsecond 22\n"; }
    ~File() override {
        unlink(kPath);
        EXPECT_EQ(count_descriptors(), descriptors_);
    }

private:
    const size_t descriptors_ = count_descriptors();
};

TEST_F(File, ReadsLinesElementsAndValues) {
    const LogCapture log;
    FILE* stream = tavo_osal_fopen(kPath, "r");
    ASSERT_NE(stream, nullptr);
    char line[64];
    EXPECT_EQ(tavo_osal_fgets(line, 6, stream), line);
    EXPECT_STREQ(line, "first");
    EXPECT_EQ(tavo_osal_fgets(line, sizeof line, stream), line);
    EXPECT_STREQ(line, " line\n");
    char word[16] = "";
    int number = 0;
    EXPECT_EQ(tavo_osal_fscanf(stream, "%15s %d", word, &number), 2);
    EXPECT_STREQ(word, "second");
    EXPECT_EQ(number, 22);
    EXPECT_EQ(tavo_osal_fscanf(stream, "%d", &number), EOF);
    EXPECT_EQ(tavo_osal_fgets(line, sizeof line, stream), nullptr);
    rewind(stream);
    EXPECT_EQ(tavo_osal_fread(line, 4, 3, stream), 3U);
    EXPECT_EQ(std::string(line, 12), "first line\ns");
    EXPECT_EQ(tavo_osal_fread(line, 4, 10, stream), 2U);  // whole elements only
    EXPECT_EQ(tavo_osal_fread(line, 4, 10, stream), 0U);
    EXPECT_EQ(tavo_osal_fclose(stream), 0);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, WritesElementsAndValues) {
    const LogCapture log;
    FILE* stream = tavo_osal_fopen(kPath, "w");
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(tavo_osal_fwrite("abcdefgh", 3, 2, stream), 2U);
    EXPECT_EQ(tavo_osal_fprintf(stream, "-%d-%s", 7, "x"), 4);
    EXPECT_EQ(tavo_osal_fclose(stream), 0);
    std::string contents;
    std::getline(std::ifstream(kPath), contents);
    EXPECT_EQ(contents, "abcdef-7-x");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, PassesFailuresOnWithoutAWordAndKeepsErrno) {
    const LogCapture log;
    errno = 0;
    EXPECT_EQ(tavo_osal_fopen(kMissing, "r"), nullptr);
    EXPECT_EQ(errno, ENOENT);

    FILE* stream = tavo_osal_fopen(kPath, "r");
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(tavo_osal_fwrite("x", 1, 1, stream), 0U);
    EXPECT_EQ(errno, EBADF);
    EXPECT_LT(tavo_osal_fprintf(stream, "%d", 1), 0);
    EXPECT_EQ(tavo_osal_fclose(stream), 0);

    stream = tavo_osal_fopen("/dev/full", "w");
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(tavo_osal_fwrite("x", 1, 1, stream), 1U);  // into the buffer
    EXPECT_EQ(tavo_osal_fclose(stream), EOF);
    EXPECT_EQ(errno, ENOSPC);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, TellsTheEndOfAFileOnceAndClearsBothIndicators) {
    const LogCapture log;
    FILE* stream = tavo_osal_fopen(kPath, "r");
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(tavo_osal_feof(stream), 0);
    char buffer[64];
    tavo_osal_fread(buffer, 1, sizeof buffer, stream);
    tavo_osal_fwrite("x", 1, 1, stream);  // not open for writing: sets the error indicator, too
    EXPECT_NE(feof(stream), 0);
    EXPECT_NE(ferror(stream), 0);
    EXPECT_NE(tavo_osal_feof(stream), 0);
    EXPECT_EQ(ferror(stream), 0);
    EXPECT_EQ(tavo_osal_feof(stream), 0);
    tavo_osal_fclose(stream);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, TellsAnErrorOnceAndClearsBothIndicators) {
    const LogCapture log;
    FILE* stream = tavo_osal_fopen(kPath, "r");
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(tavo_osal_ferror(stream), 0);
    char buffer[64];
    tavo_osal_fread(buffer, 1, sizeof buffer, stream);
    tavo_osal_fwrite("x", 1, 1, stream);
    EXPECT_NE(tavo_osal_ferror(stream), 0);
    EXPECT_EQ(feof(stream), 0);
    EXPECT_EQ(tavo_osal_ferror(stream), 0);
    tavo_osal_fclose(stream);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, ClearsTheOtherIndicatorAlsoWhenTheOneAskedForIsNotSet) {
    FILE* stream = tavo_osal_fopen(kPath, "r");
    ASSERT_NE(stream, nullptr);
    tavo_osal_fwrite("x", 1, 1, stream);
    EXPECT_EQ(tavo_osal_feof(stream), 0);
    EXPECT_EQ(ferror(stream), 0);
    tavo_osal_fclose(stream);
}

TEST_F(File, FindsWhatExists) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_file_check_existence(kPath), 1);
    EXPECT_EQ(tavo_osal_file_check_existence("/sdcard"), 1);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, ReportsWhatDoesNotExist) {
    LogCapture log;
    EXPECT_EQ(tavo_osal_file_check_existence(kMissing), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_FILE", "File /sdcard/missing does not exist.\n"}}));
    log.clear();
    EXPECT_EQ(tavo_osal_file_check_existence(""), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_FILE", "File  does not exist.\n"}}));
    log.clear();
    EXPECT_EQ(tavo_osal_file_check_existence(nullptr), 0);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_FILE", "File (null) does not exist.\n"}}));
}

TEST_F(File, TellsSizes) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_get_file_size(kPath), 21);
    ASSERT_EQ(truncate(kPath, 0), 0);
    EXPECT_EQ(tavo_osal_get_file_size(kPath), 0);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, TellsSizesBeyond32BitsWherePositionsReachThem) {
    if (sizeof(long) == 4) GTEST_SKIP() << "positions have 32 bits here";
    constexpr int64_t kSize = int64_t{5} << 30;
    ASSERT_EQ(truncate(kPath, static_cast<off_t>(kSize)), 0);
    EXPECT_EQ(tavo_osal_get_file_size(kPath), kSize);
}

TEST_F(File, ReportsANullPathForTheSize) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_get_file_size(nullptr), -1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_FILE", "Invalid file path\n"}}));
}

TEST_F(File, ReportsAFileThatCannotBeOpenedForItsSize) {
    const LogCapture log;
    EXPECT_EQ(tavo_osal_get_file_size(kMissing), -1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_FILE", "Unable to open the file\n"}}));
}

TEST_F(File, ReportsAFileWithoutPositions) {
    ASSERT_EQ(mkfifo("/sdcard/fifo", 0600), 0);
    const int fifo = open("/sdcard/fifo", O_RDWR | O_CLOEXEC);  // a writer, so that opening does not wait
    ASSERT_GE(fifo, 0);
    {
        const LogCapture log;
        EXPECT_EQ(tavo_osal_get_file_size("/sdcard/fifo"), -1);
        EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_FILE", "Unable to seek end-of-file.\n"}}));
    }
    close(fifo);
    unlink("/sdcard/fifo");
}

TEST_F(File, ReportsAPositionThatCannotBeRead) {
    const PlatformHook hook(
        "libtavoosal.so", "ftell", +[](FILE*) -> long {
            errno = EOVERFLOW;
            return -7;
        });
    LogCapture log;
    EXPECT_EQ(tavo_osal_get_file_size(kPath), -7);
    EXPECT_TRUE(logged_exactly(
        log.lines(), {{1, "OSAL_FILE", "Error in getting file size. Errno = " + std::to_string(EOVERFLOW) + "\n"}}));
    log.clear();
    g_uiMxEnabledLogLevel = TAVO_LOG_PERFORMANCE;
    EXPECT_EQ(tavo_osal_get_file_size(kPath), -7);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(File, OpensTheFileForItsSizeCloseOnExec) {
    static int flags = -1;
    const PlatformHook hook(
        "libtavoosal.so", "ftell", +[](FILE* stream) {
            flags = fcntl(fileno(stream), F_GETFD);
            return ftell(stream);
        });
    EXPECT_EQ(tavo_osal_get_file_size(kPath), 21);
    EXPECT_EQ(flags, FD_CLOEXEC);
}

}  // namespace

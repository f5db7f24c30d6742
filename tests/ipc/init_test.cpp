// Becoming the server: what is said and left on the storage.
#include "tavo_osal/init.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>

#include "ipc/descriptors.h"
#include "ipc/init_test.h"
#include "ipc/log_lines.h"
#include "support/platform_fault.h"

namespace {

using tavo::test::ExpectedLine;
using tavo::test::kMarker;
using tavo::test::kMarkerDirectory;
using tavo::test::kServiceTag;
using tavo::test::library_lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::OsalInit;
using tavo::test::PlatformHook;

constexpr char kLibrary[] = "libtavoosal.so";

ExpectedLine line(unsigned level, const std::string& message) { return {level, kServiceTag, message}; }

mode_t mode_of(const char* path) {
    struct stat status = {};
    return stat(path, &status) == 0 ? status.st_mode & 07777 : 0;
}

// What is said from the marker to the end, with both tables built.
std::vector<ExpectedLine> lines_of_success(bool overriding) {
    std::vector<ExpectedLine> lines = {
        line(6, "++Entered\n"),
        line(4, "creating service file  /sdcard/com.zorla.qirserver/android.tavo.osal \n"),
    };
    if (overriding) lines.push_back(line(1, "Overriding the android osal  service ( android.tavo.osal )!!\n"));
    const ExpectedLine rest[] = {
        line(6, "++Entered\n"),
        line(5, "Param1: uiMaxNumMsgQueues = 3\n"),
        line(5, "Param2: uiMaxNumSharedMemBlocks = 4\n"),
        line(3, "Shared memory list head node allocation done.\n"),
        line(3, "Opening file in write mode, fp = PTR.\n"),
        line(3, "After reading, iRet = 0, index = 0.\n"),
        line(3, "After reading, iRet = 0, index = 1.\n"),
        line(4, "Service class created\n"),
        line(6, "--Exiting\n"),
        line(3, "Starting the service\n"),
        line(6, "--Exiting\n"),
    };
    lines.insert(lines.end(), std::begin(rest), std::end(rest));
    return lines;
}

TEST_F(OsalInit, LeavesTheMarkerAndPublishes) {
    log_everything();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_init(3, 4), 0);
    EXPECT_TRUE(logged_exactly(library_lines(log), lines_of_success(false)));
    EXPECT_TRUE(std::filesystem::is_directory(kMarkerDirectory));
    EXPECT_EQ(mode_of(kMarker), 0777U);
    EXPECT_EQ(std::filesystem::file_size(kMarker), 0U);
    EXPECT_NE(published(), nullptr);
}

TEST_F(OsalInit, OverridesAMarkerThatWasLeftBehind) {
    std::filesystem::create_directory(kMarkerDirectory);
    std::ofstream(kMarker) << "kept";
    chmod(kMarker, 0604);
    log_everything();
    const LogCapture log;
    EXPECT_EQ(tavo_osal_init(3, 4), 0);
    EXPECT_TRUE(logged_exactly(library_lines(log), lines_of_success(true)));
    EXPECT_EQ(mode_of(kMarker), 0604U);
    EXPECT_EQ(std::filesystem::file_size(kMarker), 4U);
    EXPECT_NE(published(), nullptr);
}

TEST_F(OsalInit, GivesTheMarkerItsModeUnderAnyMask) {
    for (const mode_t mask : {0U, 022U, 077U}) {
        std::filesystem::remove_all(kMarkerDirectory);
        const mode_t saved = umask(mask);
        EXPECT_EQ(tavo_osal_init(3, 4), 0);
        umask(saved);
        EXPECT_EQ(mode_of(kMarkerDirectory), 0777U & ~mask);
        EXPECT_EQ(mode_of(kMarker), 0777U);
    }
}

TEST_F(OsalInit, MakesTheDirectoryAndTheMarkerForEverybody) {
    static mode_t directory_mode, marker_mode;
    static int marker_flags;
    const PlatformHook mkdir_hook(
        kLibrary, "mkdir", +[](const char* path, mode_t mode) {
            directory_mode = mode;
            return mkdir(path, mode);
        });
    const PlatformHook open_hook(
        kLibrary, "open", +[](const char* path, int flags, mode_t mode) {
            marker_flags = flags;
            marker_mode = mode;
            return open(path, flags, mode);
        });
    EXPECT_EQ(tavo_osal_init(3, 4), 0);
    EXPECT_EQ(directory_mode, 0777U);
    EXPECT_EQ(marker_mode, 0777U);
    EXPECT_EQ(marker_flags, O_RDWR | O_CREAT | O_CLOEXEC);
}

TEST_F(OsalInit, DoesNotKeepTheMarkerOpen) {
    static int marker;
    static ino_t closed;
    const PlatformHook open_hook(
        kLibrary, "open", +[](const char* path, int flags, mode_t mode) { return marker = open(path, flags, mode); });
    const PlatformHook close_hook(
        kLibrary, "close", +[](int descriptor) {
            if (descriptor == marker) closed = tavo::test::file_of(descriptor);
            return close(descriptor);
        });
    EXPECT_EQ(tavo_osal_init(3, 4), 0);
    struct stat status = {};
    ASSERT_EQ(stat(kMarker, &status), 0);
    EXPECT_EQ(closed, status.st_ino);
}

TEST_F(OsalInit, AppliesItsLogPreference) {
    g_uiEnvValueRead = 0;
    g_uiMxEnabledLogLevel = 1;
    g_uiEnabledModuleMask = 4;
    g_uiOutputStreamId = 3;
    EXPECT_EQ(tavo_osal_init(3, 4), 0);
    EXPECT_EQ(g_uiMxEnabledLogLevel, 3U);
    EXPECT_EQ(g_uiEnabledModuleMask, UINT32_MAX);
    EXPECT_EQ(g_uiOutputStreamId, 1U);
    EXPECT_STREQ(g_acFilePath, "/tmp/OSAL_LOG.txt");
}

TEST_F(OsalInit, AppliesItsLogPreferenceBeforeAnythingElseIsLogged) {
    g_uiEnvValueRead = 0;
    const LogCapture log(6);
    EXPECT_EQ(tavo_osal_init(3, 4), 0);
    const auto lines = library_lines(log);
    ASSERT_GE(lines.size(), 2U);
    EXPECT_EQ(lines[0], line(6, "++Entered\n"));
    for (size_t i = 1; i < lines.size(); ++i) EXPECT_GE(lines[i].priority, tavo::test::priority_of(3)) << lines[i];
}

// --- the marker cannot be made

class OsalInitRefused : public OsalInit {
protected:
    static void expect_refusal() {
        log_everything();
        const LogCapture log;
        EXPECT_EQ(tavo_osal_init(3, 4), 0x9001);
        EXPECT_TRUE(logged_exactly(
            library_lines(log),
            {line(6, "++Entered\n"), line(4, "creating service file  /sdcard/com.zorla.qirserver/android.tavo.osal \n"),
             line(1, "Failed to create file at /sdcard/com.zorla.qirserver/android.tavo.osal \n")}));
        // Nothing else was done.
        EXPECT_EQ(tavo::test::count_threads(), 1U);
        EXPECT_FALSE(std::filesystem::exists("/sdcard/shm_key_index_file.txt"));
    }
};

TEST_F(OsalInitRefused, WithAFileInPlaceOfTheDirectory) {
    std::ofstream(kMarkerDirectory) << "no directory";
    expect_refusal();
    EXPECT_EQ(published(), nullptr);
}

TEST_F(OsalInitRefused, WithoutDescriptors) {
    const tavo::test::DescriptorLimit limit(0);
    log_everything();
    EXPECT_EQ(tavo_osal_init(3, 4), 0x9001);
}

TEST_F(OsalInitRefused, WhenTheFileCannotBeOpened) {
    const PlatformHook hook(
        kLibrary, "open", +[](const char*, int, mode_t) {
            errno = EROFS;
            return -1;
        });
    expect_refusal();
}

// Runs as somebody who may not write there, whoever started the tests.
TEST_ROLE(server_without_storage) {
    const uid_t nobody = 65534;
    chmod("/sdcard", 0555);
    if (getuid() == 0 && (setgroups(0, nullptr) != 0 || setresuid(nobody, nobody, nobody) != 0)) return 2;
    return tavo_osal_init(3, 4) == 0x9001 && access("/sdcard/com.zorla.qirserver", F_OK) != 0 ? 0 : 1;
}

TEST_F(OsalInitRefused, OnStorageThatCannotBeWritten) {
    tavo::test::Process server = tavo::test::Process::start("server_without_storage");
    EXPECT_EQ(server.wait(), 0);
    chmod("/sdcard", 0755);
    EXPECT_EQ(published(), nullptr);
}

}  // namespace

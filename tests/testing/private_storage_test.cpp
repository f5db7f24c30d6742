#include "tavo_osal/testing/private_storage.hpp"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "tavo_osal.h"
#include "tavo_osal.hpp"
#include "tavo_osal/testing/log_capture.hpp"

namespace {

namespace fs = std::filesystem;
using namespace tavo::test;

const std::string kRoot = PrivateStorage::storage_root();

bool is_empty(const std::string& directory) { return fs::is_empty(directory); }

TEST(PrivateStorage, HoldsTheMarkerTheKeysAndTheSemaphores) {
    const PrivateStorage storage;
    EXPECT_TRUE(is_empty(storage.path()));
    EXPECT_EQ(tavo_osal_init(4, 4), TAVO_SUCCESS);
    EXPECT_TRUE(fs::exists(storage.path() + "/com.zorla.qirserver/android.tavo.osal"));
    EXPECT_TRUE(fs::exists(storage.path() + "/shm_key_index_file.txt"));
    int32_t key = 0;
    EXPECT_EQ(tavo_msg_queue_key_create(&key, 3), TAVO_SUCCESS);
    EXPECT_TRUE(fs::exists(storage.path() + "/key_gen_file.txt"));
    tavo::ProcessSemaphore semaphore(4660);
    EXPECT_TRUE(fs::exists(storage.path() + "/4660"));
    EXPECT_TRUE(is_empty(kRoot));
}

TEST(PrivateStorage, ServesQueuesAndBlocksInTheTestItself) {
    const PrivateStorage storage;
    EXPECT_EQ(tavo_osal_init(4, 4), TAVO_SUCCESS);
    tavo::MessageQueue queue(7);
    queue.put("hello");
    EXPECT_EQ(queue.get().size(), 5U);
    const tavo::SharedBlock block(9, 4096);
    EXPECT_TRUE(block);
}

TEST(PrivateStorage, IsEmptyForTheNextTestOfTheProcess) {
    std::string first;
    {
        const PrivateStorage storage;
        first = storage.path();
        EXPECT_EQ(tavo_osal_init(4, 4), TAVO_SUCCESS);
        const tavo::MessageQueue queue(7);
    }
    EXPECT_FALSE(fs::exists(first));
    const PrivateStorage storage;
    EXPECT_NE(storage.path(), first);
    std::error_code error;
    const tavo::MessageQueue none(7, error);
    EXPECT_EQ(error, tavo::Errc::not_reachable);
    EXPECT_EQ(tavo_osal_init(4, 4), TAVO_SUCCESS);
    const tavo::MessageQueue queue(7);
    EXPECT_TRUE(queue);
}

TEST(PrivateStorage, FilesOfTheStorageArePrivateAndOthersAreNot) {
    const PrivateStorage storage;
    FILE* file = tavo_osal_fopen((kRoot + "/settings.txt").c_str(), "w");
    ASSERT_NE(file, nullptr);
    tavo_osal_fclose(file);
    EXPECT_TRUE(fs::exists(storage.path() + "/settings.txt"));
    EXPECT_EQ(tavo_osal_file_check_existence((kRoot + "/settings.txt").c_str()), 1);
    EXPECT_EQ(tavo_osal_file_check_existence(kRoot.c_str()), 1);
    EXPECT_EQ(tavo_osal_file_check_existence((kRoot + "x/settings.txt").c_str()), 0);
    const std::string elsewhere = fs::temp_directory_path() / ("tavo-elsewhere-" + std::to_string(getpid()));
    file = tavo_osal_fopen(elsewhere.c_str(), "w");
    ASSERT_NE(file, nullptr);
    tavo_osal_fclose(file);
    EXPECT_TRUE(fs::remove(elsewhere));
}

TEST(PrivateStorage, EndsWithItsScope) {
    { const PrivateStorage storage; }
    tavo::ProcessSemaphore semaphore(4660);
    EXPECT_TRUE(fs::exists(kRoot + "/4660"));
}

TEST(PrivateStorage, MessagesStillNameTheStorage) {
    const PrivateStorage storage;
    const LogCapture log;
    std::error_code error;
    const tavo::MessageQueue none(7, error);
    EXPECT_TRUE(has_line(log.lines(),
                         {1, "MSGQUEUE_BINDER", "acMqFile " + kRoot + "/com.zorla.qirserver/android.tavo.osal\n"}));
}

}  // namespace

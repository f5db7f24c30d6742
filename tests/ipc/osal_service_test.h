// A service object of this process's own, which nobody publishes.
#pragma once

#include <gtest/gtest.h>

#include "ipc/TavoOsalService.h"
#include "ipc/log_lines.h"
#include "support/log_capture.h"

namespace tavo::test {

constexpr char kLibrary[] = "libtavoosal.so";
constexpr char kKeyIndexFile[] = "/sdcard/shm_key_index_file.txt";

class OsalServiceTest : public testing::Test {
protected:
    void start(unsigned queues = 25, unsigned blocks = 25) {
        ASSERT_EQ(service_->TavoOsalServiceInit(queues, blocks), 0);
    }
    // Drops the service, which is nobody else's.
    void destroy() { service_ = nullptr; }

    android::sp<android::TavoOsalService> service_ = new android::TavoOsalService;
};

inline ExpectedLine line(unsigned level, const std::string& message) { return {level, kServiceTag, message}; }

}  // namespace tavo::test

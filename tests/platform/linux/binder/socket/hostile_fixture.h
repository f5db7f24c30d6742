// A server, a client that goes on calling it whatever others do, and an account of what the server holds.
#pragma once

#include <linux/android/binder.h>

#include <fstream>
#include <sstream>
#include <string>
#include <thread>

#include "raw_peer.h"
#include "test_service.h"

namespace tavo::test {

class HostileClientTest : public testing::Test {
protected:
    HostileClientTest() {
        EXPECT_EQ(service_->pingBinder(), android::OK);
        descriptors_ = count_descriptors(server_.pid());
        caller_ = std::thread([this] {
            while (!over_) {
                EXPECT_EQ(service_->pingBinder(), android::OK);
                ++calls_;
            }
        });
    }
    ~HostileClientTest() override {
        expect_served();
        over_ = true;
        caller_.join();
        // Some are kept for later.
        EXPECT_TRUE(comes_true([&] { return count_descriptors(server_.pid()) <= descriptors_ + 4; }))
            << count_descriptors(server_.pid()) << " descriptors, " << descriptors_ << " before";
    }

    void expect_served() {
        const int calls = calls_;
        EXPECT_TRUE(comes_true([&] { return calls_ > calls + 10; })) << "the well-behaved client is still served";
    }

    Process server_ = start_server();
    const android::sp<android::IBinder> service_ = find_service();

private:
    size_t descriptors_ = 0;
    std::atomic<bool> over_{false};
    std::atomic<int> calls_{0};
    std::thread caller_;
};

// What a process has in memory, in bytes.
inline size_t resident_memory(pid_t pid) {
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.rfind("VmRSS:", 0) == 0) return std::stoul(line.substr(6)) * 1024;
    }
    return 0;
}

}  // namespace tavo::test

// Which driver a process opens, and what it says when the kernel's cannot be had.
#include <binder/IServiceManager.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "platform/linux/binder/DriverRegistry.h"
#include "support/fake_binder_device.h"
#include "support/log_capture.h"
#include "support/process.h"

namespace {

using namespace android;
using namespace tavo::test;

constexpr int kInfo = 4, kError = 6;

class KernelDevice : public testing::Test {
protected:
    bool opens() { return ProcessState::self()->setThreadPoolMaxThreadCount(3) == OK; }
    std::vector<LogLine> said() const { return log_.lines("BinderKernel"); }

    FakeBinderDevice& device_ = FakeBinderDevice::install();
    const LogCapture log_;
};

TEST_F(KernelDevice, IsMappedAndToldOfThePool) {
    EXPECT_TRUE(opens());
    EXPECT_EQ(device_.max_threads, 3U);
    EXPECT_EQ(device_.mapped_size, 1024U * 1024U - 2U * static_cast<size_t>(sysconf(_SC_PAGESIZE)));
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(KernelDevice, ThatCannotBeOpenedLeavesTheProcessWithoutADriver) {
    device_.open_error = EACCES;
    EXPECT_FALSE(opens());
    ASSERT_EQ(said().size(), 1U);
    EXPECT_EQ(said()[0].text, "/nowhere/binder cannot be opened: Permission denied");
    EXPECT_EQ(said()[0].priority, kError);
    ASSERT_EQ(log_.lines("ProcessState").size(), 1U);
    EXPECT_EQ(log_.lines("ProcessState")[0].text, "There is no binder driver: no call leaves this process");
    EXPECT_EQ(defaultServiceManager()->addService(String16("any"), new BBinder), NO_INIT);
    EXPECT_EQ(ProcessState::self()->becomeContextManager(new BBinder), NO_INIT);
}

TEST_F(KernelDevice, MustSpeakThisVersion) {
    device_.version = 7;
    const size_t before = count_descriptors();
    EXPECT_FALSE(opens());
    ASSERT_EQ(said().size(), 1U);
    EXPECT_EQ(said()[0].text, "/nowhere/binder speaks version 7 of the protocol, not 8");
    EXPECT_EQ(said()[0].priority, kError);
    EXPECT_EQ(count_descriptors(), before);
}

TEST_F(KernelDevice, MustBeADevice) {
    device_.version_error = ENOTTY;
    EXPECT_FALSE(opens());
    ASSERT_EQ(said().size(), 1U);
    EXPECT_EQ(said()[0].text, "/nowhere/binder is no binder device: Inappropriate ioctl for device");
}

TEST_F(KernelDevice, MustBeMapped) {
    device_.map_error = ENOMEM;
    const size_t before = count_descriptors();
    EXPECT_FALSE(opens());
    ASSERT_EQ(said().size(), 1U);
    EXPECT_EQ(said()[0].text, "/nowhere/binder cannot be mapped: Cannot allocate memory");
    EXPECT_EQ(count_descriptors(), before);
}

TEST_F(KernelDevice, MayRefuseASizeOfThePool) {
    device_.max_threads_error = EINVAL;
    EXPECT_TRUE(opens()) << "there is a driver";
    ASSERT_EQ(said().size(), 2U) << "its first size, and this test's";
    EXPECT_EQ(said()[0].text, "BINDER_SET_MAX_THREADS failed: Invalid argument");
}

class UnnamedDriver : public KernelDevice {
protected:
    UnnamedDriver() {
        unsetenv("BINDER_DRIVER");
        sockets_opened = 0;
        registerDriver("socket", [](Driver::Process&) -> std::unique_ptr<Driver> {
            ++sockets_opened;
            return nullptr;
        });
    }
    static inline int sockets_opened = 0;
};

TEST_F(UnnamedDriver, IsTheKernelsWhereItIsThere) {
    EXPECT_TRUE(opens());
    EXPECT_EQ(sockets_opened, 0);
    EXPECT_GT(device_.mapped_size, 0U);
}

TEST_F(UnnamedDriver, IsSocketsWhereThereIsNoDevice) {
    device_.open_error = ENOENT;
    EXPECT_FALSE(opens());
    EXPECT_EQ(sockets_opened, 1);
    EXPECT_TRUE(said().empty()) << "as is usual";
}

TEST_F(UnnamedDriver, IsSocketsWhereTheDeviceIsSomebodyElses) {
    device_.open_error = EACCES;
    EXPECT_FALSE(opens());
    EXPECT_EQ(sockets_opened, 1);
    ASSERT_EQ(said().size(), 1U);
    EXPECT_EQ(said()[0].text, "/nowhere/binder cannot be opened: Permission denied");
    EXPECT_EQ(said()[0].priority, kInfo);
}

TEST_F(UnnamedDriver, IsSocketsWhereTheDeviceSpeaksAnotherVersion) {
    device_.version = 7;
    const size_t before = count_descriptors();
    EXPECT_FALSE(opens());
    EXPECT_EQ(sockets_opened, 1);
    ASSERT_EQ(said().size(), 1U);
    EXPECT_EQ(count_descriptors(), before);
}

}  // namespace

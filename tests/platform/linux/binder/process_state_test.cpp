// The process's driver and its thread pool.
#include <binder/BpBinder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/linux/binder/DriverRegistry.h"
#include "support/log_capture.h"
#include "support/loopback_driver.h"
#include "support/platform_fault.h"
#include "support/process.h"

namespace {

using namespace android;
using tavo::test::LogCapture;
using tavo::test::LoopbackDriver;
using tavo::test::PlatformHook;
using tavo::test::Process;

TEST(ProcessWithoutDriver, SaysSoOnceAndGoesOn) {
    setenv("BINDER_DRIVER", "no-such-driver", 1);
    const LogCapture log;
    const sp<ProcessState> process = ProcessState::self();
    ASSERT_EQ(log.lines("ProcessState").size(), 2U);
    EXPECT_EQ(log.lines("ProcessState")[0].text, "BINDER_DRIVER names no driver: no-such-driver");
    EXPECT_EQ(log.lines("ProcessState")[1].text, "There is no binder driver: no call leaves this process");
    EXPECT_EQ(log.lines("ProcessState")[0].priority, 6);

    EXPECT_EQ(process->getContextObject(nullptr), nullptr);
    EXPECT_EQ(process->getStrongProxyForHandle(1), nullptr);
    EXPECT_EQ(process->setThreadPoolMaxThreadCount(3), NO_INIT);
    process->startThreadPool();
    IPCThreadState::self()->joinThreadPool();
    Parcel data, reply;
    EXPECT_EQ(IPCThreadState::self()->transact(1, 1, data, &reply, 0), NO_INIT);
    EXPECT_EQ(ProcessState::self(), process);
    EXPECT_EQ(log.lines("ProcessState").size(), 2U);
}

TEST(ProcessWithoutDriver, HasAServiceManagerThatFindsNothing) {
    setenv("BINDER_DRIVER", "no-such-driver", 1);
    const LogCapture log;
    const sp<IServiceManager> manager = defaultServiceManager();
    ASSERT_NE(manager, nullptr);
    EXPECT_EQ(manager->getService(String16("any")), nullptr) << "without waiting";
    EXPECT_EQ(manager->checkService(String16("any")), nullptr);
    EXPECT_EQ(manager->addService(String16("any"), new BBinder), NO_INIT);
    EXPECT_TRUE(manager->listServices().isEmpty());
    EXPECT_TRUE(log.lines("ServiceManager").empty());

    class Recipient : public IBinder::DeathRecipient {
        void binderDied(const wp<IBinder>&) override {}
    };
    const sp<IBinder> proxy = IInterface::asBinder(manager);
    EXPECT_EQ(proxy->linkToDeath(new Recipient), NO_INIT);
    EXPECT_EQ(proxy->pingBinder(), NO_INIT);
}

TEST(DriverChoice, IsTheFirstDriverThatSuitsWhenNoneIsNamedAndOneCanBeReplaced) {
    static int opened = 0;
    registerDriver("socket", [](Driver::Process&) -> std::unique_ptr<Driver> {
        ++opened;
        return nullptr;
    });
    setenv("BINDER_DRIVER", "", 1);
    setenv("BINDER_DEVICE", "/nowhere/binder", 1);
    const LogCapture log;
    EXPECT_NE(ProcessState::self(), nullptr);
    EXPECT_NE(ProcessState::self(), nullptr);
    EXPECT_EQ(opened, 1);
}

TEST(Process, AsksItsDriverForTheContextObject) {
    LoopbackDriver& driver = LoopbackDriver::open();
    EXPECT_EQ(ProcessState::self()->getContextObject(nullptr), nullptr);
    const sp<BBinder> context = new BBinder;
    driver.set_context_object(context);
    EXPECT_EQ(ProcessState::self()->getContextObject(nullptr), driver.proxy(context));
    EXPECT_EQ(IPCThreadState::self()->process(), ProcessState::self());
}

TEST(Process, SetsTheMostThreads) {
    LoopbackDriver& driver = LoopbackDriver::open();
    EXPECT_EQ(driver.max_threads(), 15U);
    EXPECT_EQ(ProcessState::self()->setThreadPoolMaxThreadCount(4), NO_ERROR);
    EXPECT_EQ(driver.max_threads(), 4U);
}

TEST(ThreadPool, IsStartedOnceAndGrowsWhenTheDriverAsks) {
    LoopbackDriver& driver = LoopbackDriver::open();
    driver.ask_for_thread();
    EXPECT_TRUE(driver.wait_for_threads(0).empty()) << "not before it is started";
    ProcessState::self()->startThreadPool();
    ProcessState::self()->startThreadPool();
    EXPECT_EQ(driver.wait_for_threads(1), std::vector<std::string>{"Binder_1 main"});
    driver.ask_for_thread();
    EXPECT_EQ(driver.wait_for_threads(2), (std::vector<std::string>{"Binder_1 main", "Binder_2"}));
    for (int i = 3; i <= 17; ++i) {
        driver.ask_for_thread();
        driver.wait_for_threads(static_cast<size_t>(i));
    }
    EXPECT_EQ(driver.wait_for_threads(17).back(), "Binder_11") << "in hexadecimal";
}

TEST(ThreadPool, CanBeJoined) {
    LoopbackDriver& driver = LoopbackDriver::open();
    std::thread([] { IPCThreadState::self()->joinThreadPool(); }).join();
    std::thread([] {
        ProcessState::self()->giveThreadPoolName();
        IPCThreadState::self()->joinThreadPool(false);
    }).join();
    const std::vector<std::string> threads = driver.wait_for_threads(2);
    ASSERT_EQ(threads.size(), 2U);
    EXPECT_NE(threads[0].find(" main"), std::string::npos);
    EXPECT_EQ(threads[1], "Binder_1");
}

TEST(ThreadPool, ReportsAThreadThatCannotBeStarted) {
    LoopbackDriver::open();
    const LogCapture log;
    const PlatformHook hook(
        "libbinder.so", "pthread_create",
        +[](pthread_t*, const pthread_attr_t*, void* (*)(void*), void*) { return EAGAIN; });
    ProcessState::self()->startThreadPool();
    ASSERT_EQ(log.lines("ProcessState").size(), 1U);
    EXPECT_EQ(log.lines("ProcessState")[0].text,
              "A thread of the pool could not be started: Resource temporarily unavailable");
}

// Its destructor runs after everything that was set up later.
struct Farewell {
    ~Farewell() {
        puts("statics gone");
        fflush(stdout);
    }
};

TEST_ROLE(exits_with_a_driver) {
    static const Farewell farewell;
    LoopbackDriver::open().on_quiesce = [] { puts("quiesced"); };
    return 0;
}

TEST(Process, HasItsDriverQuietBeforeStaticObjectsGo) {
    Process process = Process::start("exits_with_a_driver");
    EXPECT_EQ(process.read_line(), "quiesced");
    EXPECT_EQ(process.read_line(), "statics gone");
    EXPECT_EQ(process.wait(), 0);
}

}  // namespace

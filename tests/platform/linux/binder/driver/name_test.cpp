// Names: published, taken over, listed, looked up.
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <thread>

#include "support/log_capture.h"
#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;
using std::chrono::steady_clock;

status_t publish(const std::string& name, const sp<IBinder>& service) {
    return defaultServiceManager()->addService(String16(name.c_str()), service);
}

std::vector<std::string> listed() {
    std::vector<std::string> names;
    for (const String16& name : defaultServiceManager()->listServices()) names.push_back(String8(name).string());
    return names;
}

TEST(DriverName, OfThisProcessStandsForTheObjectItself) {
    const sp<IBinder> own = new TestService, next = new TestService;
    ASSERT_EQ(publish("name", own), OK);
    EXPECT_EQ(find_service("name"), own);
    ASSERT_EQ(publish("name", next), OK);
    EXPECT_EQ(find_service("name"), next);
    EXPECT_EQ(defaultServiceManager()->getService(String16("name")), next);
}

TEST(DriverName, GoesToWhoPublishedLast) {
    const sp<IBinder> own = new TestService;
    ASSERT_EQ(publish("test.service", own), OK);
    Process server = start_server();
    const sp<IBinder> remote = find_service();
    ASSERT_NE(remote, nullptr);
    EXPECT_NE(remote, own);
    EXPECT_EQ(remote->localBinder(), nullptr);
    ASSERT_EQ(publish("test.service", own), OK);
    EXPECT_EQ(find_service(), own);
    EXPECT_EQ(remote->pingBinder(), OK) << "whoever knows the earlier object goes on with it";
}

TEST(DriverName, StaysWithTheNewHolderWhenTheOldOneDies) {
    Process first = start_server();
    const Process second = start_server();
    first.kill(SIGKILL);
    first.wait();
    const sp<IBinder> found = find_service();
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(ask(found, TestService::kCallerIds), getpid());
}

TEST(DriverName, IsNeverMissingWhileItGoesFromHandToHand) {
    std::vector<Process> publishers;
    for (int i = 0; i < 3; ++i) {
        publishers.push_back(Process::start("republisher"));
        ASSERT_EQ(publishers.back().read_line(), "published");
    }
    const auto end = steady_clock::now() + std::chrono::seconds(2);
    std::vector<std::thread> threads;
    std::atomic<int> found{0};
    for (int i = 0; i < 3; ++i) {
        threads.emplace_back([&] {
            while (steady_clock::now() < end) {
                const sp<IBinder> service = find_service("popular");
                ASSERT_NE(service, nullptr);
                ASSERT_EQ(service->pingBinder(), OK);
                ++found;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_GT(found, 10);
}

TEST_ROLE(republisher) {
    start_pool();
    for (bool first = true;; first = false) {
        if (publish("popular", new TestService) != OK) abort();
        if (first) puts("published");
    }
}

TEST(DriverName, IsLookedUpAtHomeWhileItIsPublishedAgain) {
    std::atomic<bool> over{false};
    ASSERT_EQ(publish("name", new TestService), OK);
    std::thread looking([&] {
        while (!over) {
            const sp<IBinder> service = find_service("name");
            ASSERT_NE(service, nullptr);
            ASSERT_NE(service->localBinder(), nullptr);
        }
    });
    for (int i = 0; i < 500; ++i) ASSERT_EQ(publish("name", new TestService), OK);
    over = true;
    looking.join();
}

TEST(DriverName, IsListedAlphabetically) {
    EXPECT_TRUE(listed().empty());
    const Process server = start_server("m");
    ASSERT_EQ(publish("z", new TestService), OK);
    ASSERT_EQ(publish("a", new TestService), OK);
    EXPECT_EQ(listed(), (std::vector<std::string>{"a", "m", "z"}));
}

TEST(DriverName, MustNotBeEmptyNorStandForNothing) {
    EXPECT_EQ(publish("", new TestService), BAD_VALUE);
    EXPECT_EQ(find_service(""), nullptr);
    EXPECT_EQ(publish("name", nullptr), BAD_VALUE);
    EXPECT_TRUE(listed().empty());
    for (const char* name : {"a", "with space", "android.tavo.osal", "\xc3\xa4", "a.b-c_d", "~"}) {
        EXPECT_EQ(publish(name, new TestService), OK) << name;
        EXPECT_NE(find_service(name), nullptr) << name;
    }
}

TEST(DriverName, HasAtMostAHundredAndTwentySevenCharacters) {
    const std::string longest(127, 'n');
    const Process server = start_server(longest);
    EXPECT_NE(find_service(longest), nullptr);
    EXPECT_EQ(publish(longest + "n", new TestService), BAD_VALUE);
    EXPECT_EQ(find_service(longest + "n"), nullptr);
    std::string umlauts;
    for (int i = 0; i < 127; ++i) umlauts += "\xc3\xa4";
    EXPECT_EQ(publish(umlauts, new TestService), OK) << "characters, not bytes";
}

TEST(DriverName, IsWaitedFor) {
    const LogCapture log;
    Process late = Process::start("late_server");
    const auto start = steady_clock::now();
    late.write_line("go");
    const sp<IBinder> service = defaultServiceManager()->getService(String16("late"));
    ASSERT_NE(service, nullptr);
    EXPECT_EQ(service->pingBinder(), OK);
    EXPECT_LT(steady_clock::now() - start, std::chrono::seconds(5));
}

TEST_ROLE(late_server) {
    getchar();
    std::this_thread::sleep_for(std::chrono::milliseconds(500));
    if (publish("late", new TestService) != OK) return 1;
    IPCThreadState::self()->joinThreadPool();
    return 0;
}

TEST(DriverName, IsNotWaitedForForEver) {
    const LogCapture log;
    const auto start = steady_clock::now();
    EXPECT_EQ(defaultServiceManager()->getService(String16("none")), nullptr);
    EXPECT_GE(steady_clock::now() - start, std::chrono::seconds(5));
    EXPECT_LT(steady_clock::now() - start, std::chrono::seconds(7));
}

TEST(DriverName, OfSomebodyElsesObjectCanBePublished) {
    const Process owner = start_server("owner");
    Process publisher = start_server("publisher");
    const sp<IBinder> object = find_service("owner");
    Parcel data;
    data.writeString16(String16("other name"));
    data.writeStrongBinder(object);
    ASSERT_EQ(ask(find_service("publisher"), TestService::kPublish, data), OK);
    EXPECT_EQ(find_service("other name"), object);
}

TEST(DriverName, CanBeLookedUpByTwoWhoLookEachOtherUpFirst) {
    Process one = Process::start("early_bird", {"one", "two"}), two = Process::start("early_bird", {"two", "one"});
    EXPECT_EQ(one.wait(), 0);
    EXPECT_EQ(two.wait(), 0);
}

// Publishes, waits for the other without a pool, and calls it only when both have one.
TEST_ROLE(early_bird) {
    if (publish(arguments[0], new TestService) != OK) return 1;
    const sp<IBinder> other = defaultServiceManager()->getService(String16(arguments[1].c_str()));
    if (other == nullptr) return 2;
    start_pool();
    if (other->pingBinder() != OK) return 3;
    // The other one may still want to ask.
    std::this_thread::sleep_for(std::chrono::milliseconds(500));
    return 0;
}

TEST(DriverName, OfManyServicesOfOneProcessNeedsOneLink) {
    const Process server = start_server("s0");
    for (int i = 1; i < 20; ++i) {
        Parcel data;
        data.writeString16(String16(("s" + std::to_string(i)).c_str()));
        data.writeStrongBinder(find_service("s0"));
        ASSERT_EQ(ask(find_service("s0"), TestService::kPublish, data), OK);
    }
    const size_t before = count_descriptors();
    for (int i = 0; i < 20; ++i) EXPECT_EQ(find_service("s" + std::to_string(i)), find_service("s0"));
    EXPECT_EQ(count_descriptors(), before);
}

}  // namespace

// What becomes of the driver when a process runs out of descriptors, forks, starts programs or exits.
#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <thread>

#include "support/log_capture.h"
#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;
using std::chrono::steady_clock;

// -- Who calls

TEST(DriverProcess, IsKnownByTheKernelsWord) {
    const Process server = start_server();
    Parcel reply;
    ASSERT_EQ(find_service()->transact(TestService::kCallerIds, Parcel(), &reply), OK);
    EXPECT_EQ(reply.readInt32(), getpid());
    EXPECT_EQ(reply.readInt32(), static_cast<int32_t>(geteuid()));
}

TEST(DriverProcess, IsKnownToWhoItCallsBack) {
    const Process server = start_server();
    const sp<IBinder> own = new TestService;
    ASSERT_EQ(ask(find_service(), TestService::kKeep, own), 0);
    Parcel data;
    data.writeInt32(TestService::kCallerIds);
    EXPECT_EQ(ask(find_service(), TestService::kCallKept, data), server.pid());
}

// -- Descriptors

TEST(DriverProcess, WithoutDescriptorsGoesOnCalling) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    const auto call_from_many_threads = [&] {
        std::vector<std::thread> callers;
        for (int i = 0; i < 8; ++i) {
            callers.emplace_back([&] {
                for (int n = 0; n < 20; ++n) EXPECT_EQ(service->pingBinder(), OK);
            });
        }
        for (std::thread& caller : callers) caller.join();
    };
    // Once before: a sanitizer takes descriptors where it meets a type for the first time.
    call_from_many_threads();
    Parcel reply;
    EXPECT_EQ(service->transact(TestService::kOpenPipe, Parcel(), &reply), OK);
    reply.freeData();

    std::vector<int> taken;
    const rlimit few{static_cast<rlim_t>(count_descriptors() + 3), 20000};
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &few), 0);
    for (int fd = 0; (fd = open("/dev/null", O_RDONLY | O_CLOEXEC)) >= 0;) taken.push_back(fd);
    call_from_many_threads();
    EXPECT_EQ(service->transact(TestService::kOpenPipe, Parcel(), &reply), FAILED_TRANSACTION)
        << "there is no room for what it sends";
    for (const int fd : taken) close(fd);
    EXPECT_EQ(service->transact(TestService::kOpenPipe, Parcel(), &reply), OK);
}

// -- exit

TEST(DriverProcess, ExitsUnderLoad) {
    for (int i = 0; i < 5; ++i) {
        Process server = start_server();
        const sp<IBinder> service = find_service();
        std::vector<std::thread> callers;
        for (int n = 0; n < 8; ++n) {
            callers.emplace_back([&] {
                Parcel data, reply;
                data.writeStrongBinder(new TestService);
                data.writeFileDescriptor(STDIN_FILENO);
                while (service->transact(TestService::kEcho, data, &reply) == OK) {
                }
            });
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        const auto start = steady_clock::now();
        EXPECT_EQ(service->transact(TestService::kExit, Parcel(), nullptr), DEAD_OBJECT);
        EXPECT_EQ(server.wait(), 0);
        EXPECT_LT(steady_clock::now() - start, std::chrono::milliseconds(is_slow() ? 5000 : 2000));
        for (std::thread& caller : callers) caller.join();
    }
}

TEST(DriverProcess, ExitsThoughACallDoesNotEnd) {
    Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    std::thread caller([&] { EXPECT_EQ(gate.call(service), DEAD_OBJECT); });
    ASSERT_TRUE(gate.wait_for(1));
    const auto start = steady_clock::now();
    EXPECT_EQ(service->transact(TestService::kExit, Parcel(), nullptr), DEAD_OBJECT);
    EXPECT_EQ(server.wait(), 0);
    EXPECT_GE(steady_clock::now() - start, std::chrono::milliseconds(900)) << "it has been given a moment";
    EXPECT_LT(steady_clock::now() - start, std::chrono::milliseconds(is_slow() ? 5000 : 2500));
    caller.join();
}

// -- fork and exec

// What is inherited by a program that is started now.
size_t inherited_sockets() {
    FILE* list = popen("ls -l /proc/self/fd | grep -c -e socket: -e eventpoll -e eventfd", "r");
    int count = -1;
    if (fscanf(list, "%d", &count) != 1) count = -1;
    pclose(list);
    return static_cast<size_t>(count);
}

TEST(DriverProcess, LeavesNoSocketToProgramsItStarts) {
    const size_t before = inherited_sockets();
    start_pool();
    const Process server = start_server();
    const sp<IBinder> service = find_service(), own = new TestService;
    ASSERT_EQ(defaultServiceManager()->addService(String16("own"), own), OK);
    ASSERT_EQ(ask(service, TestService::kKeep, own), 0);
    Parcel data, reply;
    data.writeInt32(TestService::kThreadId);
    ASSERT_GT(ask(service, TestService::kCallKept, data), 0);
    Process other = Process::start("other_client");
    ASSERT_EQ(other.read_line(), "found");
    EXPECT_EQ(inherited_sockets(), before);
    // Nor does a server: one that was started by it does not keep it alive.
    other.write_line("");
    EXPECT_EQ(other.wait(), 0);
}

TEST_ROLE(other_client) {
    const sp<IBinder> service = find_service("own");
    puts(service != nullptr && service->pingBinder() == OK ? "found" : "not found");
    getchar();
    return 0;
}

TEST(DriverProcess, IsNotKeptAliveByWhatItStarted) {
    Process parent = Process::start("parent_of_sleeper");
    ASSERT_EQ(parent.read_line(), "ready");
    const sp<IBinder> service = find_service("parent");
    ASSERT_NE(service, nullptr);
    ASSERT_EQ(service->pingBinder(), OK);
    const int sleeper = std::stoi(parent.read_line());
    parent.kill(SIGKILL);
    parent.wait();
    EXPECT_EQ(service->pingBinder(), DEAD_OBJECT);
    kill(sleeper, SIGKILL);
}

TEST_ROLE(parent_of_sleeper) {
    if (defaultServiceManager()->addService(String16("parent"), new TestService) != OK) return 1;
    start_pool();
    puts("ready");
    const pid_t child = fork();
    if (child == 0) {
        execlp("sleep", "sleep", "30", nullptr);
        _exit(127);
    }
    printf("%d\n", child);
    pause();
    return 0;
}

TEST(DriverProcess, IsNotDisturbedByAForkedCopyThatExits) {
    start_pool();
    const Process server = start_server();
    const sp<IBinder> service = find_service(), own = new TestService;
    ASSERT_EQ(ask(service, TestService::kKeep, own), 0);
    static sp<IBinder> held;  // given up when the copy exits
    held = ask_for_object(service, TestService::kKept);
    static sp<IBinder> held_remote;
    held_remote = service;
    for (int i = 0; i < 3; ++i) {
        const pid_t child = fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            // What a copy says would be said in its parent's name, so it says nothing.
            Parcel reply;
            const bool silent = service->transact(TestService::kEcho, Parcel(), &reply) == INVALID_OPERATION &&
                                find_service("test.service") == nullptr &&
                                defaultServiceManager()->addService(String16("copy"), own) == INVALID_OPERATION;
            const_cast<sp<IBinder>&>(service).clear();
            exit(silent ? 0 : 1);
        }
        int status = -1;
        const auto start = steady_clock::now();
        ASSERT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
        EXPECT_LT(steady_clock::now() - start, std::chrono::milliseconds(is_slow() ? 4000 : 900));
        EXPECT_EQ(service->pingBinder(), OK);
        EXPECT_EQ(ask(service, TestService::kPingKept), OK);
    }
    held_remote = nullptr;
    held = nullptr;
}

}  // namespace

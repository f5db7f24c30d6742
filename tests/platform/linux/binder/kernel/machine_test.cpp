// What only a real kernel can show: service managers that come and go, users, descriptors that run out, threads that
// are ended while they wait. On sockets these tests have nothing to do.
#include <fcntl.h>
#include <grp.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utils/String8.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <random>
#include <thread>

#include "support/log_capture.h"
#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

class KernelMachine : public testing::Test {
protected:
    void SetUp() override {
        if (!is_kernel_driver()) GTEST_SKIP() << "there is no kernel's driver here";
    }
};

// -- Service managers

const std::string kProgram =
    std::string(getenv("TAVO_EMULATOR") != nullptr ? getenv("TAVO_EMULATOR") : "") + " " + SERVICEMANAGER_PROGRAM;

// Processes of that name; a test's namespace has no others.
std::vector<pid_t> service_managers() {
    std::vector<pid_t> found;
    FILE* list = popen("grep -lx servicemanager /proc/[0-9]*/comm 2>/dev/null", "r");
    int pid = 0;
    while (fscanf(list, "/proc/%d/comm\n", &pid) == 1) found.push_back(pid);
    pclose(list);
    return found;
}

bool is_running(pid_t pid) {
    std::string state, line;
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    while (std::getline(status, line)) {
        if (line.rfind("State:", 0) == 0) state = line;
    }
    return !state.empty() && state.find("Z (zombie)") == std::string::npos;
}

TEST_F(KernelMachine, HasOneServiceManagerAtATime) {
    ASSERT_TRUE(comes_true([] { return defaultServiceManager()->addService(String16("own"), new TestService) == OK; }));
    FILE* other = popen((kProgram + " 2>&1").c_str(), "r");
    std::string said;
    char text[256];
    while (fgets(text, sizeof text, other) != nullptr) said += text;
    EXPECT_EQ(WEXITSTATUS(pclose(other)), 1);
    EXPECT_NE(said.find("servicemanager: there is a service manager already\n"), std::string::npos) << said;
    EXPECT_EQ(ProcessState::self()->becomeContextManager(new BBinder), ALREADY_EXISTS);
}

TEST_F(KernelMachine, TakesAnotherServiceManagerForTheFirst) {
    ASSERT_EQ(defaultServiceManager()->addService(String16("own"), new TestService), OK);
    const std::vector<pid_t> first = service_managers();
    ASSERT_EQ(first.size(), 1U);
    kill(first[0], SIGTERM);
    ASSERT_TRUE(comes_true([&] { return !is_running(first[0]); })) << "at the first asking";
    EXPECT_EQ(find_service("own"), nullptr);
    EXPECT_EQ(defaultServiceManager()->addService(String16("own"), new TestService), DEAD_OBJECT);

    FILE* second = popen(("exec " + kProgram + " --ready").c_str(), "r");
    char text[64] = "";
    ASSERT_NE(fgets(text, sizeof text, second), nullptr);
    EXPECT_STREQ(text, "ready\n");
    EXPECT_EQ(find_service("own"), nullptr) << "it knows nobody";
    const sp<IBinder> own = new TestService;
    EXPECT_EQ(defaultServiceManager()->addService(String16("own"), own), OK);
    EXPECT_EQ(find_service("own"), own);
    for (const pid_t pid : service_managers()) kill(pid, SIGTERM);
    EXPECT_EQ(pclose(second), 0) << "which ends in order";
}

TEST_F(KernelMachine, HasAServiceManagerThatSurvivesAnything) {
    const LogCapture log;
    const sp<IBinder> manager = ProcessState::self()->getContextObject(nullptr);
    std::mt19937 random(13);
    const sp<IBinder> own = new TestService;
    for (int i = 0; i < 500; ++i) {
        Parcel data;
        if (random() % 4 != 0) data.writeInterfaceToken(IServiceManager::descriptor);
        for (auto words = random() % 16; words > 0; --words) {
            switch (random() % 8) {
                case 0: data.writeStrongBinder(own); break;
                case 1: data.writeFileDescriptor(STDIN_FILENO); break;
                case 2: data.writeString16(String16("name")); break;
                case 3: data.writeStrongBinder(manager); break;
                default: data.writeInt32(static_cast<int32_t>(random() % 2 == 0 ? random() : random() % 8)); break;
            }
        }
        Parcel reply;
        manager->transact(static_cast<uint32_t>(random() % 7), data, &reply,
                          random() % 8 == 0 ? uint32_t{IBinder::FLAG_ONEWAY} : 0U);
    }
    EXPECT_EQ(manager->pingBinder(), OK);
    EXPECT_EQ(service_managers().size(), 1U);
}

// -- Users

constexpr uid_t kOtherUser = 54321;

TEST_ROLE(other_user) {
    // The saved user is not the one that counts, nor is the real one.
    if (setgroups(0, nullptr) != 0 || seteuid(kOtherUser) != 0) return 2;
    const sp<IBinder> service = find_service();
    Parcel reply;
    if (service == nullptr || service->transact(TestService::kCallerIds, Parcel(), &reply) != OK) return 1;
    if (reply.readInt32() != getpid()) return 3;
    return reply.readInt32() == static_cast<int32_t>(kOtherUser) ? 0 : 4;
}

TEST_F(KernelMachine, TellsWhoCallsByTheEffectiveUser) {
    if (geteuid() != 0) GTEST_SKIP() << "only root can become another user";
    const char* device = getenv("BINDER_DEVICE") != nullptr ? getenv("BINDER_DEVICE") : "/dev/binder";
    const Process server = start_server();
    struct stat before {};
    ASSERT_EQ(stat(device, &before), 0);
    ASSERT_EQ(chmod(device, 0600), 0);
    EXPECT_EQ(Process::start("other_user").wait(), 1) << "the device is root's alone";
    ASSERT_EQ(chmod(device, 0666), 0);
    EXPECT_EQ(Process::start("other_user").wait(), 0);
    chmod(device, before.st_mode & 0777);
}

// -- Descriptors

TEST_ROLE(server_of_few_descriptors) {
    if (defaultServiceManager()->addService(String16("few"), new TestService) != OK) return 1;
    start_pool();
    const rlimit few{static_cast<rlim_t>(count_descriptors() - 1), 20000};
    if (setrlimit(RLIMIT_NOFILE, &few) != 0) return 1;
    puts("ready");
    getchar();
    return 0;
}

TEST_F(KernelMachine, RefusesDescriptorsForAProcessThatCanHaveNoMore) {
    Process server = Process::start("server_of_few_descriptors");
    ASSERT_EQ(server.read_line(), "ready");
    const sp<IBinder> service = find_service("few");
    Parcel data;
    data.writeFileDescriptor(STDIN_FILENO);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(service->transact(TestService::kEcho, data, nullptr), FAILED_TRANSACTION);
        EXPECT_EQ(service->pingBinder(), OK);
    }
}

// -- Threads

// How many of the thread's objects go when a signal's handler ends it: on 32-bit ARM, the C library cannot unwind past
// the handler.
#ifdef __arm__
constexpr int kUnwound = 0;
#else
constexpr int kUnwound = 1;
#endif

// As a program that cancels a thread by a signal.
void end_thread(int) { pthread_exit(nullptr); }

TEST_F(KernelMachine, LetsAThreadBeEndedWhileItWaitsForAReply) {
    struct sigaction action = {};
    action.sa_handler = end_thread;
    ASSERT_EQ(sigaction(SIGUSR2, &action, nullptr), 0);
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    for (int i = 0; i < 10; ++i) {
        Gate gate;
        static std::atomic<int> unwound{0};
        struct Unwound {
            ~Unwound() { ++unwound; }
        };
        unwound = 0;
        std::thread caller([&] {
            const Unwound guard;
            gate.call(service);
        });
        ASSERT_TRUE(gate.wait_for(1));
        pthread_kill(caller.native_handle(), SIGUSR2);
        caller.join();
        EXPECT_EQ(unwound, kUnwound);
        EXPECT_EQ(service->pingBinder(), OK);
        gate.open();
        EXPECT_EQ(service->pingBinder(), OK) << "a reply that nobody waits for any more hurts nobody";
    }
}

void note_signal(int) {}

TEST_F(KernelMachine, GoesOnWaitingAfterASignal) {
    struct sigaction action = {};
    action.sa_handler = note_signal;
    ASSERT_EQ(sigaction(SIGUSR1, &action, nullptr), 0);
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Gate gate;
    std::thread caller([&] { EXPECT_EQ(gate.call(service), OK); });
    ASSERT_TRUE(gate.wait_for(1));
    for (int i = 0; i < 100; ++i) {
        pthread_kill(caller.native_handle(), SIGUSR1);
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    EXPECT_TRUE(gate.is_quiet()) << "the call was made once";
    gate.open();
    caller.join();
}

// -- Ends

TEST_F(KernelMachine, ServesSlowlyButSurelyWhatDoesNotFitAtOnce) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Parcel size;
    size.writeInt32(600000);
    Parcel kept, refused;
    ASSERT_EQ(service->transact(TestService::kBytes, size, &kept), OK);
    EXPECT_EQ(service->transact(TestService::kBytes, size, &refused), FAILED_TRANSACTION)
        << "as long as the first one is held";
    kept.freeData();
    EXPECT_EQ(service->transact(TestService::kBytes, size, &refused), OK);
}

}  // namespace

// The runtime directory, and what becomes of the driver when a process cannot get what it takes.
#include <fcntl.h>
#include <grp.h>
#include <sys/epoll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <thread>

#include "platform/linux/binder/UniqueFd.h"
#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

constexpr uid_t kOtherUser = 54321;

// Becomes another user, then looks the service up and prints what came of it.
TEST_ROLE(other_user) {
    if (setgroups(0, nullptr) != 0 || setgid(kOtherUser) != 0 || setuid(kOtherUser) != 0) return 2;
    const sp<IBinder> service = find_service();
    if (service == nullptr) return 1;
    Parcel reply;
    if (service->transact(TestService::kCallerIds, Parcel(), &reply) != OK) return 3;
    reply.readInt32();
    return reply.readInt32() == static_cast<int32_t>(kOtherUser) ? 0 : 4;
}

TEST(SocketProcess, OfAnotherUserGetsInWhereTheDirectoryLetsIt) {
    if (geteuid() != 0) GTEST_SKIP() << "only root can become another user";
    const Process server = start_server();
    ASSERT_NE(find_service(), nullptr);
    EXPECT_EQ(Process::start("other_user").wait(), 1) << "the directory is root's alone";
    ASSERT_EQ(chmod("/run/binder", 0755), 0);
    EXPECT_EQ(Process::start("other_user").wait(), 0) << "and is known by its own user";
}

// A server that takes all descriptors it may have, and gives them back.
TEST_ROLE(exhausted_server) {
    rlimit limit{200, 200};
    if (setrlimit(RLIMIT_NOFILE, &limit) != 0) return 1;
    if (defaultServiceManager()->addService(String16("exhausted"), new TestService) != OK) return 1;
    start_pool();
    puts("ready");
    for (;;) {
        std::vector<int> taken;
        if (getchar() == EOF) return 0;
        getchar();
        // What earlier clients leave behind is given back a little later.
        for (int i = 0; i < 2; ++i) {
            for (int fd = 0; (fd = open("/dev/null", O_RDONLY | O_CLOEXEC)) >= 0;) taken.push_back(fd);
            std::this_thread::sleep_for(std::chrono::milliseconds(200));
        }
        puts("exhausted");
        getchar();
        getchar();
        for (const int fd : taken) close(fd);
        puts("ready");
    }
}

TEST_ROLE(late_client) {
    const sp<IBinder> service = find_service("exhausted");
    return service != nullptr && service->pingBinder() == OK ? 0 : 1;
}

TEST(SocketProcess, WithoutDescriptorsTurnsNewcomersAwayAndServesTheOthers) {
    Process server = Process::start("exhausted_server");
    ASSERT_EQ(server.read_line(), "ready");
    const sp<IBinder> service = find_service("exhausted");
    ASSERT_NE(service, nullptr);
    std::atomic<bool> over{false};
    std::thread caller([&] {
        while (!over) EXPECT_EQ(service->pingBinder(), OK);
    });
    EXPECT_TRUE(comes_true([&] { return service->pingBinder() == OK; }));
    for (int i = 0; i < 3; ++i) {
        server.write_line("x");
        ASSERT_EQ(server.read_line(), "exhausted");
        EXPECT_EQ(Process::start("late_client").wait(), 1) << "at once, not after a time-out";

        Parcel data, reply;
        data.writeFileDescriptor(STDIN_FILENO);
        const status_t status = service->transact(TestService::kEcho, data, &reply);
        EXPECT_TRUE(status == FAILED_TRANSACTION || status == -EMFILE)
            << status << ": the object's own word where one descriptor has come free meanwhile, but not two";
        EXPECT_EQ(service->transact(TestService::kOpenPipe, Parcel(), &reply), UNKNOWN_ERROR)
            << "the object's own word";
        // More callers than there are channels, of which no more can be had: they take turns.
        std::vector<std::thread> callers;
        for (int n = 0; n < 8; ++n) {
            callers.emplace_back([&] {
                for (int m = 0; m < 20; ++m) EXPECT_EQ(service->pingBinder(), OK);
            });
        }
        for (std::thread& one : callers) one.join();

        server.write_line("x");
        ASSERT_EQ(server.read_line(), "ready");
        EXPECT_EQ(service->transact(TestService::kEcho, data, &reply), OK);
        EXPECT_TRUE(comes_true([] { return Process::start("late_client").wait() == 0; })) << "all is well again";
    }
    over = true;
    caller.join();
}

// Refuses whatever is to be waited for from now on.
int watch_nothing(int epoll, int operation, int fd, epoll_event* event) {
    if (operation != EPOLL_CTL_ADD) return epoll_ctl(epoll, operation, fd, event);
    errno = ENOSPC;
    return -1;
}

// A server that takes on nothing more when it is told to, until it is told again.
TEST_ROLE(unwatching_server) {
    if (defaultServiceManager()->addService(String16("unwatching"), new TestService) != OK) return 1;
    start_pool();
    puts("ready");
    getchar();
    getchar();
    {
        const PlatformHook hook("libbinder.so", "epoll_ctl", watch_nothing);
        puts("unwatching");
        getchar();
        getchar();
    }
    puts("ready");
    getchar();
    return 0;
}

TEST(SocketProcess, ThatCannotWatchMoreTurnsChannelsAwayAndServesTheOthers) {
    Process server = Process::start("unwatching_server");
    ASSERT_EQ(server.read_line(), "ready");
    const sp<IBinder> service = find_service("unwatching");
    ASSERT_NE(service, nullptr);
    server.write_line("x");
    ASSERT_EQ(server.read_line(), "unwatching");
    for (int i = 0; i < 3; ++i) EXPECT_EQ(service->pingBinder(), FAILED_TRANSACTION) << "at once, not after a time-out";
    EXPECT_EQ(Process::start("late_client").wait(), 1);
    server.write_line("x");
    ASSERT_EQ(server.read_line(), "ready");
    EXPECT_EQ(service->pingBinder(), OK) << "all is well again";
}

// -- The runtime directory

// Publishes where the environment says, and prints what came of it.
TEST_ROLE(publisher) {
    const LogCapture log;
    const status_t status = defaultServiceManager()->addService(String16("service"), new TestService);
    printf("%d\n", status);
    for (const LogLine& line : log.lines()) fprintf(stderr, "%s\n", line.text.c_str());
    return 0;
}

class SocketDirectory : public testing::Test {
protected:
    SocketDirectory() {
        unsetenv("BINDER_RUNTIME_DIR");
        unsetenv("XDG_RUNTIME_DIR");
        mkdir("/run/test", 0700);
    }
    // The status of publishing in a fresh process.
    static std::string publish() { return Process::start("publisher").read_line(); }
    static bool is_socket(const std::string& path) {
        struct stat status {};
        return lstat(path.c_str(), &status) == 0 && S_ISSOCK(status.st_mode);
    }
    static mode_t mode(const std::string& path) {
        struct stat status {};
        return lstat(path.c_str(), &status) == 0 ? status.st_mode & 0777 : 0;
    }
};

TEST_F(SocketDirectory, IsTheOneThatWasChosen) {
    setenv("BINDER_RUNTIME_DIR", "/run/test/chosen", 1);
    setenv("XDG_RUNTIME_DIR", "/run/test", 1);
    EXPECT_EQ(publish(), "0");
    EXPECT_TRUE(is_socket("/run/test/chosen/service"));
    EXPECT_EQ(mode("/run/test/chosen"), 0700U);
}

TEST_F(SocketDirectory, IsTheSessionsUnlessOneWasChosen) {
    setenv("BINDER_RUNTIME_DIR", "", 1);
    setenv("XDG_RUNTIME_DIR", "/run/test", 1);
    EXPECT_EQ(publish(), "0");
    EXPECT_TRUE(is_socket("/run/test/binder/service"));
    EXPECT_EQ(mode("/run/test/binder"), 0700U);
}

TEST_F(SocketDirectory, IsTheUsersWhereThereIsNoSession) {
    if (geteuid() != 0) GTEST_SKIP() << "only root can be a user that has no directory yet";
    EXPECT_EQ(Process::start("publisher_as_other_user").read_line(), "0");
    const std::string path = "/tmp/binder-" + std::to_string(kOtherUser);
    EXPECT_TRUE(is_socket(path + "/service"));
    EXPECT_EQ(mode(path), 0700U);
    // Not when others may enter, nor when it is somebody else's or only points to one.
    chmod(path.c_str(), 0755);
    EXPECT_NE(Process::start("publisher_as_other_user").read_line(), "0");
    chmod(path.c_str(), 0700);
    ASSERT_EQ(chown(path.c_str(), 1, 1), 0);
    EXPECT_NE(Process::start("publisher_as_other_user").read_line(), "0");
    ASSERT_EQ(chown(path.c_str(), kOtherUser, kOtherUser), 0);
    EXPECT_EQ(Process::start("publisher_as_other_user").read_line(), "0");
    ASSERT_EQ(rename(path.c_str(), (path + ".moved").c_str()), 0);
    ASSERT_EQ(symlink((path + ".moved").c_str(), path.c_str()), 0);
    EXPECT_NE(Process::start("publisher_as_other_user").read_line(), "0");
    unlink(path.c_str());
    unlink((path + ".moved/service").c_str());
    rmdir((path + ".moved").c_str());
}

TEST_ROLE(publisher_as_other_user) {
    if (setgroups(0, nullptr) != 0 || setgid(kOtherUser) != 0 || setuid(kOtherUser) != 0) return 2;
    const LogCapture log;
    printf("%d\n", defaultServiceManager()->addService(String16("service"), new TestService));
    return 0;
}

TEST_F(SocketDirectory, MayHaveALongPath) {
    std::string path = "/run/test";
    for (int i = 0; i < 10; ++i) {
        path += "/" + std::string(100, static_cast<char>('a' + i));
        ASSERT_EQ(mkdir(path.c_str(), 0700), 0);
    }
    setenv("BINDER_RUNTIME_DIR", path.c_str(), 1);
    const std::string name(127, 'n');
    const Process server = start_server(name);
    const sp<IBinder> service = find_service(name);
    ASSERT_NE(service, nullptr);
    EXPECT_EQ(service->pingBinder(), OK);
}

TEST_F(SocketDirectory, ThatCannotBeMadeLeavesTheProcessAlone) {
    setenv("BINDER_RUNTIME_DIR", "/run/test/missing/directory", 1);
    EXPECT_NE(publish(), "0");
    setenv("BINDER_RUNTIME_DIR", "/dev/null", 1);
    EXPECT_NE(publish(), "0");
}

TEST_F(SocketDirectory, KeepsNothingOfANameThatCannotBeListenedAt) {
    setenv("BINDER_RUNTIME_DIR", "/run/test", 1);
    const sp<IServiceManager> names = defaultServiceManager();
    EXPECT_EQ(names->listServices().size(), 0U);
    const size_t before = count_descriptors();
    const auto publish_here = [&] { return names->addService(String16("service"), new TestService); };
    {
        const PlatformHook hook(
            "libbinder.so", "listen", +[](int, int) {
                errno = ENOBUFS;
                return -1;
            });
        EXPECT_EQ(publish_here(), -ENOBUFS);
    }
    {
        const PlatformHook hook("libbinder.so", "epoll_ctl", watch_nothing);
        EXPECT_EQ(publish_here(), NO_MEMORY);
    }
    EXPECT_EQ(count_descriptors(), before);
    EXPECT_TRUE(std::filesystem::is_empty("/run/test"));
    EXPECT_EQ(publish_here(), OK);
    EXPECT_TRUE(is_socket("/run/test/service"));
}

// The file under a name, which is another one whenever it is looked at.
int g_looks = 0;
int look_at_another(int directory, const char* name, struct stat* status, int flags) {
    const int result = fstatat(directory, name, status, flags);
    status->st_ino += static_cast<ino_t>(++g_looks);
    return result;
}

TEST_F(SocketDirectory, GivesANameUpThatGoesFromHandToHandWithoutEnd) {
    if (!PlatformHook::imports("libbinder.so", "fstatat")) GTEST_SKIP() << "the C library has another name for it";
    setenv("BINDER_RUNTIME_DIR", "/run/test", 1);
    const UniqueFd nobody(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const sockaddr_un address{AF_UNIX, "/run/test/service"};
    ASSERT_EQ(bind(nobody.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(find_service("service"), nullptr);
    const PlatformHook hook("libbinder.so", "fstatat", look_at_another);
    EXPECT_EQ(find_service("service"), nullptr);
    EXPECT_EQ(g_looks, 100);
}

TEST_F(SocketDirectory, DoesNotDependOnTheFileMask) {
    setenv("BINDER_RUNTIME_DIR", "/run/test/masked", 1);
    umask(0777);
    const std::string status = publish();
    umask(022);
    // A directory that its owner cannot enter is of no use to him, unless he is root.
    if (geteuid() == 0) {
        EXPECT_EQ(status, "0");
        EXPECT_EQ(mode("/run/test/masked/service"), 0666U);
    }
}

}  // namespace

// tavo serve.
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <nlohmann/json.hpp>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::failed;
using tavo::test::listed;
using tavo::test::Result;
using tavo::test::Running;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::ToolTest;

using Serve = ToolTest;

std::string ready_line(pid_t pid, unsigned queues, unsigned blocks) {
    return "serving android.tavo.osal as process " + std::to_string(pid) + ", with room for " + std::to_string(queues) +
           " queues and " + std::to_string(blocks) + " blocks\n";
}

TEST_F(Serve, SaysInOneLineThatItIsReady) {
    Running server({"serve"});
    EXPECT_EQ(server.read_until("\n"), ready_line(server.pid(), 25, 25));
    EXPECT_EQ(listed()["process"], server.pid());
    server.signal(SIGTERM);
    EXPECT_EQ(server.wait(), 0);
    EXPECT_EQ(server.read_rest(), "");
}

TEST_F(Serve, HandsTheLimitsToTheService) {
    Running server({"serve", "--queues", "3", "--blocks", "4"});
    EXPECT_EQ(server.read_until("\n"), ready_line(server.pid(), 3, 4));
    EXPECT_EQ(listed()["queue_room"], 3);
    EXPECT_EQ(listed()["block_limit"], 4);
}

TEST_F(Serve, RefusesLimitsThatTheServiceCannotTake) {
    EXPECT_TRUE(failed(tavo({"serve", "--queues", "0"}), 2, "--queues and --blocks must be 1 or more"));
    EXPECT_TRUE(failed(tavo({"serve", "--blocks", "0"}), 2, "--queues and --blocks must be 1 or more"));
    EXPECT_EQ(tavo({"serve", "--queues", "-1"}).status, 2);
    EXPECT_EQ(tavo({"serve", "--queues", "many"}).status, 2);
}

TEST_F(Serve, EndsWellOnEitherSignal) {
    for (const int signal : {SIGINT, SIGTERM}) {
        Running server({"serve"});
        server.read_until("\n");
        server.signal(signal);
        EXPECT_EQ(server.wait(), 0) << signal;
    }
}

TEST_F(Serve, LeavesTheMarkerBehind) {
    serve();
    stop_serving();
    struct stat marker = {};
    ASSERT_EQ(stat("/sdcard/com.zorla.qirserver/android.tavo.osal", &marker), 0);
    EXPECT_EQ(marker.st_mode & 0777, 0777U);
}

TEST_F(Serve, RefusesToTakeAnothersPlaceUnlessAsked) {
    serve();
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    EXPECT_TRUE(failed(tavo({"serve"}), 1,
                       "a service is running already: end it first, or take its place with --replace (queues and "
                       "blocks stay behind with it)"));
    Running other({"serve", "--replace"});
    EXPECT_EQ(other.read_until("\n"), ready_line(other.pid(), 25, 25));
    EXPECT_EQ(listed()["process"], other.pid());
    EXPECT_TRUE(listed()["queues"].empty());
}

TEST_F(Serve, WithoutStorageSaysWhatToMake) {
    ASSERT_EQ(symlink("/nowhere", "/sdcard/com.zorla.qirserver"), 0);
    EXPECT_TRUE(failed(tavo({"serve"}), 1,
                       "cannot make the marker /sdcard/com.zorla.qirserver/android.tavo.osal (No such file or "
                       "directory): this user must be able to write there"));
}

TEST_F(Serve, WithoutAnIndexFileSaysThatNothingWouldWork) {
    ASSERT_EQ(mkdir("/sdcard/shm_key_index_file.txt", 0700), 0);
    EXPECT_TRUE(failed(tavo({"serve"}), 1,
                       "the service could not be initialised: /sdcard/shm_key_index_file.txt must be writable"));
}

TEST_F(Serve, WithoutAPlaceForItsSocketSaysSo) {
    EXPECT_TRUE(failed(tavo({"serve"}, "", {{"BINDER_RUNTIME_DIR", "/nowhere/at/all"}, {"BINDER_DRIVER", "socket"}}), 1,
                       "the service could not be published: 'tavo doctor' looks at the driver and its directory"));
}

// What a supervisor is told, with an address of its file system or of the abstract namespace.
class Supervisor {
public:
    explicit Supervisor(const std::string& name) : name_(name) {
        sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        memcpy(address.sun_path, name.data(), name.size());
        if (name[0] == '@') address.sun_path[0] = '\0';
        fd_ = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        const timeval patience = {30, 0};
        setsockopt(fd_, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
        EXPECT_EQ(bind(fd_, reinterpret_cast<const sockaddr*>(&address),
                       static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size())),
                  0);
    }
    ~Supervisor() { close(fd_); }
    std::string hears() const {
        char message[256];
        const ssize_t size = recv(fd_, message, sizeof message, 0);
        return size > 0 ? std::string(message, static_cast<size_t>(size)) : "";
    }
    const std::string& name() const { return name_; }

private:
    const std::string name_;
    int fd_;
};

TEST_F(Serve, TellsItsSupervisorWhenItIsReadyAndWhenItStops) {
    for (const std::string& name : {std::string("/sdcard/notify"), "@tavo-serve-test-" + std::to_string(getpid())}) {
        const Supervisor supervisor(name);
        Running server({"serve"}, {{"NOTIFY_SOCKET", supervisor.name()}});
        EXPECT_EQ(supervisor.hears(), "READY=1\nSTATUS=Serving queues and blocks");
        EXPECT_EQ(tavo({"ping", "--count", "1"}).status, 0);
        server.signal(SIGTERM);
        EXPECT_EQ(supervisor.hears(), "STOPPING=1");
        EXPECT_EQ(server.wait(), 0);
    }
}

TEST_F(Serve, GoesOnWithoutASupervisorThatCanBeReached) {
    for (const char* name : {"/sdcard/nobody", "x", "relative", "@"}) {
        Running server({"serve"}, {{"NOTIFY_SOCKET", name}});
        server.read_until("\n");
        server.signal(SIGTERM);
        EXPECT_EQ(server.wait(), 0) << name;
    }
}

TEST_F(Serve, LogsOnRequest) {
    Running server({"serve", "--verbose"});
    const std::string output = server.read_until("serving android.tavo.osal");
    EXPECT_NE(output.find("MSGQUEUE_BINDER I "), std::string::npos) << output;
    EXPECT_EQ(output.find("LOG_PREF"), std::string::npos) << output;
}

}  // namespace

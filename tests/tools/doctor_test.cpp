// tavo doctor.
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <nlohmann/json.hpp>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::OnTerminal;
using tavo::test::Result;
using tavo::test::Running;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::ToolTest;
using tavo::test::Variables;
using tavo::test::without_the_rights_of_root;

constexpr char kMarker[] = "/sdcard/com.zorla.qirserver/android.tavo.osal";

class Doctor : public ToolTest {
protected:
    // What it has to say of a subject; null when it says nothing, or the status does not fit the findings.
    static json on(const std::string& subject, const Variables& variables = {}) {
        const Result result = tavo({"doctor", "--json"}, "", variables);
        json found;
        bool ill = false;
        for (const json& finding : json::parse(result.out)) {
            if (finding["subject"] == subject && found.is_null()) found = finding;
            ill = ill || finding["health"] == "problem";
        }
        EXPECT_EQ(result.status, ill ? 1 : 0) << result;
        EXPECT_EQ(result.err, "");
        return found;
    }
    static void make_semaphore() { EXPECT_TRUE(succeeded(tavo({"sem", "init", "5"}))); }
};

TEST_F(Doctor, IsContentWithAServiceThatRuns) {
    serve();
    std::ofstream("/sdcard/shm_key_gen_file.txt").flush();
    const Result result = tavo({"doctor"});
    EXPECT_EQ(result.status, 0) << result;
    EXPECT_EQ(result.out.find("problem"), std::string::npos) << result;
    EXPECT_NE(result.out.find("good     service: process " + std::to_string(server().pid()) +
                              " answers, with 0 queues and 0 blocks\n"),
              std::string::npos)
        << result;
    EXPECT_EQ(on("service")["health"], "good");
    EXPECT_FALSE(on("service").contains("advice"));
}

TEST_F(Doctor, CountsQueuesAndBlocks) {
    serve();
    ASSERT_TRUE(succeeded(tavo({"send", "7", "text"})));
    for (const char* key : {"8", "9"}) ASSERT_TRUE(succeeded(tavo({"shm", "create", key, "4K"})));
    EXPECT_EQ(on("service")["finding"],
              "process " + std::to_string(server().pid()) + " answers, with 1 queue and 2 blocks");
}

TEST_F(Doctor, NotesThatNoServiceWasEverThere) {
    EXPECT_EQ(on("service"), (json{{"health", "note"},
                                   {"subject", "service"},
                                   {"finding", "not running, nor has it been"},
                                   {"advice", "'tavo serve' starts it"}}));
}

TEST_F(Doctor, FindsAMarkerWithoutAService) {
    serve();
    stop_serving();
    EXPECT_EQ(on("marker"), (json{{"health", "problem"},
                                  {"subject", "marker"},
                                  {"finding", std::string(kMarker) + " is there, but no service answers"},
                                  {"advice",
                                   "start the service ('tavo serve'), or remove the marker: as long as it is "
                                   "there, clients wait five seconds before they fail"}}));
    ASSERT_EQ(unlink(kMarker), 0);
    EXPECT_EQ(on("service")["health"], "note");
}

TEST_F(Doctor, FindsAServiceWithoutAMarker) {
    serve();
    ASSERT_EQ(unlink(kMarker), 0);
    EXPECT_EQ(on("marker")["health"], "problem");
    EXPECT_EQ(on("marker")["finding"], std::string(kMarker) + " is missing, although the service runs");
}

TEST_F(Doctor, FindsAMarkerThatClientsMustNotRead) {
    serve();
    without_the_rights_of_root();
    ASSERT_EQ(chmod(kMarker, 0), 0);
    EXPECT_EQ(on("marker")["finding"], std::string(kMarker) + " cannot be read by this user");
}

TEST_F(Doctor, FindsAServiceThatDoesNotAnswer) {
    serve();
    server().signal(SIGSTOP);
    EXPECT_EQ(on("service")["health"], "problem");
    server().signal(SIGCONT);
}

TEST_F(Doctor, FindsStorageThatThisUserMustNotWriteTo) {
    EXPECT_EQ(on("storage")["health"], "good");
    without_the_rights_of_root();
    ASSERT_EQ(chmod("/sdcard", 0500), 0);
    EXPECT_EQ(on("storage")["health"], "problem");
    EXPECT_EQ(on("storage")["finding"],
              "/sdcard, mode 0500, owner " + std::to_string(geteuid()) + ": not readable and writable for this user");
    ASSERT_EQ(chmod("/sdcard", 0700), 0);
}

TEST_F(Doctor, FindsStorageThatIsFull) {
    if (mount("tmpfs", "/sdcard", "tmpfs", 0, "size=64k") != 0) GTEST_SKIP() << "needs the right to mount";
    EXPECT_EQ(on("storage")["health"], "problem");
    EXPECT_NE(on("storage")["finding"].get<std::string>().find(" bytes are left"), std::string::npos);
    umount("/sdcard");
}

TEST_F(Doctor, FindsThatThereIsNoStorage) {
    if (umount2("/sdcard", MNT_DETACH) != 0 || rmdir("/sdcard") != 0) GTEST_SKIP() << "needs the right to unmount";
    EXPECT_EQ(on("storage"), (json{{"health", "problem"},
                                   {"subject", "storage"},
                                   {"finding", "/sdcard: No such file or directory"},
                                   {"advice", "make this directory: marker, keys and semaphores live in it"}}));
    EXPECT_EQ(tavo({"serve"}).err,
              "tavo: there is no directory /sdcard: make it, for it is where clients look for the service\n");
    EXPECT_EQ(tavo({"sem", "init", "5"}).err,
              "tavo: there is no directory /sdcard: make it, for it is where semaphores live\n");
}

TEST_F(Doctor, NamesTheDriverAndItsDirectory) {
    const std::string owner = std::to_string(geteuid());
    EXPECT_EQ(on("driver", {{"BINDER_DRIVER", "socket"}})["finding"],
              "sockets in /run/binder, mode 0700, owner " + owner);
    EXPECT_EQ(on("driver", {{"BINDER_DRIVER", "socket"}, {"BINDER_RUNTIME_DIR", "/nowhere/at/all"}})["finding"],
              "sockets in /nowhere/at/all: No such file or directory");
    EXPECT_EQ(on("driver", {{"BINDER_DRIVER", "pigeon"}})["finding"],
              "BINDER_DRIVER names 'pigeon', which could not be opened");
    ASSERT_EQ(mkdir("/sdcard/binder", 0700), 0);
    EXPECT_EQ(on("driver",
                 {{"BINDER_DRIVER", "socket"}, {"BINDER_RUNTIME_DIR", ""}, {"XDG_RUNTIME_DIR", "/sdcard"}})["finding"],
              "sockets in /sdcard/binder, mode 0700, owner " + owner);
    without_the_rights_of_root();
    ASSERT_EQ(chmod("/sdcard/binder", 0), 0);
    EXPECT_EQ(on("driver", {{"BINDER_DRIVER", "socket"}, {"BINDER_RUNTIME_DIR", "/sdcard/binder"}})["finding"],
              "sockets in /sdcard/binder, mode 0000, which this user may not use");
}

TEST_F(Doctor, FindsSemaphoresThatNobodyWillRelease) {
    EXPECT_EQ(on("semaphores")["finding"], "none");
    make_semaphore();
    EXPECT_EQ(on("semaphore 5")["health"], "note");
    EXPECT_TRUE(succeeded(tavo({"sem", "wait", "5"})));
    const json found = on("semaphore 5");
    EXPECT_EQ(found["health"], "problem");
    EXPECT_EQ(found["finding"].get<std::string>().rfind("count 0, used by no process", 0), 0U) << found;
    EXPECT_EQ(found["advice"], "'tavo sem post 5' releases it, 'tavo sem destroy 5' removes it");

    Running user({"sem", "wait", "5"});
    json with_user;
    do {
        with_user = on("semaphore 5");
    } while (with_user["health"] != "good");
    EXPECT_EQ(with_user["finding"], "count 0, used by 1 processes");
}

TEST_F(Doctor, FindsSemaphoresThatLetSeveralIn) {
    make_semaphore();
    EXPECT_TRUE(succeeded(tavo({"sem", "post", "5"})));
    EXPECT_EQ(on("semaphore 5")["health"], "problem");
    EXPECT_EQ(on("semaphore 5")["finding"].get<std::string>().rfind("count 2, ", 0), 0U);
}

TEST_F(Doctor, FindsFilesThatOnlyLookLikeSemaphores) {
    std::ofstream("/sdcard/5") << "notes";
    std::ofstream("/sdcard/6").flush();
    std::ofstream("/sdcard/007").flush();
    std::ofstream("/sdcard/4294967296").flush();
    EXPECT_EQ(on("semaphore 5")["finding"], "/sdcard/5 holds no semaphore of this machine's word size");
    EXPECT_EQ(on("semaphore 6")["finding"], "was not finished by whoever made it");
    EXPECT_TRUE(on("semaphore 7").is_null());
    EXPECT_TRUE(on("semaphore 4294967296").is_null());
    without_the_rights_of_root();
    ASSERT_EQ(chmod("/sdcard/5", 0), 0);
    EXPECT_EQ(on("semaphore 5")["finding"], "/sdcard/5 cannot be read by this user");
}

TEST_F(Doctor, LooksAtTheKeyFiles) {
    EXPECT_EQ(on("keys of blocks")["finding"], "/sdcard/shm_key_index_file.txt is missing");
    std::ofstream("/sdcard/shm_key_index_file.txt") << "12";
    EXPECT_EQ(on("keys of blocks")["finding"], "/sdcard/shm_key_index_file.txt has 2 bytes instead of 4");
    EXPECT_EQ(on("keys of blocks")["health"], "problem");
    std::ofstream("/sdcard/shm_key_index_file.txt") << std::string("\x07\0\0\0", 4);
    EXPECT_EQ(on("keys of blocks")["finding"], "/sdcard/shm_key_index_file.txt has counted up to 7");
    EXPECT_NE(tavo({"doctor"}).out.find("note     keys of blocks: /sdcard/shm_key_gen_file.txt is missing\n"),
              std::string::npos);
    without_the_rights_of_root();
    ASSERT_EQ(chmod("/sdcard/shm_key_index_file.txt", 0400), 0);
    EXPECT_EQ(on("keys of blocks")["finding"],
              "/sdcard/shm_key_index_file.txt is not readable and writable for this user");
}

TEST_F(Doctor, LooksAtTheLimits) {
    rlimit limit = {};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    EXPECT_EQ(on("limits")["finding"],
              "this user's processes may have " + std::to_string(limit.rlim_cur) + " descriptors");
    limit.rlim_cur = 100;
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
    EXPECT_EQ(on("limits")["finding"], "this user's processes may have 100 descriptors");
    EXPECT_EQ(on("limits")["health"], "problem");
    const Result all = tavo({"doctor"});
    EXPECT_NE(all.out.find("limits: a pipe may have "), std::string::npos) << all;
}

TEST_F(Doctor, ColoursItsFindingsOnATerminal) {
    OnTerminal doctor({"doctor"});
    doctor.read_until("\033[32mgood    \033[0m \033[1mstorage\033[0m: /sdcard");
    doctor.read_until("\033[33mnote    \033[0m \033[1mservice\033[0m: not running");
    doctor.read_rest();
    EXPECT_EQ(doctor.wait(), 0);
}

}  // namespace

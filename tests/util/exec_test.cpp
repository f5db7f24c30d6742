#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <set>
#include <sstream>
#include <string>
#include <utility>

#include "support/log_capture.h"
#include "support/platform_fault.h"
#include "support/process.h"
#include "tavo_osal/process.h"

namespace {

using tavo::test::count_descriptors;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::PlatformHook;

constexpr char kShell[] = "/bin/sh";
constexpr char kMissing[] = "/sdcard/no/such/program";
constexpr char kResult[] = "/sdcard/result";
constexpr char kForkFailed[] = "Double Fork and Exec Failed!!!!!!!!!!!!!!!!!!!!!!!!!!\n";

bool has_children() { return waitpid(-1, nullptr, WNOHANG) != -1 || errno != ECHILD; }

std::string contents_of(const char* path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

// The test process takes the system's place in adopting the programs started, so that it can await their end.
class Exec : public testing::Test {
protected:
    Exec() { prctl(PR_SET_CHILD_SUBREAPER, 1); }
    ~Exec() override {
        EXPECT_FALSE(has_children());
        prctl(PR_SET_CHILD_SUBREAPER, 0);
        unlink(kResult);
    }

    // Awaits the end of the program that was started; -1 when there was none.
    static int reap() {
        int status = 0;
        return waitpid(-1, &status, 0) > 0 ? status : -1;
    }
};

// Captures standard output, also that of the programs started, until it is asked for or goes out of scope.
class OutputCapture {
public:
    OutputCapture() { testing::internal::CaptureStdout(); }
    ~OutputCapture() { finish(); }
    OutputCapture(const OutputCapture&) = delete;
    OutputCapture& operator=(const OutputCapture&) = delete;

    std::string finish() {
        return std::exchange(capturing_, false) ? testing::internal::GetCapturedStdout() : std::string();
    }

private:
    bool capturing_ = true;
};

TEST_F(Exec, StartsTheProgramWithItsArguments) {
    OutputCapture output;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_exec(kShell, "own-name", "-c", "tr '\\0' '|' </proc/$$/cmdline >/sdcard/result; exit 5", "a b",
                             "", nullptr),
              TAVO_SUCCESS);
    const int status = reap();
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 5);
    EXPECT_EQ(contents_of(kResult), "own-name|-c|tr '\\0' '|' </proc/$$/cmdline >/sdcard/result; exit 5|a b||");
    EXPECT_EQ(output.finish(), "Here is 83\n");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(Exec, GivesTheProgramTheCallersEnvironment) {
    OutputCapture output;
    setenv("TAVO_TEST_VALUE", "handed on", 1);
    EXPECT_EQ(tavo_osal_exec(kShell, "sh", "-c", "echo \"$TAVO_TEST_VALUE\"", nullptr), TAVO_SUCCESS);
    reap();
    EXPECT_EQ(output.finish(), "Here is 83\nhanded on\n");
}

TEST_F(Exec, DoesNotAwaitTheProgramsEnd) {
    OutputCapture output;
    int gate[2];
    ASSERT_EQ(pipe(gate), 0);
    const std::string script = "read line <&" + std::to_string(gate[0]);
    EXPECT_EQ(tavo_osal_exec(kShell, "sh", "-c", script.c_str(), nullptr), TAVO_SUCCESS);
    EXPECT_EQ(waitpid(-1, nullptr, WNOHANG), 0);  // still running, waiting at the gate
    ASSERT_EQ(write(gate[1], "\n", 1), 1);
    EXPECT_EQ(reap(), 0);
    close(gate[0]);
    close(gate[1]);
}

TEST_F(Exec, SucceedsForAProgramThatCannotBeRunWhichTheGrandchildTells) {
    OutputCapture output;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_exec(kMissing, "name", nullptr), TAVO_SUCCESS);
    EXPECT_EQ(reap(), 0);
    EXPECT_EQ(output.finish(), "Here is 83\nexecl failed. so exiting the child\n");
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(Exec, PrintsBufferedOutputOnce) {
    OutputCapture output;
    printf("before\n");
    FILE* file = fopen(kResult, "we");
    ASSERT_NE(file, nullptr);
    fputs("buffered\n", file);
    EXPECT_EQ(tavo_osal_exec(kMissing, "name", nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_exec("/bin/true", "true", nullptr), TAVO_SUCCESS);
    reap();
    reap();
    printf("after\n");
    fclose(file);
    EXPECT_EQ(contents_of(kResult), "buffered\n");
    const std::string text = output.finish();
    for (const char* once : {"before\n", "execl failed. so exiting the child\n", "after\n"}) {
        const size_t first = text.find(once);
        ASSERT_NE(first, std::string::npos) << text;
        EXPECT_EQ(text.find(once, first + 1), std::string::npos) << text;
    }
}

TEST(ExecWithoutAdoption, LeavesNoZombie) {
    OutputCapture output;
    EXPECT_EQ(tavo_osal_exec("/bin/true", "true", nullptr), TAVO_SUCCESS);
    EXPECT_EQ(tavo_osal_exec(kMissing, "name", nullptr), TAVO_SUCCESS);
    EXPECT_FALSE(has_children());
}

int g_signals = 0;
int g_signals_during_wait = 0;
pid_t g_waited = 0;
int g_wait_options = -1;

TEST(ExecWithoutAdoption, LeavesNoZombieWhenASignalArrivesDuringTheWait) {
    g_signals = 0;
    struct sigaction action = {};
    action.sa_handler = [](int) { ++g_signals; };  // without SA_RESTART
    struct sigaction before = {};
    sigaction(SIGUSR2, &action, &before);
    OutputCapture output;
    {
        const PlatformHook hook(
            "libtavoosal.so", "waitpid", +[](pid_t pid, int* status, int options) {
                pthread_kill(pthread_self(), SIGUSR2);
                g_waited = waitpid(pid, status, options);
                g_wait_options = options;
                g_signals_during_wait = g_signals;
                return g_waited;
            });
        EXPECT_EQ(tavo_osal_exec("/bin/true", "true", nullptr), TAVO_SUCCESS);
    }
    EXPECT_GT(g_waited, 0);
    EXPECT_EQ(g_wait_options, 0);
    EXPECT_EQ(g_signals_during_wait, 0);
    EXPECT_EQ(g_signals, 1);  // delivered afterwards
    EXPECT_FALSE(has_children());
    sigaction(SIGUSR2, &before, nullptr);
}

TEST_F(Exec, SucceedsWhateverTheWaitReports) {
    const OutputCapture output;
    {
        const PlatformHook hook(
            "libtavoosal.so", "waitpid", +[](pid_t, int*, int) {
                errno = ECHILD;
                return -1;
            });
        const LogCapture log;
        EXPECT_EQ(tavo_osal_exec("/bin/true", "true", nullptr), TAVO_SUCCESS);
        EXPECT_TRUE(log.lines().empty());
    }
    EXPECT_EQ(reap(), 0);  // the first child ends with status 0
    EXPECT_EQ(reap(), 0);
}

TEST_F(Exec, LeavesTheSignalMaskToTheCallerAndHandsItOn) {
    sigset_t mask, before, after;
    sigemptyset(&mask);
    sigaddset(&mask, SIGUSR1);
    pthread_sigmask(SIG_SETMASK, &mask, &before);
    OutputCapture output;
    EXPECT_EQ(tavo_osal_exec("/bin/grep", "grep", "SigBlk", "/proc/self/status", nullptr), TAVO_SUCCESS);
    pthread_sigmask(SIG_SETMASK, &before, &after);
    reap();
    EXPECT_EQ(output.finish(), "Here is 83\nSigBlk:\t0000000000000200\n");
    for (const int signal : {SIGUSR1, SIGUSR2, SIGTERM, SIGINT}) {
        EXPECT_EQ(sigismember(&after, signal), sigismember(&mask, signal)) << signal;
    }
}

// The descriptors of this process that a program inherits.
std::set<int> inheritable_descriptors() {
    std::set<int> descriptors;
    DIR* directory = opendir("/proc/self/fd");
    while (const dirent* entry = readdir(directory)) {
        if (entry->d_name[0] == '.') continue;
        const int descriptor = atoi(entry->d_name);
        if ((fcntl(descriptor, F_GETFD) & FD_CLOEXEC) == 0) descriptors.insert(descriptor);
    }
    closedir(directory);
    return descriptors;
}

// The descriptors in the output of `ls -l /proc/self/fd`, without the one the listing itself takes.
std::set<int> listed_descriptors(const std::string& listing) {
    std::set<int> descriptors;
    std::istringstream lines(listing);
    for (std::string line; std::getline(lines, line);) {
        const size_t arrow = line.find(" -> ");
        if (arrow == std::string::npos || line.find("/fd", line.size() - 3) != std::string::npos) continue;
        descriptors.insert(std::stoi(line.substr(line.rfind(' ', arrow - 1))));
    }
    return descriptors;
}

TEST_F(Exec, HandsOnOnlyWhatTheCallerOpenedInheritable) {
    const int closed = open("/dev/null", O_RDONLY | O_CLOEXEC);
    const int inherited = open("/dev/null", O_RDONLY);
    const size_t before = count_descriptors();
    OutputCapture output;
    const std::set<int> expected = inheritable_descriptors();
    EXPECT_EQ(tavo_osal_exec("/bin/ls", "ls", "-l", "/proc/self/fd", nullptr), TAVO_SUCCESS);
    reap();
    const std::set<int> listed = listed_descriptors(output.finish());
    EXPECT_EQ(listed, expected);
    EXPECT_EQ(listed.count(0) + listed.count(1) + listed.count(2), 3U);
    EXPECT_EQ(listed.count(inherited), 1U);
    EXPECT_EQ(listed.count(closed), 0U);
    EXPECT_EQ(count_descriptors(), before);
    close(closed);
    close(inherited);
}

// As many arguments as indices, beyond the shell's own four.
template <size_t... Indices>
TAVO_Status count_arguments(std::index_sequence<Indices...>) {
    const auto argument = [](size_t) { return "x"; };
    return tavo_osal_exec(kShell, "sh", "-c", "echo $#", "name", argument(Indices)..., nullptr);
}

TEST_F(Exec, PassesAnyNumberOfArguments) {
    struct Row {
        TAVO_Status (*call)();
        const char* output;
    };
    const Row rows[] = {
        {[] { return count_arguments(std::make_index_sequence<254 - 4>()); }, "Here is 83\n250\n"},
        {[] { return count_arguments(std::make_index_sequence<255 - 4>()); }, "Here is 83\n251\n"},
        {[] { return count_arguments(std::make_index_sequence<256 - 4>()); }, "Here is 83\n252\n"},
        {[] { return count_arguments(std::make_index_sequence<1000 - 4>()); }, "Here is 83\n996\n"},
    };
    for (const Row& row : rows) {
        OutputCapture output;
        EXPECT_EQ(row.call(), TAVO_SUCCESS);
        reap();
        EXPECT_EQ(output.finish(), row.output);
    }
}

int g_forks = 0;

pid_t failing_fork() {
    ++g_forks;
    errno = EAGAIN;
    return -1;
}

class ExecRefused : public Exec {
protected:
    ExecRefused() { g_forks = 0; }

private:
    const PlatformHook hook_{"libtavoosal.so", "fork", failing_fork};
};

TEST_F(ExecRefused, ReportsANullPath) {
    OutputCapture output;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_exec(nullptr, "name", nullptr), TAVO_FAILURE);
    EXPECT_EQ(tavo_osal_exec(nullptr, nullptr), TAVO_FAILURE);
    const tavo::test::ExpectedLine line = {1, "OSAL_EXEC", "Returning brcause NULL is passed as first arg\n"};
    EXPECT_TRUE(logged_exactly(log.lines(), {line, line}));
    EXPECT_EQ(g_forks, 0);
    EXPECT_EQ(output.finish(), "Here is 83\nHere is 83\n");
}

TEST_F(ExecRefused, ReportsMissingArguments) {
    OutputCapture output;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_exec("/bin/true", nullptr), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_EXEC", "Returning brcause NULL is passed as second arg\n"}}));
    EXPECT_EQ(g_forks, 0);
    EXPECT_EQ(output.finish(), "Here is 83\n");
}

TEST_F(ExecRefused, ReportsAFailedFork) {
    sigset_t before, after;
    pthread_sigmask(SIG_SETMASK, nullptr, &before);
    OutputCapture output;
    const LogCapture log;
    EXPECT_EQ(tavo_osal_exec("/bin/true", "true", nullptr), TAVO_FAILURE);
    EXPECT_EQ(g_forks, 1);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_EXEC", kForkFailed}}));
    pthread_sigmask(SIG_SETMASK, nullptr, &after);
    EXPECT_EQ(sigismember(&after, SIGTERM), sigismember(&before, SIGTERM));
    EXPECT_EQ(output.finish(), "Here is 83\n");
}

TEST_F(ExecRefused, ReportsArgumentsThatCannotBeCopied) {
    OutputCapture output;
    const PlatformHook hook(
        "libtavoosal.so", "calloc", +[](size_t, size_t) -> void* { return nullptr; });
    const LogCapture log;
    EXPECT_EQ(tavo_osal_exec("/bin/true", "true", nullptr), TAVO_FAILURE);
    EXPECT_TRUE(logged_exactly(log.lines(), {{1, "OSAL_MEM", "Memory not allocated\n"}}));
    EXPECT_EQ(g_forks, 0);
}

// Ends the copy of the test that a failed second fork leaves behind, after telling how it went there.
[[noreturn]] void tell_and_leave(int pipe, TAVO_Status status, const LogCapture& log) {
    const bool as_documented = status == TAVO_FAILURE && logged_exactly(log.lines(), {{1, "OSAL_EXEC", kForkFailed}});
    sigset_t mask;
    pthread_sigmask(SIG_SETMASK, nullptr, &mask);
    const char answer = as_documented && sigismember(&mask, SIGTERM) == 0 ? 'y' : 'n';
    fflush(stdout);  // what the copy of the buffer holds would come out twice
    _exit(write(pipe, &answer, 1) == 1 ? 0 : 1);
}

TEST_F(Exec, ReturnsInTheFirstChildWhenTheSecondForkFails) {
    g_forks = 0;
    OutputCapture output;
    printf("before\n");
    int answers[2];
    ASSERT_EQ(pipe(answers), 0);
    const pid_t caller = getpid();
    {
        const PlatformHook hook(
            "libtavoosal.so", "fork", +[]() -> pid_t { return g_forks++ == 0 ? fork() : -1; });
        const LogCapture log;
        const TAVO_Status status = tavo_osal_exec("/bin/true", "true", nullptr);
        if (getpid() != caller) tell_and_leave(answers[1], status, log);
        EXPECT_EQ(status, TAVO_SUCCESS);
        EXPECT_TRUE(log.lines().empty());
    }
    close(answers[1]);
    char answer = '-';
    EXPECT_EQ(read(answers[0], &answer, 1), 1);
    EXPECT_EQ(answer, 'y');
    close(answers[0]);
    EXPECT_FALSE(has_children());
    EXPECT_EQ(output.finish(), "before\nHere is 83\n");
}

}  // namespace

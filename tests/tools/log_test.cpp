// tavo log.
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "tools/program.h"

namespace {

using tavo::test::failed;
using tavo::test::OnTerminal;
using tavo::test::Result;
using tavo::test::Running;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::ToolTest;
using tavo::test::Variables;
using tavo::test::Words;

Words shell(const std::string& script, const Words& options = {}) {
    Words words = {"log"};
    words.insert(words.end(), options.begin(), options.end());
    words.insert(words.end(), {"--", "sh", "-c", script});
    return words;
}

using Log = ToolTest;

TEST_F(Log, GivesTheCommandThePreference) {
    EXPECT_TRUE(succeeded(tavo(shell("echo $LOG_PREF", {"--pref", "-a -l6"})), "-a -l6\n"));
    EXPECT_TRUE(succeeded(tavo(shell("echo $LOG_PREF")), "-s -a -l3\n"));
    EXPECT_TRUE(succeeded(tavo(shell("echo $LOG_PREF"), "", {{"LOG_PREF", "-s -l5"}}), "-s -l5\n"));
    EXPECT_TRUE(succeeded(tavo(shell("echo $LOG_PREF", {"-p", "-l1"}), "", {{"LOG_PREF", "-s -l5"}}), "-l1\n"));
}

TEST_F(Log, TheCommandsStandardInputAndOutputAreItsOwn) {
    EXPECT_TRUE(succeeded(tavo({"log", "--", "cat"}, "through\n"), "through\n"));
}

TEST_F(Log, ArgumentsAreTheCommands) {
    EXPECT_TRUE(succeeded(tavo({"log", "--", "echo", "-n", "--verbose", "--", "-v"}), "--verbose -- -v"));
}

TEST_F(Log, PassesTheExitStatusOn) {
    for (const int status : {0, 1, 2, 77, 255}) {
        EXPECT_EQ(tavo(shell("exit " + std::to_string(status))).status, status);
    }
}

TEST_F(Log, EndsOfTheCommandsSignal) {
    for (const int signal : {SIGTERM, SIGKILL, SIGINT, SIGSEGV, SIGPIPE}) {
        EXPECT_EQ(tavo(shell("kill -" + std::to_string(signal) + " $$")).status, -signal);
    }
}

TEST_F(Log, PassesSignalsOnToTheCommand) {
    for (const char* signal : {"INT", "TERM", "HUP", "QUIT", "USR1", "USR2"}) {
        Running log(shell(std::string("trap 'echo got; kill $!; exit 3' ") + signal + "; sleep 60 & echo ready; wait"));
        log.read_until("ready\n");
        log.signal(std::string(signal) == "INT"    ? SIGINT
                   : std::string(signal) == "TERM" ? SIGTERM
                   : std::string(signal) == "HUP"  ? SIGHUP
                   : std::string(signal) == "QUIT" ? SIGQUIT
                   : std::string(signal) == "USR1" ? SIGUSR1
                                                   : SIGUSR2);
        log.read_until("got\n");
        EXPECT_EQ(log.wait(), 3) << signal;
    }
}

TEST_F(Log, TheCommandDiesOfClosedPipesAsUsual) {
    // tavo itself ignores the signal.
    EXPECT_TRUE(succeeded(tavo(shell("(yes; echo $? >&2) 2>/sdcard/status | head -n 1")), "y\n"));
    std::string status;
    std::ifstream("/sdcard/status") >> status;
    EXPECT_EQ(status, "141");
}

TEST_F(Log, ACommandThatIsNotThereIsTold) {
    EXPECT_TRUE(
        failed(tavo({"log", "--", "no-such-command"}), 127, "cannot run no-such-command: No such file or directory"));
    std::ofstream("/sdcard/file") << "no program";
    EXPECT_TRUE(failed(tavo({"log", "--", "/sdcard/file"}), 126, "cannot run /sdcard/file: Permission denied"));
}

TEST_F(Log, WithoutACommandIsMisuse) {
    EXPECT_TRUE(failed(tavo({"log"}), 2, "COMMAND is required ('tavo log --help' tells more)"));
}

TEST_F(Log, PassesErrorsOnAsTheyAre) {
    const std::string said = "TAG E 11-21 01:00:18  1  1 12::text\n\nother text\nno end";
    std::ofstream("/sdcard/said") << said;
    EXPECT_EQ(tavo(shell("cat /sdcard/said >&2")).err, said);
}

TEST_F(Log, ColoursLinesByTheirPriority) {
    std::ofstream("/sdcard/said") << "TAG E 11-21 01:00:18 17033 17033 1::error\n\n"
                                     "TAG W 11-21 01:00:18 17033 17033 2::warning\n"
                                     "TAG I 11-21 01:00:18 17033 17033 3::information\n"
                                     "TAG D 11-21 01:00:18 17033 17033 4::debug\n"
                                     "A TAG V 11-21 01:00:18 17033 17033 5::verbose\n"
                                     "F 11-21 no log line\n"
                                     "\n"
                                     "11-21 01:00:18.123 17033 17033 E TAG: other form\n"
                                     "11-21 01:00:18.123 17033 17033 Err: no priority\n"
                                     "E no end";
    EXPECT_EQ(tavo(shell("cat /sdcard/said >&2", {"--color=always"})).err,
              "\033[31mTAG E 11-21 01:00:18 17033 17033 1::error\033[0m\n"
              "\033[33mTAG W 11-21 01:00:18 17033 17033 2::warning\033[0m\n"
              "\033[32mTAG I 11-21 01:00:18 17033 17033 3::information\033[0m\n"
              "\033[36mTAG D 11-21 01:00:18 17033 17033 4::debug\033[0m\n"
              "\033[2mA TAG V 11-21 01:00:18 17033 17033 5::verbose\033[0m\n"
              "F 11-21 no log line\n"
              "\n"
              "\033[31m11-21 01:00:18.123 17033 17033 E TAG: other form\033[0m\n"
              "11-21 01:00:18.123 17033 17033 Err: no priority\n"
              "E no end");
}

TEST_F(Log, ColoursTheRealThingOnATerminal) {
    serve();
    OnTerminal log({"log", "--", TAVO_PROGRAM, "send", "7", "text"});
    log.read_until("\033[31mMSGQUEUE_BINDER E ");
    log.read_until("\033[0m\r\n");
    EXPECT_EQ(log.wait(), 0);
}

TEST_F(Log, DoesNotWaitForWhatTheCommandLeavesBehind) {
    Running log(shell("sleep 60 >/dev/null & echo $!; echo last >&2; exit 4"));
    const std::string output = log.read_until("last\n");
    EXPECT_EQ(log.wait(), 4);
    kill(std::stoi(output), SIGKILL);
}

}  // namespace

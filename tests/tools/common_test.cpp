// What all subcommands have in common.
#include <sys/stat.h>
#include <unistd.h>

#include "tools/program.h"

namespace {

using tavo::test::failed;
using tavo::test::OnTerminal;
using tavo::test::Result;
using tavo::test::ServedTest;
using tavo::test::succeeded;
using tavo::test::tavo;
using tavo::test::ToolTest;
using tavo::test::without_the_rights_of_root;
using tavo::test::Words;

constexpr char kNoService[] =
    "there is no service, nor has there been one (/sdcard/com.zorla.qirserver/android.tavo.osal is missing): start one "
    "with 'tavo serve'";
constexpr char kServiceGone[] =
    "no service answers, although one has been here (/sdcard/com.zorla.qirserver/android.tavo.osal): start it with "
    "'tavo serve', or see 'tavo doctor'";

// One call of every subcommand that needs the service.
const std::vector<Words> kNeedService = {
    {"send", "7", "text"},
    {"recv", "7"},
    {"drop", "7"},
    {"shm", "create", "9", "1"},
    {"shm", "write", "9", "text"},
    {"shm", "read", "9"},
    {"shm", "hexdump", "9"},
    {"shm", "delete", "9"},
    {"ping"},
    {"list"},
    {"list", "--json"},
    {"top"},
};

using Common = ToolTest;
using CommonServed = ServedTest;

TEST_F(Common, WithoutASubcommandIsMisuse) {
    EXPECT_TRUE(failed(tavo({}), 2, "A subcommand is required ('tavo --help' tells more)"));
}

TEST_F(Common, AnUnknownSubcommandIsMisuse) {
    EXPECT_TRUE(failed(tavo({"sned", "7", "x"}), 2, "tavo has no subcommand sned ('tavo --help' tells more)"));
    EXPECT_TRUE(failed(tavo({"-v", "sned"}), 2, "tavo has no subcommand sned ('tavo --help' tells more)"));
    EXPECT_TRUE(
        failed(tavo({"shm", "erase", "9"}), 2, "tavo shm has no subcommand erase ('tavo shm --help' tells more)"));
    EXPECT_TRUE(failed(tavo({"sem"}), 2, "A subcommand is required ('tavo sem --help' tells more)"));
}

TEST_F(Common, AnUnknownOptionIsMisuse) {
    EXPECT_TRUE(failed(tavo({"list", "--jsno"}), 2,
                       "The following argument was not expected: --jsno ('tavo list --help' tells more)"));
}

TEST_F(Common, AMissingArgumentIsMisuse) {
    for (const char* command : {"send", "recv", "drop"}) {
        EXPECT_TRUE(
            failed(tavo({command}), 2, std::string("KEY is required ('tavo ") + command + " --help' tells more)"));
    }
}

TEST_F(Common, ABadKeyIsMisuse) {
    for (const char* key : {"seven", "7x", "", " 7", "+7", "4294967296", "-2147483649", "0x", "99999999999999999999"}) {
        EXPECT_TRUE(
            failed(tavo({"send", "--", key, "text"}), 2,
                   std::string("'") + key + "' is no key: keys are whole numbers of 32 bits, such as 7, -5 or 0x1f"));
    }
    for (const char* command : {"recv", "drop"}) {
        EXPECT_TRUE(failed(tavo({command, "0"}), 2, "0 is no key: choose any other number"));
    }
    for (const char* command : {"read", "hexdump", "delete"}) {
        EXPECT_TRUE(failed(tavo({"shm", command, "0"}), 2, "0 is no key: choose any other number"));
    }
    EXPECT_TRUE(failed(tavo({"send", "0", "x"}), 2, "0 is no key: choose any other number"));
    EXPECT_TRUE(failed(tavo({"shm", "create", "0", "1"}), 2, "0 is no key: choose any other number"));
    EXPECT_TRUE(failed(tavo({"shm", "write", "0", "x"}), 2, "0 is no key: choose any other number"));
}

TEST_F(Common, HelpIsThereForEverySubcommand) {
    const Result help = tavo({"--help"});
    EXPECT_EQ(help.status, 0);
    for (const char* command :
         {"serve", "send", "recv", "drop", "shm", "sem", "ping", "list", "top", "log", "doctor", "status"}) {
        EXPECT_NE(help.out.find(std::string("\n  ") + command + " "), std::string::npos) << help;
        const Result its_own = tavo({command, "--help"});
        EXPECT_EQ(its_own.status, 0);
        EXPECT_EQ(its_own.err, "");
        EXPECT_NE(its_own.out.find(std::string("Usage: tavo ") + command), std::string::npos) << its_own;
    }
}

TEST_F(Common, TheVersionIsTold) {
    const Result result = tavo({"--version"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "tavo " TAVO_VERSION "\n");
}

TEST_F(Common, WithoutAServiceTheUserIsToldToStartOne) {
    for (const Words& words : kNeedService) EXPECT_TRUE(failed(tavo(words), 1, kNoService)) << words[0];
}

TEST_F(Common, AServiceThatEndedIsToldAtOnce) {
    serve();
    stop_serving();
    for (const Words& words : kNeedService) EXPECT_TRUE(failed(tavo(words), 1, kServiceGone)) << words[0];
}

TEST_F(Common, AMarkerThatMustNotBeReadIsTold) {
    serve();
    without_the_rights_of_root();
    ASSERT_EQ(chmod("/sdcard/com.zorla.qirserver/android.tavo.osal", 0), 0);
    EXPECT_TRUE(failed(tavo({"list"}), 1,
                       "no permission to read /sdcard/com.zorla.qirserver/android.tavo.osal: clients need it to find "
                       "the service"));
}

TEST_F(CommonServed, TheLibrarysLogIsShownOnlyWhenAskedFor) {
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    for (const Words& words : {Words{"send", "7", "text", "--verbose"}, Words{"-v", "send", "7", "text"}}) {
        const Result loud = tavo(words);
        EXPECT_EQ(loud.status, 0);
        EXPECT_EQ(loud.out, "");
        EXPECT_NE(loud.err.find("MSGQUEUE_BINDER E "), std::string::npos) << loud;
    }
}

TEST_F(CommonServed, TheLibrarysPreferenceIsHeeded) {
    const Result loud = tavo({"send", "7", "text"}, "", {{"LOG_PREF", "-s -a -l6"}});
    EXPECT_EQ(loud.status, 0);
    EXPECT_EQ(loud.out, "");
    EXPECT_NE(loud.err.find("MSGQUEUE V "), std::string::npos) << loud;
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"}, "", {{"LOG_PREF", "-l0"}})).message());
}

TEST_F(CommonServed, ColoursAreForTerminals) {
    EXPECT_EQ(tavo({"list"}).out.find('\033'), std::string::npos);
    EXPECT_TRUE(succeeded(tavo({"send", "7", "text"})));
    OnTerminal on_terminal({"list"});
    EXPECT_NE(on_terminal.read_until("shared-memory blocks").find("\033[1m"), std::string::npos);
    EXPECT_EQ(on_terminal.wait(), 0);

    OnTerminal without({"list"}, {{"NO_COLOR", "1"}});
    EXPECT_EQ(without.read_until("shared-memory blocks").find('\033'), std::string::npos);
    OnTerminal dumb({"list"}, {{"TERM", "dumb"}});
    EXPECT_EQ(dumb.read_until("shared-memory blocks").find('\033'), std::string::npos);
    OnTerminal never({"list", "--color=never"});
    EXPECT_EQ(never.read_until("shared-memory blocks").find('\033'), std::string::npos);
    EXPECT_NE(tavo({"list", "--color=always"}).out.find("\033[1m"), std::string::npos);
    EXPECT_EQ(tavo({"list", "--color=blue"}).status, 2);
}

TEST_F(Common, ErrorsAreColouredOnTerminals) {
    OnTerminal on_terminal({"list"});
    EXPECT_EQ(on_terminal.read_until("there is no service"), "\033[31mtavo:\033[0m there is no service");
    EXPECT_EQ(on_terminal.wait(), 1);
}

TEST_F(CommonServed, AFullDiskIsTold) {
    for (const Words& words :
         {Words{"list"}, Words{"status"}, Words{"top"}, Words{"--help"}, Words{"doctor", "--json"}}) {
        const Result result = tavo::test::tavo_with_output_to("/dev/full", words);
        EXPECT_TRUE(failed(result, 1, "standard output cannot be written to: No space left on device")) << words[0];
    }
}

TEST_F(CommonServed, AServiceThatIsStoppedIsNotWaitedForForEver) {
    server().signal(SIGSTOP);
    EXPECT_TRUE(failed(tavo({"list"}), 1,
                       "the service does not answer: it may be stopped, or hang; 'tavo doctor' looks closer"));
    server().signal(SIGCONT);
}

}  // namespace

// tavo shm.
#include <fstream>
#include <nlohmann/json.hpp>

#include "tools/program.h"

namespace {

using nlohmann::json;
using tavo::test::failed;
using tavo::test::listed;
using tavo::test::Result;
using tavo::test::ServedTest;
using tavo::test::succeeded;
using tavo::test::tavo;

class Shm : public ServedTest {
protected:
    static json blocks() { return listed()["blocks"]; }
    static void create(const char* key, const char* size) {
        EXPECT_TRUE(succeeded(tavo({"shm", "create", key, size})));
    }
};

TEST_F(Shm, CreateMakesABlockOfZerosThatStays) {
    create("9", "5");
    ASSERT_EQ(blocks().size(), 1U);
    EXPECT_EQ(blocks()[0]["key"], 9);
    EXPECT_EQ(blocks()[0]["size"], 5);
    EXPECT_EQ(blocks()[0]["uses"], 1);
    EXPECT_TRUE(succeeded(tavo({"shm", "read", "9"}), std::string(5, '\0')));
}

TEST_F(Shm, SizesMayHaveUnits) {
    create("1", "2K");
    create("2", "3M");
    EXPECT_EQ(blocks()[0]["size"], 2048);
    EXPECT_EQ(blocks()[1]["size"], 3 << 20);
}

TEST_F(Shm, SizesThatCannotBeAreMisuse) {
    for (const char* size : {"0", "2147483648", "2G"}) {
        EXPECT_TRUE(failed(tavo({"shm", "create", "9", size}), 2,
                           std::string("a block has 1 to 2147483647 bytes, not ") + size));
    }
    for (const char* size : {"", "x", "1.5K", "4 K", "K", "99999999999999999999", "9999999999G"}) {
        EXPECT_TRUE(failed(tavo({"shm", "create", "9", size}), 2,
                           std::string("'") + size + "' is no size: sizes are bytes, such as 4096, 64K or 16M"));
    }
    EXPECT_TRUE(blocks().empty());
}

TEST_F(Shm, CreateRefusesAKeyThatIsTaken) {
    create("9", "5");
    EXPECT_TRUE(failed(tavo({"shm", "create", "9", "6"}), 1,
                       "block 9 is there already, with 5 bytes: delete it first, or take another key"));
    EXPECT_EQ(blocks()[0]["uses"], 1);
}

TEST_F(Shm, UnknownKeysAreTold) {
    constexpr char kUnknown[] = "the service has no block 9: make it with 'tavo shm create 9 SIZE'";
    EXPECT_TRUE(failed(tavo({"shm", "write", "9", "text"}), 1, kUnknown));
    for (const char* command : {"read", "hexdump", "delete"}) {
        EXPECT_TRUE(failed(tavo({"shm", command, "9"}), 1, kUnknown));
    }
    EXPECT_TRUE(blocks().empty());
}

TEST_F(Shm, WhatIsWrittenCanBeRead) {
    create("9", "16");
    EXPECT_TRUE(succeeded(tavo({"shm", "write", "9", "hello"})));
    EXPECT_TRUE(succeeded(tavo({"shm", "write", "9", "-", "--offset", "11"}, "world")));
    std::ofstream("/sdcard/input") << "..";
    EXPECT_TRUE(succeeded(tavo({"shm", "write", "9", "-f", "/sdcard/input", "-o", "6"})));
    EXPECT_TRUE(succeeded(tavo({"shm", "read", "9"}), std::string("hello\0..\0\0\0world", 16)));
    EXPECT_TRUE(succeeded(tavo({"shm", "read", "9", "--offset", "11", "--size", "3"}), "wor"));
    EXPECT_TRUE(succeeded(tavo({"shm", "read", "9", "--offset", "16"}), ""));
    EXPECT_EQ(blocks()[0]["uses"], 1);
}

TEST_F(Shm, MoreThanFitsIsRefusedAsAWhole) {
    create("9", "4");
    constexpr char kTooMuch[] = "that is more than the 2 bytes that the block has from there on: nothing was written";
    EXPECT_TRUE(failed(tavo({"shm", "write", "9", "abc", "--offset", "2"}), 1, kTooMuch));
    EXPECT_TRUE(failed(tavo({"shm", "write", "9", "-", "--offset", "2"}, "abc"), 1, kTooMuch));
    EXPECT_TRUE(failed(tavo({"shm", "write", "9", "a", "--offset", "5"}), 1,
                       "offset 5 lies behind the end of the block, which has 4 bytes"));
    EXPECT_TRUE(failed(tavo({"shm", "read", "9", "--offset", "5"}), 1,
                       "offset 5 lies behind the end of the block, which has 4 bytes"));
    EXPECT_TRUE(failed(tavo({"shm", "read", "9", "--offset", "1", "--size", "4"}), 1,
                       "the block has only 3 bytes from there on, not 4"));
    EXPECT_TRUE(succeeded(tavo({"shm", "read", "9"}), std::string(4, '\0')));
}

TEST_F(Shm, WritingNothingIsMisuse) {
    create("9", "4");
    constexpr char kWhat[] = "write what? A TEXT, a file (--file FILE) or standard input (-)";
    EXPECT_TRUE(failed(tavo({"shm", "write", "9"}), 2, kWhat));
    EXPECT_TRUE(failed(tavo({"shm", "write", "9", "a", "-f", "/sdcard/x"}), 2, kWhat));
    EXPECT_TRUE(
        failed(tavo({"shm", "write", "9", "-f", "/sdcard/x"}), 1, "cannot read /sdcard/x: No such file or directory"));
}

TEST_F(Shm, HexdumpShowsBytesAndCharacters) {
    create("9", "70");
    EXPECT_TRUE(succeeded(tavo({"shm", "write", "9", "The quick brown fox\x7f"})));
    EXPECT_TRUE(succeeded(tavo({"shm", "hexdump", "9"}),
                          "00000000  54 68 65 20 71 75 69 63  6b 20 62 72 6f 77 6e 20  |The quick brown |\n"
                          "00000010  66 6f 78 7f 00 00 00 00  00 00 00 00 00 00 00 00  |fox.............|\n"
                          "00000020  00 00 00 00 00 00 00 00  00 00 00 00 00 00 00 00  |................|\n"
                          "*\n"
                          "00000040  00 00 00 00 00 00                                 |......|\n"
                          "00000046\n"));
    EXPECT_TRUE(succeeded(tavo({"shm", "hexdump", "9", "-o", "4", "-s", "5"}),
                          "00000004  71 75 69 63 6b                                    |quick|\n"
                          "00000009\n"));
}

TEST_F(Shm, OutputThatCannotBeWrittenIsTold) {
    create("9", "70");
    for (const char* command : {"read", "hexdump"}) {
        EXPECT_TRUE(failed(tavo::test::tavo_with_output_to("/dev/full", {"shm", command, "9"}), 1,
                           "standard output cannot be written to: No space left on device"));
    }
}

TEST_F(Shm, DeleteTakesOneUseBack) {
    create("9", "4");
    EXPECT_TRUE(succeeded(tavo({"shm", "delete", "9"})));
    EXPECT_TRUE(blocks().empty());
}

TEST_F(Shm, BlocksOfNegativeKeysStay) {
    const Result created = tavo({"shm", "create", "--", "-9", "4"});
    EXPECT_EQ(created.status, 0);
    EXPECT_EQ(created.err,
              "tavo: note: the service deletes no blocks of negative keys, so this one stays until the service ends\n");
    EXPECT_TRUE(succeeded(tavo({"shm", "write", "--", "-9", "abcd"})));
    EXPECT_TRUE(succeeded(tavo({"shm", "read", "4294967287"}), "abcd"));
    EXPECT_TRUE(failed(tavo({"shm", "delete", "--", "-9"}), 1,
                       "the service deletes no blocks of negative keys: this one stays until the service ends"));
    EXPECT_EQ(blocks().size(), 1U);
}

TEST_F(Shm, WithoutAVerbIsMisuse) { EXPECT_EQ(tavo({"shm"}).status, 2); }

}  // namespace

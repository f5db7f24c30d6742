// The real tavo command as processes: run to its end, running beside the test, or on a terminal.
#pragma once

#include <gtest/gtest.h>
#include <sys/types.h>

#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

namespace tavo::test {

using Words = std::vector<std::string>;
// Variables that a program is given beside those of the test; an empty value takes one away.
using Variables = std::map<std::string, std::string>;

struct Result {
    int status;  // minus the signal that ended it
    std::string out;
    std::string err;
};

std::ostream& operator<<(std::ostream& out, const Result& result);

// Runs tavo with these arguments, and this on its standard input.
Result tavo(const Words& arguments, const std::string& input = "", const Variables& variables = {});
// The same, with one of its descriptors on a file instead.
Result tavo_with_output_to(const char* path, const Words& arguments);

// What "tavo list" tells programs of the service.
nlohmann::json listed();

// Programs that are started from now on are held to the permissions of files, even if they belong to root.
void without_the_rights_of_root();

// A program that runs beside the test. Killed with the object.
class Running {
public:
    // Its errors come with its output, unless they go to a file.
    explicit Running(const Words& arguments, const Variables& variables = {}, const char* errors = nullptr);
    virtual ~Running();
    Running(const Running&) = delete;
    Running& operator=(const Running&) = delete;

    pid_t pid() const { return pid_; }
    void write(const std::string& text) const;
    void close_input();
    // Reads its output until the text has come, and returns everything up to its end. Fails the test, and returns what
    // came, when the output ends or half a minute passes without it.
    std::string read_until(const std::string& text);
    // All of the output that is left.
    std::string read_rest();
    void signal(int number) const;
    // Its exit status, or minus the signal that ended it.
    int wait();

    // The descriptors of its output and its input.
    int out = -1;
    int in = -1;

protected:
    Running() = default;
    pid_t pid_ = -1;

private:
    std::string pending_;
};

// tavo on a terminal of its own, which also is its standard error.
class OnTerminal : public Running {
public:
    explicit OnTerminal(const Words& arguments, const Variables& variables = {}, int rows = 24, int columns = 80);
    void resize(int rows, int columns) const;
    // Whether it gets keys one by one, without them being shown.
    bool gets_keys() const;
    bool is_suspended() const;
};

// With "tavo serve" running beside the test.
class ToolTest : public testing::Test {
protected:
    ToolTest();
    void serve(const Words& more = {});
    void stop_serving();
    Running& server() { return *server_; }

private:
    std::unique_ptr<Running> server_;
};

class ServedTest : public ToolTest {
protected:
    ServedTest() { serve(); }
};

// One line on standard error, and nothing else.
testing::AssertionResult failed(const Result& result, int status, const std::string& message);
testing::AssertionResult succeeded(const Result& result, const std::string& out = "");

}  // namespace tavo::test

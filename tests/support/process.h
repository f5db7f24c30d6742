// Other processes, for tests of what crosses processes, and counts of what this or another one holds.
//
// A role is a function that a test runs in a fresh process: the test program starts itself again.
//
//     TEST_ROLE(echo_server) { ... return 0; }
//     Process server = Process::start("echo_server", {"7"});
//     EXPECT_EQ(server.read_line(), "ready");
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace tavo::test {

using Role = int (*)(const std::vector<std::string>& arguments);

struct RoleRegistration {
    RoleRegistration(const char* name, Role role);
};

// The command that programs of this one's kind are run with, where the machine cannot run them by itself; else null.
const char* emulator();

// Runs the role this process was started for and exits with its result; returns when there is none.
void run_role_if_asked();

class Process {
public:
    static Process start(const std::string& role, const std::vector<std::string>& arguments = {});
    Process(Process&& other) noexcept;
    Process& operator=(Process&&) = delete;
    ~Process();  // kills and reaps what still runs

    pid_t pid() const { return pid_; }
    // One line of the process's standard output, without its end; empty at the end of the output.
    std::string read_line();
    // One line for the process's standard input.
    void write_line(const std::string& line);
    void kill(int signal);
    // Returns once none of its threads runs; only a signal that ends it or SIGCONT does something to it then.
    void stop();
    // Waits for the end: the exit status, or minus the signal that ended it.
    int wait();

private:
    Process(pid_t pid, int in, int out) : pid_(pid), in_(in), out_(out) {}
    pid_t pid_;
    int in_;   // the process's standard input
    int out_;  // the process's standard output
};

// What a process holds; 0 for this one.
size_t count_descriptors(pid_t pid = 0);
size_t count_threads(pid_t pid = 0);
size_t count_mappings(pid_t pid = 0, const std::string& containing = "");

}  // namespace tavo::test

#define TEST_ROLE(name)                                                                    \
    static int role_##name(const std::vector<std::string>& arguments);                     \
    static const tavo::test::RoleRegistration registration_of_##name(#name, &role_##name); \
    static int role_##name([[maybe_unused]] const std::vector<std::string>& arguments)

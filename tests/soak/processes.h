// The server's and the clients' processes, as the coordinator starts, kills and looks at them.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace tavo::soak {

// What a process holds.
struct Holdings {
    long descriptors = 0, threads = 0, mappings = 0, resident_kib = 0;
};

class ChildProcess {
public:
    ChildProcess() = default;
    // This program with other arguments; its output goes to a file. Ends with this process.
    ChildProcess(const std::vector<std::string>& arguments, int board, int failures, const std::string& log);

    pid_t pid() const { return pid_; }
    bool is_running() const { return pid_ > 0; }
    void kill(int signal) const;
    // Whether it has ended; then, how.
    bool has_ended(std::string& how);
    Holdings holdings() const;

private:
    pid_t pid_ = 0;
};

// For a child's main function.
void end_with_parent();

}  // namespace tavo::soak

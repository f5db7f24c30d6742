// Which descriptors are open, here and in other processes, and what it is like to have none.
#pragma once

#include <sys/resource.h>
#include <sys/types.h>

namespace tavo::test {

bool is_open(int descriptor);

// What the descriptor is open on: the same number for all ends of one pipe, and for nothing else. 0 when it is closed.
ino_t file_of(int descriptor);

// How many descriptors a process has on a pipe; 0 is this process.
size_t count_pipe_ends(ino_t pipe, pid_t pid = 0);

// The process can have so many descriptors more, and no others, for as long as it lives.
class DescriptorLimit {
public:
    explicit DescriptorLimit(unsigned more);
    ~DescriptorLimit();
    DescriptorLimit(const DescriptorLimit&) = delete;
    DescriptorLimit& operator=(const DescriptorLimit&) = delete;

private:
    rlimit saved_ = {};
};

// Standard input is closed for as long as it lives, so that the next descriptor is 0.
class NoInput {
public:
    NoInput();
    ~NoInput();
    NoInput(const NoInput&) = delete;
    NoInput& operator=(const NoInput&) = delete;

private:
    int saved_;
};

}  // namespace tavo::test

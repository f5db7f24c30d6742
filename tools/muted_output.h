// Keeps what the library prints on standard output out of the command's own output.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>

namespace tavo::tool {

// Standard output goes nowhere while it lives.
class MutedOutput {
public:
    MutedOutput() {
        fflush(stdout);
        saved_ = fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
        const int nowhere = open("/dev/null", O_WRONLY | O_CLOEXEC);
        if (saved_ >= 0 && nowhere >= 0) dup2(nowhere, STDOUT_FILENO);
        if (nowhere >= 0) close(nowhere);
    }
    ~MutedOutput() {
        if (saved_ < 0) return;
        fflush(stdout);
        dup2(saved_, STDOUT_FILENO);
        close(saved_);
    }
    MutedOutput(const MutedOutput&) = delete;
    MutedOutput& operator=(const MutedOutput&) = delete;

private:
    int saved_;
};

}  // namespace tavo::tool

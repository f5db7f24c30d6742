// A process that is there for as long as an object is.
#pragma once

#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "peer.h"

namespace tavo::peers {

class Child {
public:
    template <typename Work>
    explicit Child(Work work) : pid_(fork()) {
        if (pid_ < 0) fail("fork");
        if (pid_ > 0) return;
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        work();
        _exit(0);
    }
    ~Child() {
        if (pid_ <= 0) return;
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    // Whether it has ended; from then on there is nothing to end.
    bool ended() {
        if (pid_ > 0 && waitpid(pid_, nullptr, WNOHANG) != 0) pid_ = 0;
        return pid_ <= 0;
    }

private:
    pid_t pid_;
};

}  // namespace tavo::peers

#include "tools/stop_signals.h"

#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

#include "tools/command.h"

namespace tavo::tool {
namespace {

constexpr int kSignals[] = {SIGINT, SIGTERM, SIGHUP};
int g_ends[2] = {-1, -1};
// A signal may be handled on any thread.
std::atomic<int> g_received{0};

void note(int signal) {
    const int error = errno;
    g_received = signal;
    [[maybe_unused]] const ssize_t count = write(g_ends[1], "", 1);
    errno = error;
}

}  // namespace

StopSignals::StopSignals() {
    if (pipe2(g_ends, O_CLOEXEC | O_NONBLOCK) != 0) throw Failure("no descriptors are left: see 'ulimit -n'");
    struct sigaction action = {};
    action.sa_handler = note;
    action.sa_flags = static_cast<int>(SA_RESETHAND);
    for (const int signal : kSignals) sigaction(signal, &action, nullptr);
}

StopSignals::~StopSignals() {
    for (const int number : kSignals) signal(number, SIG_DFL);
    for (int& end : g_ends) {
        close(end);
        end = -1;
    }
}

int StopSignals::received() { return g_received; }
int StopSignals::descriptor() { return g_ends[0]; }

}  // namespace tavo::tool

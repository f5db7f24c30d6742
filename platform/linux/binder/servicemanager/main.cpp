// The service manager for machines that have the kernel's binder driver and no Android.
#include <binder/IPCThreadState.h>
#include <binder/ProcessState.h>
#include <signal.h>
#include <utils/Errors.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <system_error>
#include <thread>

#include "ServiceRegistry.h"

namespace {

using namespace android;

void complain(const char* what) { fprintf(stderr, "servicemanager: %s\n", what); }

int usage(FILE* out, int result) {
    fputs(
        "usage: servicemanager [--ready]\n"
        "\n"
        "Keeps the names of the services of this machine's binder device, until SIGTERM or SIGINT.\n"
        "\n"
        "  --ready   say 'ready' on the standard output when names can be published\n"
        "\n"
        "BINDER_DEVICE names the device, /dev/binder unless it is set.\n",
        out);
    return result;
}

const char* describe(status_t status) {
    switch (status) {
        case NO_INIT: return "the binder device cannot be opened (is the module binder_linux loaded?)";
        case ALREADY_EXISTS: return "there is a service manager already";
        case INVALID_OPERATION: return "the driver that BINDER_DRIVER names needs no service manager";
        default: return strerror(-status);
    }
}

}  // namespace

int main(int argc, char** argv) {
    bool says_ready = false;
    for (int i = 1; i < argc; ++i) {
        if (strcmp(argv[i], "--help") == 0) return usage(stdout, 0);
        if (strcmp(argv[i], "--ready") != 0) return usage(stderr, 2);
        says_ready = true;
    }

    // Before any thread is there to be hit.
    sigset_t ends;
    sigemptyset(&ends);
    sigaddset(&ends, SIGTERM);
    sigaddset(&ends, SIGINT);
    sigprocmask(SIG_BLOCK, &ends, nullptr);

    // No other driver needs one.
    const char* driver = getenv("BINDER_DRIVER");
    if (driver == nullptr || *driver == '\0') setenv("BINDER_DRIVER", "kernel", 1);
    const status_t status = ProcessState::self()->becomeContextManager(new ServiceRegistry);
    if (status != OK) {
        complain(describe(status));
        return 1;
    }
    // One thread is enough: it never waits for anybody.
    ProcessState::self()->setThreadPoolMaxThreadCount(0);
    try {
        std::thread([] { IPCThreadState::self()->joinThreadPool(); }).detach();
    } catch (const std::system_error& error) {
        complain(error.what());
        return 1;
    }
    if (says_ready) {
        puts("ready");
        fflush(stdout);
    }
    int signal = 0;
    sigwait(&ends, &signal);
    return 0;
}

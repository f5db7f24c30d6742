// tavo serve: a process that publishes the service.
#include <binder/IPCThreadState.h>
#include <pthread.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <thread>

#include "tavo_osal/init.h"
#include "tools/command.h"
#include "tools/muted_output.h"
#include "tools/notify.h"
#include "tools/service.h"

namespace tavo::tool {
namespace {

struct Options {
    unsigned queues = 25;
    unsigned blocks = 25;
    bool replace = false;
};

// What tavo_osal_init() logs, and a user of this command is to be told.
void check_storage() {
    const std::string root = storage_root();
    struct stat status = {};
    if (stat(root.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) {
        throw Failure("there is no directory " + root + ": make it, for it is where clients look for the service");
    }
}

void refuse_second_service() {
    const Binder other = look_up_service();
    if (other == nullptr) return;
    throw Failure(
        "a service is running already: end it first, or take its place with --replace (queues and blocks stay "
        "behind with it)");
}

// tavo_osal_init() only logs that it could not publish, or not initialise its tables.
void check_published() {
    const Binder service = look_up_service();
    if (service == nullptr || service->localBinder() == nullptr) {
        throw Failure("the service could not be published: 'tavo doctor' looks at the driver and its directory");
    }
    const ServiceFigures figures = figures_of(service);
    if (!figures.has_queue_table || !figures.has_block_list) {
        throw Failure("the service could not be initialised: " + storage_root() +
                      "/shm_key_index_file.txt must be "
                      "writable");
    }
}

void publish(const Options& options) {
    const MutedOutput muted;
    errno = 0;
    const TAVO_Status status = tavo_osal_init(options.queues, options.blocks);
    if (status == TAVO_FAILURE) {
        throw Failure("cannot make the marker " + marker_path() + " (" + strerror(errno) +
                      "): this user must be able to write there");
    }
    if (status != TAVO_SUCCESS) throw Failure("publishing failed with " + describe_status(status));
}

int serve(const Options& options) {
    if (options.queues == 0 || options.blocks == 0) throw Misuse("--queues and --blocks must be 1 or more");
    // Before any thread is started, so that the signals come to none of them.
    sigset_t ends;
    sigemptyset(&ends);
    sigaddset(&ends, SIGINT);
    sigaddset(&ends, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &ends, nullptr);

    check_storage();
    if (!options.replace) refuse_second_service();
    publish(options);
    check_published();
    std::thread([] { android::IPCThreadState::self()->joinThreadPool(); }).detach();

    printf("serving android.tavo.osal as process %d, with room for %u queues and %u blocks\n",
           static_cast<int>(getpid()), options.queues, options.blocks);
    fflush(stdout);
    notify_supervisor("READY=1\nSTATUS=Serving queues and blocks");
    int signal = 0;
    while (sigwait(&ends, &signal) != 0) {
    }
    notify_supervisor("STOPPING=1");
    // The threads that serve cannot be stopped, and must not meet objects that are being destroyed.
    _exit(kDone);
}

}  // namespace

void add_serve(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options = add_command<Options>(app, run, "serve", "Publishes the service", serve, command);
    command->add_option("--queues", options->queues, "Queues to make room for at first; 25 without");
    command->add_option("--blocks", options->blocks, "Blocks after which the log says that it is many; 25 without");
    command->add_flag("--replace", options->replace, "Take the place of a service that is running");
}

}  // namespace tavo::tool

// tavo sem: cross-process semaphores.
#include <semaphore.h>
#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <ctime>

#include "tavo_osal/ipc_semaphore.h"
#include "tools/command.h"
#include "tools/numbers.h"
#include "tools/semaphore_files.h"
#include "tools/service.h"

namespace tavo::tool {
namespace {

struct Options {
    std::string key;
    double timeout = -1;
    bool force = false;
};

std::string named(const SemaphoreFile& file) { return "semaphore " + std::to_string(file.key); }

// A semaphore that this process has mapped. A handle is the address of the platform's semaphore.
class Semaphore {
public:
    explicit Semaphore(const SemaphoreFile& file) {
        errno = 0;
        const TAVO_Status status = tavo_semaphore_init(file.key, &handle_);
        if (status == TAVO_SUCCESS && handle_ != -1) return;
        const std::string reason = errno != 0 ? strerror(errno) : describe_status(status);
        throw Failure("cannot use " + named(file) + " (" + file.path + "): " + reason);
    }
    ~Semaphore() { tavo_semaphore_delete(handle_); }
    Semaphore(const Semaphore&) = delete;
    Semaphore& operator=(const Semaphore&) = delete;

    TAVO_INT64 handle() const { return handle_; }
    sem_t* platform() const { return reinterpret_cast<sem_t*>(static_cast<intptr_t>(handle_)); }

private:
    TAVO_INT64 handle_ = 0;
};

// Refuses files that hold no semaphore, each with what to do.
void check(const SemaphoreFile& file, bool may_be_missing) {
    switch (file.state) {
        case SemaphoreState::kForeign:
            throw Failure(file.path + " holds no semaphore, and is left as it is: take another key");
        case SemaphoreState::kUnreadable:
            throw Failure("cannot read " + file.path + ": " + strerror(EACCES) + ", or it is out of order");
        case SemaphoreState::kMissing:
            if (may_be_missing) return;
            throw Failure("there is no " + named(file) + " (" + file.path + "): make it with 'tavo sem init " +
                          std::to_string(file.key) + "'");
        default: return;
    }
}

SemaphoreFile existing(const Options& options) {
    SemaphoreFile file = look_at_semaphore(parse_semaphore_key(options.key));
    check(file, false);
    return file;
}

int init(const Options& options) {
    const SemaphoreFile file = look_at_semaphore(parse_semaphore_key(options.key));
    if (access(storage_root().c_str(), F_OK) != 0) {
        throw Failure("there is no directory " + storage_root() + ": make it, for it is where semaphores live");
    }
    if (file.state != SemaphoreState::kMissing) check(file, true);
    const Semaphore semaphore(file);
    return kDone;
}

bool wait_until(sem_t* semaphore, double seconds) {
    timespec deadline = {};
    clock_gettime(CLOCK_REALTIME, &deadline);
    const auto nanoseconds = static_cast<long long>(milliseconds_of(seconds).count()) * 1000000 + deadline.tv_nsec;
    deadline.tv_sec += static_cast<time_t>(nanoseconds / 1000000000);
    deadline.tv_nsec = static_cast<long>(nanoseconds % 1000000000);
    int result = -1;
    do {
        result = sem_timedwait(semaphore, &deadline);
    } while (result != 0 && errno == EINTR);
    return result == 0;
}

int wait(const Options& options) {
    const SemaphoreFile file = existing(options);
    const Semaphore semaphore(file);
    if (options.timeout >= 0) {
        if (wait_until(semaphore.platform(), options.timeout)) return kDone;
        throw Failure(errno == ETIMEDOUT ? named(file) + " was not released in time"
                                         : "waiting for " + named(file) + " failed: " + strerror(errno));
    }
    TAVO_Status status = TAVO_FAILURE;
    do {
        status = tavo_semaphore_acquire(semaphore.handle());
    } while (status != TAVO_SUCCESS && errno == EINTR);
    if (status != TAVO_SUCCESS) throw Failure("waiting for " + named(file) + " failed: " + strerror(errno));
    return kDone;
}

int post(const Options& options) {
    const SemaphoreFile file = existing(options);
    const Semaphore semaphore(file);
    if (tavo_semaphore_release(semaphore.handle()) != TAVO_SUCCESS) {
        throw Failure("releasing " + named(file) + " failed: " + strerror(errno));
    }
    return kDone;
}

int get(const Options& options) {
    const SemaphoreFile file = existing(options);
    if (file.state == SemaphoreState::kUnfinished) {
        throw Failure(named(file) + " was not finished by whoever made it: 'tavo sem init' does that");
    }
    printf("%d\n", file.count);
    return kDone;
}

int destroy(const Options& options) {
    const SemaphoreFile file = existing(options);
    if (!file.users.empty() && !options.force) {
        throw Failure("process " + std::to_string(file.users.front()) + " uses " + named(file) +
                      ": end it first, or use --force, which leaves it with a semaphore that nobody else finds");
    }
    if (unlink(file.path.c_str()) != 0) throw Failure("cannot remove " + file.path + ": " + strerror(errno));
    return kDone;
}

}  // namespace

void add_sem(CLI::App& app, Run& run) {
    CLI::App* sem = app.add_subcommand("sem", "Works with cross-process semaphores");
    sem->require_subcommand(1);
    CLI::App* command = nullptr;
    const auto add = [&](const char* name, const char* text, int (*action)(const Options&)) {
        auto options = add_command<Options>(*sem, run, name, text, action, command);
        command->add_option("KEY", options->key, "The semaphore's key, 0 to 4294967295")->required();
        return options;
    };
    add("init", "Makes a semaphore with a count of 1; leaves one that is there as it is", init);
    const auto waiting = add("wait", "Takes a semaphore, and leaves it taken", wait);
    command->add_option("-t,--timeout", waiting->timeout, "Seconds to wait; for ever without");
    add("post", "Releases a semaphore", post);
    add("get", "Prints a semaphore's count", get);
    const auto destroying = add("destroy", "Removes a semaphore's file", destroy);
    command->add_flag("--force", destroying->force, "Even when processes use it");
}

}  // namespace tavo::tool

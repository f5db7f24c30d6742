#include "tavo_osal/process.h"

#include <pthread.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>

#include "log/cancel_shield.h"
#include "log/module_log.h"
#include "tavo_osal/memory.h"

namespace {

constexpr char kExecTag[] = "OSAL_EXEC";
constexpr char kMiscTag[] = "OSAL_MISC_FUNC";

struct MemoryReleaser {
    void operator()(void* block) const { tavo_osal_mem_free(block); }
};
using ArgumentVector = std::unique_ptr<char*[], MemoryReleaser>;

// The arguments up to the first null pointer, and a null pointer; null when memory is short.
ArgumentVector copy_arguments(va_list& arguments) {
    va_list ahead;
    va_copy(ahead, arguments);
    unsigned int count = 0;
    while (va_arg(ahead, char*) != nullptr) ++count;
    va_end(ahead);

    ArgumentVector vector(static_cast<char**>(tavo_osal_mem_calloc(count + 1, sizeof(char*))));
    for (unsigned int i = 0; vector != nullptr && i < count; ++i) vector[i] = va_arg(arguments, char*);
    return vector;
}

// Keeps all signals from this thread and from the processes it forks. Otherwise a signal during the wait for the
// first child would leave a zombie, and the caller's handlers would run in the children.
class SignalsBlocked {
public:
    SignalsBlocked() {
        sigset_t all;
        sigfillset(&all);
        pthread_sigmask(SIG_SETMASK, &all, &before_);
    }
    ~SignalsBlocked() { restore(); }
    SignalsBlocked(const SignalsBlocked&) = delete;
    SignalsBlocked& operator=(const SignalsBlocked&) = delete;

    void restore() const { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }

private:
    sigset_t before_;
};

TAVO_Status exec_failed(const char* message, int line = __builtin_LINE()) {
    TAVO_LOG_AT(line, kExecTag, TAVO_LOG_ERROR, "%s\n", message);
    return TAVO_FAILURE;
}

// In the grandchild. Standard output's buffer is a copy of the caller's here and must not be flushed, so neither
// stdio nor exit() is used.
[[noreturn]] void run_program(const char* path, char* const* arguments) {
    execv(path, arguments);
    constexpr char kMessage[] = "execl failed. so exiting the child\n";
    [[maybe_unused]] const ssize_t written = write(STDOUT_FILENO, kMessage, sizeof kMessage - 1);
    _exit(0);
}

TAVO_Status start_detached(const char* path, char* const* arguments) {
    constexpr char kForkFailed[] = "Double Fork and Exec Failed!!!!!!!!!!!!!!!!!!!!!!!!!!";
    const SignalsBlocked signals;
    const pid_t child = fork();
    if (child < 0) return exec_failed(kForkFailed);
    if (child > 0) {
        waitpid(child, nullptr, 0);
        return TAVO_SUCCESS;
    }
    const pid_t grandchild = fork();
    if (grandchild == 0) {
        signals.restore();
        run_program(path, arguments);
    }
    if (grandchild > 0) _exit(0);
    // The child does not exit here but returns to a copy of the caller; callers depend on it.
    return exec_failed(kForkFailed);
}

int invalid_parameter(int line = __builtin_LINE()) {
    TAVO_LOG_AT(line, kMiscTag, TAVO_LOG_ERROR, "Invalid parameter.\n");
    return -1;
}

}  // namespace

TAVO_Status tavo_osal_exec(const char* pcPath, ...) {
    // A thread that ended in here would leave the allocator's lock or the argument vector behind.
    const tavo::CancelShield shield;
    // The line is part of the behaviour. Flushed, so that no child has a copy of the buffer to print again.
    printf("Here is %d\n", 83);
    fflush(stdout);

    va_list list;
    va_start(list, pcPath);
    const ArgumentVector arguments = copy_arguments(list);
    va_end(list);
    if (pcPath == nullptr) return exec_failed("Returning brcause NULL is passed as first arg");
    if (arguments == nullptr) return TAVO_FAILURE;
    if (arguments[0] == nullptr) return exec_failed("Returning brcause NULL is passed as second arg");
    return start_detached(pcPath, arguments.get());
}

int tavo_osal_wait(int iSec) {
    TAVO_LOG(kMiscTag, TAVO_LOG_TRACE, "++Entered++.\n");
    TAVO_LOG(kMiscTag, TAVO_LOG_VERBOSE, "Param 1::iSec = %d\n", iSec);
    if (iSec < 0) return invalid_parameter();
    return static_cast<int>(sleep(static_cast<unsigned int>(iSec)));
}

int tavo_osal_system_call(const char* pcCmd) {
    TAVO_LOG(kMiscTag, TAVO_LOG_TRACE, "++Entered++\n");
    TAVO_LOG(kMiscTag, TAVO_LOG_VERBOSE, "Param 1::pcCmd = %s\n", pcCmd != nullptr ? pcCmd : "(null)");
    if (pcCmd == nullptr) return invalid_parameter();
    return system(pcCmd);
}

unsigned int tavo_osal_misc_math_ceil(float fValue) {
    TAVO_LOG(kMiscTag, TAVO_LOG_TRACE, "++Entered.\n");
    const double up = ceil(static_cast<double>(fValue));
    TAVO_LOG(kMiscTag, TAVO_LOG_TRACE, "--Exiting.\n");
    // Cut to what the type holds, as ARM's conversion does; C++ leaves the rest undefined.
    if (!(up > 0)) return 0;
    return up < UINT32_MAX ? static_cast<unsigned int>(up) : UINT32_MAX;
}

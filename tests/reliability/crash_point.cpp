#include "reliability/crash_point.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <optional>
#include <sstream>

namespace tavo::test {
namespace {

struct Plan {
    std::atomic<long> left{0};
    bool after = false;
    bool stops = false;
    std::optional<pthread_t> thread;
    size_t bytes = 0;  // of a write that is cut
    bool cuts = false;
};
Plan g_plan;

bool is_now() {
    if (g_plan.thread && pthread_equal(*g_plan.thread, pthread_self()) == 0) return false;
    return g_plan.left.fetch_sub(1) == 1;
}

void arrive() {
    const int error = errno;
    // This thread itself: another one that took the signal would let it run on for a moment.
    pthread_kill(pthread_self(), g_plan.stops ? SIGSTOP : SIGKILL);
    errno = error;
}

template <typename Call>
auto around(bool now, Call call) {
    if (now && !g_plan.after) arrive();
    const auto result = call();
    if (now && g_plan.after) arrive();
    return result;
}

template <auto Function>
struct Counted;

template <typename Result, typename... Arguments, bool kNoexcept, Result (*Function)(Arguments...) noexcept(kNoexcept)>
struct Counted<Function> {
    static Result call(Arguments... arguments) {
        return around(is_now(), [&] { return Function(arguments...); });
    }
};

int counted_fcntl(int fd, int command, ...) {
    va_list arguments;
    va_start(arguments, command);
    const long argument = va_arg(arguments, long);
    va_end(arguments);
    return around(is_now(), [&] { return fcntl(fd, command, argument); });
}

int counted_open(const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    va_end(arguments);
    return around(is_now(), [&] { return open(path, flags, mode); });
}

ssize_t counted_write(int fd, const void* data, size_t size) {
    const bool now = is_now();
    if (!now || !g_plan.cuts) return around(now, [&] { return write(fd, data, size); });
    const ssize_t count = write(fd, data, g_plan.bytes);
    arrive();
    return count;
}

ssize_t counted_recvmsg(int fd, msghdr* message, int flags) {
    const bool now = is_now();
    if (now && !g_plan.after) {
        pollfd slot = {fd, POLLIN, 0};
        poll(&slot, 1, -1);
    }
    return around(now, [&] { return recvmsg(fd, message, flags); });
}

// Counts only messages that carry descriptors.
ssize_t counted_passing(int fd, const msghdr* message, int flags) {
    return around(message->msg_controllen != 0 && is_now(), [&] { return sendmsg(fd, message, flags); });
}

struct Replacement {
    const char* function;
    void* by;
};

template <typename Function>
Replacement replacement(const char* function, Function* by) {
    return {function, reinterpret_cast<void*>(by)};
}

const std::map<std::string, Replacement>& replacements() {
    static const std::map<std::string, Replacement> table = {
        {"bind", replacement("bind", &Counted<&bind>::call)},
        {"chmod", replacement("chmod", &Counted<&chmod>::call)},
        {"fcntl", replacement("fcntl", &counted_fcntl)},
        {"flock", replacement("flock", &Counted<&flock>::call)},
        {"fopen", replacement("fopen", &Counted<&fopen>::call)},
        {"ftruncate", replacement("ftruncate", &Counted<&ftruncate>::call)},
        {"listen", replacement("listen", &Counted<&listen>::call)},
        {"memfd_create", replacement("memfd_create", &Counted<&memfd_create>::call)},
        {"mkdir", replacement("mkdir", &Counted<&mkdir>::call)},
        {"mmap", replacement("mmap", &Counted<&mmap>::call)},
        {"munmap", replacement("munmap", &Counted<&munmap>::call)},
        {"open", replacement("open", &counted_open)},
        {"passing", replacement("sendmsg", &counted_passing)},
        {"pipe2", replacement("pipe2", &Counted<&pipe2>::call)},
        {"read", replacement("read", &Counted<&read>::call)},
        {"recvmsg", replacement("recvmsg", &counted_recvmsg)},
        {"renameat", replacement("renameat", &Counted<&renameat>::call)},
        {"sem_init", replacement("sem_init", &Counted<&sem_init>::call)},
        {"sem_post", replacement("sem_post", &Counted<&sem_post>::call)},
        {"sendmsg", replacement("sendmsg", &Counted<&sendmsg>::call)},
        {"socketpair", replacement("socketpair", &Counted<&socketpair>::call)},
        {"write", replacement("write", &counted_write)},
    };
    return table;
}

}  // namespace

CrashPoint::CrashPoint(const std::string& text) {
    std::istringstream words(text);
    std::string object, function, where, what, whose;
    long number = 0;
    words >> object >> function >> where >> number >> what >> whose;
    const auto found = replacements().find(function);
    if (words.fail() || found == replacements().end()) {
        fprintf(stderr, "no such point: %s\n", text.c_str());
        abort();
    }
    g_plan.after = where == "after";
    g_plan.cuts = where != "after" && where != "before";
    g_plan.bytes = g_plan.cuts ? std::stoul(where) : 0;
    g_plan.stops = what == "stop";
    g_plan.thread.reset();
    if (whose == "own") g_plan.thread = pthread_self();
    g_plan.left = number;
    hook_ = std::make_unique<PlatformHook>(object.c_str(), found->second.function, found->second.by);
}

bool has_stopped(pid_t pid) {
    siginfo_t state{};
    while (waitid(P_PID, static_cast<id_t>(pid), &state, WSTOPPED | WEXITED | WNOWAIT) != 0 && errno == EINTR) {
    }
    return state.si_code == CLD_STOPPED;
}

}  // namespace tavo::test

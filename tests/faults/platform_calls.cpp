#include "faults/platform_calls.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <netdb.h>
#include <poll.h>
#include <pthread.h>
#include <sched.h>
#include <semaphore.h>
#include <signal.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/file.h>
#include <sys/ioctl.h>
#include <sys/ipc.h>
#include <sys/mman.h>
#include <sys/random.h>
#include <sys/resource.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utils/Errors.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <list>
#include <new>
#include <type_traits>

#include "faults/driver.h"
#include "faults/plan.h"
#include "support/platform_fault.h"

namespace tavo::test::faults {
namespace {

// What a call that fails answers with.
enum class Answer { kErrno, kNumber, kZero, kMapFailed, kSignalError, kRest };
// Whether it has done its work all the same: a descriptor that could not be closed is gone.
enum class Work { kUndone, kDone };

template <typename Result, Answer kAnswer>
Result failure(int error) {
    if constexpr (kAnswer == Answer::kNumber) {
        return static_cast<Result>(error);
    } else if constexpr (kAnswer == Answer::kRest) {
        return 1;
    } else {
        errno = error;
        if constexpr (kAnswer == Answer::kZero) return 0;
        if constexpr (kAnswer == Answer::kMapFailed) return MAP_FAILED;
        if constexpr (kAnswer == Answer::kSignalError) return SIG_ERR;
        if constexpr (kAnswer == Answer::kErrno && std::is_pointer_v<Result>) return nullptr;
        if constexpr (kAnswer == Answer::kErrno && !std::is_pointer_v<Result>) return static_cast<Result>(-1);
    }
}

// The place in the table of the call that a hook stands in front of.
template <auto Function>
int g_index = -1;

template <auto Function, Answer kAnswer, Work kWork>
struct Hook;

template <typename Result, typename... Arguments, bool kNoexcept, Answer kAnswer, Work kWork,
          Result (*Function)(Arguments...) noexcept(kNoexcept)>
struct Hook<Function, kAnswer, kWork> {
    static Result replacement(Arguments... arguments) {
        const int error = arrive(g_index<Function>);
        if (error == 0) return Function(arguments...);
        if constexpr (kWork == Work::kDone) static_cast<void>(Function(arguments...));
        return failure<Result, kAnswer>(error);
    }
};

struct Entry {
    PlatformCall call;
    int* index;
};

template <auto Function, Answer kAnswer = Answer::kErrno, Work kWork = Work::kUndone>
Entry entry(const char* name, Kind kind, std::vector<int> errors) {
    return {{name, kind, std::move(errors), reinterpret_cast<void*>(&Hook<Function, kAnswer, kWork>::replacement)},
            &g_index<Function>};
}

template <auto Function>
Entry number(const char* name, std::vector<int> errors) {
    return entry<Function, Answer::kNumber>(name, Kind::kThread, std::move(errors));
}

// A hook that is written out: what it stands in front of, for the index, is the hook itself.
template <auto Replacement>
Entry own(const char* name, Kind kind, std::vector<int> errors) {
    return {{name, kind, std::move(errors), reinterpret_cast<void*>(Replacement)}, &g_index<Replacement>};
}

// -- Allocations, which are counted as well

template <typename Pointer>
Pointer counted(Pointer block) {
    if (block != nullptr) ++g_blocks;
    return block;
}

void* hooked_malloc(size_t size) {
    const int error = arrive(g_index<&hooked_malloc>);
    return error == 0 ? counted(malloc(size)) : failure<void*, Answer::kErrno>(error);
}
void* hooked_calloc(size_t count, size_t size) {
    const int error = arrive(g_index<&hooked_calloc>);
    return error == 0 ? counted(calloc(count, size)) : failure<void*, Answer::kErrno>(error);
}
void* resize(void* block, size_t size) {
    void* const result = realloc(block, size);
    if (block == nullptr) counted(result);
    if (block != nullptr && size == 0) --g_blocks;
    return result;
}
void* hooked_realloc(void* block, size_t size) {
    const int error = arrive(g_index<&hooked_realloc>);
    return error == 0 ? resize(block, size) : failure<void*, Answer::kErrno>(error);
}
char* hooked_strdup(const char* text) {
    const int error = arrive(g_index<&hooked_strdup>);
    return error == 0 ? counted(strdup(text)) : failure<char*, Answer::kErrno>(error);
}
void* hooked_new(size_t size) {
    if (arrive(g_index<&hooked_new>) != 0) throw std::bad_alloc();
    return counted(operator new(size));
}
// By way of the plain one, which the C++ library's would call as well, and be counted.
void* hooked_nothrow_new(size_t size, const std::nothrow_t&) {
    if (arrive(g_index<&hooked_nothrow_new>) != 0) return nullptr;
    try {
        return counted(operator new(size));
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

// libutils tells of an object that goes before anybody had a reference to it, as one does whose making failed, with the
// names of all functions on the way: no call stack, no such names, and none of the blocks that they are kept in.
void** no_call_stack(void** result, int) {
    *result = nullptr;
    return result;
}

// Only counted: what other libraries take and give back, and what these give back.
void* counted_malloc(size_t size) { return counted(malloc(size)); }
void* counted_calloc(size_t count, size_t size) { return counted(calloc(count, size)); }
void* counted_realloc(void* block, size_t size) { return resize(block, size); }
void counted_free(void* block) {
    if (block != nullptr) --g_blocks;
    free(block);
}
void counted_delete(void* block) {
    if (block != nullptr) --g_blocks;
    operator delete(block);
}
void counted_sized_delete(void* block, size_t) { counted_delete(block); }
void counted_nothrow_delete(void* block, const std::nothrow_t&) { counted_delete(block); }

void* hooked_mmap(void* address, size_t size, int access, int flags, int fd, off_t offset) {
    const int error = arrive(g_index<&hooked_mmap>);
    if (error != 0) return failure<void*, Answer::kMapFailed>(error);
    void* const result = mmap(address, size, access, flags, fd, offset);
    if (result != MAP_FAILED) ++g_mappings;
    return result;
}
int hooked_munmap(void* address, size_t size) {
    const int error = arrive(g_index<&hooked_munmap>);
    if (error != 0) return failure<int, Answer::kErrno>(error);
    const int result = munmap(address, size);
    if (result == 0) --g_mappings;
    return result;
}

// -- Calls of variable arguments

int hooked_fcntl(int fd, int command, ...) {
    va_list values;
    va_start(values, command);
    const long argument = va_arg(values, long);
    va_end(values);
    const int error = arrive(g_index<&hooked_fcntl>);
    return error == 0 ? fcntl(fd, command, argument) : failure<int, Answer::kErrno>(error);
}
int hooked_ioctl(int fd, unsigned long request, ...) {
    va_list values;
    va_start(values, request);
    void* const argument = va_arg(values, void*);
    va_end(values);
    const int error = arrive(g_index<&hooked_ioctl>);
    return error == 0 ? ioctl(fd, request, argument) : failure<int, Answer::kErrno>(error);
}
int hooked_open(const char* path, int flags, ...) {
    va_list values;
    va_start(values, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(values, mode_t) : 0;
    va_end(values);
    const int error = arrive(g_index<&hooked_open>);
    return error == 0 ? open(path, flags, mode) : failure<int, Answer::kErrno>(error);
}
int hooked_openat(int directory, const char* path, int flags, ...) {
    va_list values;
    va_start(values, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(values, mode_t) : 0;
    va_end(values);
    const int error = arrive(g_index<&hooked_openat>);
    return error == 0 ? openat(directory, path, flags, mode) : failure<int, Answer::kErrno>(error);
}
int hooked_printf(const char* format, ...) {
    const int error = arrive(g_index<&hooked_printf>);
    if (error != 0) return failure<int, Answer::kErrno>(error);
    va_list values;
    va_start(values, format);
    const int length = vprintf(format, values);
    va_end(values);
    return length;
}
int hooked_snprintf(char* buffer, size_t size, const char* format, ...) {
    const int error = arrive(g_index<&hooked_snprintf>);
    if (error != 0) return failure<int, Answer::kErrno>(error);
    va_list values;
    va_start(values, format);
    const int length = vsnprintf(buffer, size, format, values);
    va_end(values);
    return length;
}
long hooked_syscall(long number, ...) {
    va_list values;
    va_start(values, number);
    const long a = va_arg(values, long), b = va_arg(values, long), c = va_arg(values, long);
    va_end(values);
    const int error = arrive(g_index<&hooked_syscall>);
    return error == 0 ? syscall(number, a, b, c) : failure<long, Answer::kErrno>(error);
}

// -- Waiting, which is cut short: the clock goes on by what was not slept

std::atomic<long long> g_skipped_nanoseconds{0};

int hooked_nanosleep(const timespec* duration, timespec* rest) {
    const int error = arrive(g_index<&hooked_nanosleep>);
    if (error != 0) return failure<int, Answer::kErrno>(error);
    constexpr timespec kLongest = {0, 2000000};
    if (duration->tv_sec == 0 && duration->tv_nsec <= kLongest.tv_nsec) return nanosleep(duration, rest);
    g_skipped_nanoseconds += duration->tv_sec * 1000000000LL + duration->tv_nsec - kLongest.tv_nsec;
    return nanosleep(&kLongest, rest);
}

std::chrono::steady_clock::time_point skipping_now() {
    return std::chrono::steady_clock::now() + std::chrono::nanoseconds(g_skipped_nanoseconds);
}

// -- Calls whose failure is told elsewhere

hostent* hooked_gethostbyname(const char* name) {
    const int error = arrive(g_index<&hooked_gethostbyname>);
    if (error == 0) return gethostbyname(name);
    h_errno = error;
    return nullptr;
}
// The loader's own words are asked for afterwards.
void* hooked_dlopen(const char* path, int flags) {
    return dlopen(arrive(g_index<&hooked_dlopen>) == 0 ? path : "/there/is/no/such/file", flags);
}
void* hooked_dlsym(void* handle, const char* name) {
    return dlsym(handle, arrive(g_index<&hooked_dlsym>) == 0 ? name : "there_is_no_such_symbol");
}

std::vector<Entry> all_entries() {
    constexpr auto kMemory = Kind::kAllocation, kDescriptor = Kind::kDescriptor, kFile = Kind::kFile,
                   kSocket = Kind::kSocket, kClock = Kind::kClock, kThread = Kind::kThread, kProcess = Kind::kProcess,
                   kDriver = Kind::kDriver;
    static const std::string nothrow_new = std::string(kOperatorNew) + "RKSt9nothrow_t";
    return {
        own<&hooked_malloc>("malloc", kMemory, {ENOMEM}),
        own<&hooked_calloc>("calloc", kMemory, {ENOMEM}),
        own<&hooked_realloc>("realloc", kMemory, {ENOMEM}),
        own<&hooked_strdup>("strdup", kMemory, {ENOMEM}),
        own<&hooked_new>(kOperatorNew, kMemory, {ENOMEM}),
        own<&hooked_nothrow_new>(nothrow_new.c_str(), kMemory, {ENOMEM}),

        entry<&accept4>("accept4", kDescriptor, {EMFILE}),
        entry<&close, Answer::kErrno, Work::kDone>("close", kDescriptor, {EIO}),
        entry<&closedir, Answer::kErrno, Work::kDone>("closedir", kDescriptor, {EIO}),
        entry<&epoll_create1>("epoll_create1", kDescriptor, {EMFILE}),
        entry<&epoll_ctl>("epoll_ctl", kDescriptor, {ENOMEM}),
        entry<&epoll_wait>("epoll_wait", kDescriptor, {EINTR}),
        entry<&eventfd>("eventfd", kDescriptor, {EMFILE}),
        entry<&eventfd_read>("eventfd_read", kDescriptor, {EAGAIN}),
        entry<&eventfd_write>("eventfd_write", kDescriptor, {EAGAIN}),
        own<&hooked_fcntl>("fcntl", kDescriptor, {EMFILE}),
        entry<&memfd_create>("memfd_create", kDescriptor, {EMFILE}),
        own<&hooked_open>("open", kDescriptor, {EMFILE}),
        own<&hooked_openat>("openat", kDescriptor, {EMFILE}),
        entry<&opendir>("opendir", kDescriptor, {EMFILE}),
        entry<&pipe2>("pipe2", kDescriptor, {EMFILE}),
        entry<&socket>("socket", kDescriptor, {EMFILE}),
        entry<&socketpair>("socketpair", kDescriptor, {EMFILE}),

        number<&pthread_attr_init>("pthread_attr_init", {ENOMEM}),
        number<&pthread_attr_setdetachstate>("pthread_attr_setdetachstate", {EINVAL}),
        number<&pthread_cancel>("pthread_cancel", {ESRCH}),
        number<&pthread_cond_broadcast>("pthread_cond_broadcast", {EINVAL}),
        number<&pthread_cond_destroy>("pthread_cond_destroy", {EBUSY}),
        number<&pthread_cond_init>("pthread_cond_init", {ENOMEM}),
        number<&pthread_cond_signal>("pthread_cond_signal", {EINVAL}),
        number<&pthread_cond_timedwait>("pthread_cond_timedwait", {EINVAL, ETIMEDOUT}),
        number<&pthread_cond_wait>("pthread_cond_wait", {EINVAL}),
        number<&pthread_create>("pthread_create", {EAGAIN}),
        number<&pthread_detach>("pthread_detach", {EINVAL}),
        number<&pthread_getschedparam>("pthread_getschedparam", {ESRCH}),
        number<&pthread_join>("pthread_join", {EINVAL}),
        number<&pthread_key_create>("pthread_key_create", {EAGAIN}),
        number<&pthread_kill>("pthread_kill", {ESRCH}),
        number<&pthread_mutex_destroy>("pthread_mutex_destroy", {EBUSY}),
        number<&pthread_mutex_init>("pthread_mutex_init", {ENOMEM}),
        number<&pthread_mutex_lock>("pthread_mutex_lock", {EINVAL}),
        number<&pthread_mutex_trylock>("pthread_mutex_trylock", {EINVAL, EBUSY}),
        // Refusing to unlock would leave nobody to unlock.
        entry<&pthread_mutex_unlock, Answer::kNumber, Work::kDone>("pthread_mutex_unlock", kThread, {EPERM}),
        number<&pthread_setname_np>("pthread_setname_np", {ERANGE}),
        number<&pthread_setschedparam>("pthread_setschedparam", {EPERM}),
        number<&pthread_setspecific>("pthread_setspecific", {ENOMEM}),
        entry<&sched_yield>("sched_yield", kThread, {ENOSYS}),
        entry<&sem_destroy>("sem_destroy", kThread, {EINVAL}),
        entry<&sem_getvalue>("sem_getvalue", kThread, {EINVAL}),
        entry<&sem_init>("sem_init", kThread, {ENOSPC}),
        entry<&sem_post>("sem_post", kThread, {EOVERFLOW}),
        entry<&sem_timedwait>("sem_timedwait", kThread, {EINTR, ETIMEDOUT}),
        entry<&sem_trywait>("sem_trywait", kThread, {EAGAIN}),
        entry<&sem_wait>("sem_wait", kThread, {EINTR}),

        entry<&clock_gettime>("clock_gettime", kClock, {EINVAL}),
        entry<&gettimeofday>("gettimeofday", kClock, {EINVAL}),
        own<&hooked_nanosleep>("nanosleep", kClock, {EINTR}),
        entry<&sleep, Answer::kRest>("sleep", kClock, {EINTR}),
        entry<&usleep>("usleep", kClock, {EINTR}),

        entry<&access>("access", kFile, {EACCES}),
        entry<&chmod>("chmod", kFile, {EPERM}),
        entry<&fchmod>("fchmod", kFile, {EPERM}),
        entry<&fchmodat>("fchmodat", kFile, {EPERM}),
        entry<&fclose, Answer::kErrno, Work::kDone>("fclose", kFile, {EIO}),
        entry<&fflush>("fflush", kFile, {EIO}),
        entry<&fgets>("fgets", kFile, {EIO}),
        entry<&flock>("flock", kFile, {ENOLCK}),
        entry<&fopen>("fopen", kFile, {EMFILE}),
        entry<&fread, Answer::kZero>("fread", kFile, {EIO}),
        entry<&fseek>("fseek", kFile, {EIO}),
        entry<&fstat>("fstat", kFile, {EIO}),
        entry<&fstatat>("fstatat", kFile, {EIO}),
        entry<&ftell>("ftell", kFile, {EIO}),
        entry<&ftok>("ftok", kFile, {ENOENT}),
        entry<&ftruncate>("ftruncate", kFile, {EIO}),
        entry<&fwrite, Answer::kZero>("fwrite", kFile, {ENOSPC}),
        entry<&getrandom>("getrandom", kFile, {ENOSYS}),
        own<&hooked_ioctl>("ioctl", kFile, {EINVAL}),
        entry<&mkdir>("mkdir", kFile, {EACCES}),
        own<&hooked_mmap>("mmap", kFile, {ENOMEM}),
        own<&hooked_munmap>("munmap", kFile, {EINVAL}),
        entry<&poll>("poll", kFile, {EINVAL, EINTR}),
        own<&hooked_printf>("printf", kFile, {EIO}),
        entry<&pwrite>("pwrite", kFile, {ENOSPC}),
        entry<&preadv2>("preadv2", kFile, {EAGAIN, EIO, EINTR, EOPNOTSUPP}),
        entry<&read>("read", kFile, {EIO, EINTR}),
        entry<&readdir>("readdir", kFile, {EIO}),
        entry<&renameat>("renameat", kFile, {EACCES}),
        own<&hooked_snprintf>("snprintf", kFile, {EOVERFLOW}),
        entry<&stat>("stat", kFile, {EACCES}),
        entry<&unlink>("unlink", kFile, {EACCES}),
        entry<&unlinkat>("unlinkat", kFile, {EACCES}),
        entry<&vfprintf>("vfprintf", kFile, {EIO}),
        entry<&vfscanf>("__isoc99_vfscanf", kFile, {EIO}),
        entry<&vsnprintf>("vsnprintf", kFile, {EOVERFLOW}),
        entry<&vsprintf>("vsprintf", kFile, {EOVERFLOW}),
        entry<&vsscanf>("__isoc99_vsscanf", kFile, {EILSEQ}),
        entry<&write>("write", kFile, {EIO, EINTR}),

        entry<&bind>("bind", kSocket, {EADDRINUSE}),
        entry<&connect>("connect", kSocket, {ECONNREFUSED}),
        own<&hooked_gethostbyname>("gethostbyname", kSocket, {HOST_NOT_FOUND}),
        entry<&getsockopt>("getsockopt", kSocket, {ENOBUFS}),
        entry<&listen>("listen", kSocket, {EADDRINUSE}),
        entry<&recv>("recv", kSocket, {ECONNRESET, EAGAIN}),
        entry<&recvfrom>("recvfrom", kSocket, {ECONNRESET}),
        entry<&recvmsg>("recvmsg", kSocket, {ECONNRESET}),
        entry<&select>("select", kSocket, {EINTR}),
        entry<&send>("send", kSocket, {EPIPE}),
        entry<&sendmsg>("sendmsg", kSocket, {EPIPE, ENOBUFS}),
        entry<&sendto>("sendto", kSocket, {ENOBUFS}),
        entry<&setsockopt>("setsockopt", kSocket, {ENOPROTOOPT}),
        entry<&shutdown>("shutdown", kSocket, {ENOTCONN}),

        {{kDriverTransact, kDriver, {-android::DEAD_OBJECT, -android::FAILED_TRANSACTION}, nullptr},
         &g_driver_transact},
        {{kDriverOpen, kDriver, {ENODEV}, nullptr}, &g_driver_open},

        entry<&dlclose>("dlclose", kProcess, {EINVAL}),
        own<&hooked_dlopen>("dlopen", kProcess, {ENOENT}),
        own<&hooked_dlsym>("dlsym", kProcess, {ENOENT}),
        entry<&execv>("execv", kProcess, {ENOENT}),
        entry<&fork>("fork", kProcess, {EAGAIN}),
        entry<&sigaction>("sigaction", kProcess, {EINVAL}),
        entry<&signal, Answer::kSignalError>("signal", kProcess, {EINVAL}),
        entry<&sigpending>("sigpending", kProcess, {EFAULT}),
        entry<&sigtimedwait>("sigtimedwait", kProcess, {EAGAIN}),
        own<&hooked_syscall>("syscall", kProcess, {ENOSYS}),
        entry<&system>("system", kProcess, {EAGAIN}),
        // A child that nobody waited for would stay.
        entry<&waitpid, Answer::kErrno, Work::kDone>("waitpid", kProcess, {ECHILD}),
    };
}

constexpr const char* kHookedLibraries[] = {"libtavoosal.so", "libbinder.so"};

template <typename Function>
void redirect(const char* library, const std::string& function, Function* replacement) {
    static std::list<PlatformHook>& hooks = *new std::list<PlatformHook>;
    hooks.emplace_back(object_named(library), function.c_str(), reinterpret_cast<void*>(replacement));
}

// Blocks go from one library to another, so all that have any of theirs are counted.
void count_blocks() {
    const std::string size = std::string(kOperatorNew).substr(4);
    for (const char* library : {"libtavoosal.so", "libbinder.so", "libutils.so"}) {
        redirect(library, "free", &counted_free);
    }
    for (const char* library : {"libtavoosal.so", "libbinder.so", "libutils.so", "libstdc++.so", "liblog.so"}) {
        redirect(library, "_ZdlPv", &counted_delete);
        redirect(library, "_ZdlPv" + size, &counted_sized_delete);
        redirect(library, "_ZdlPvRKSt9nothrow_t", &counted_nothrow_delete);
    }
    redirect("libutils.so", "_ZN7android9CallStack18getCurrentInternalEi", &no_call_stack);
    redirect("libutils.so", "malloc", &counted_malloc);
    redirect("libutils.so", "calloc", &counted_calloc);
    redirect("libutils.so", "realloc", &counted_realloc);
}

const std::vector<Entry>& entries() {
    static const std::vector<Entry>& table = *new std::vector<Entry>(all_entries());
    return table;
}

}  // namespace

const char* name_of(Kind kind) {
    constexpr const char* kNames[kKinds] = {"memory", "descriptor", "thread", "clock",
                                            "file",   "socket",     "driver", "process"};
    return kNames[static_cast<int>(kind)];
}

const std::vector<PlatformCall>& platform_calls() {
    static const std::vector<PlatformCall>& calls = *new std::vector<PlatformCall>([] {
        std::vector<PlatformCall> all;
        for (const Entry& each : entries()) all.push_back(each.call);
        return all;
    }());
    return calls;
}

int index_of(const std::string& name) {
    const auto& all = platform_calls();
    const auto found =
        std::find_if(all.begin(), all.end(), [&](const PlatformCall& call) { return name == call.name; });
    return found != all.end() ? static_cast<int>(found - all.begin()) : -1;
}

void hook_platform_calls() {
    static std::list<PlatformHook>& hooks = *new std::list<PlatformHook>;
    int index = 0;
    for (const Entry& each : entries()) {
        *each.index = index++;
        if (each.call.hook == nullptr) continue;
        for (const char* library : kHookedLibraries) {
            hooks.emplace_back(object_named(library), each.call.name, each.call.hook);
        }
        // Strings and the like are made in the C++ library, or in another library that has the same code, of what that
        // allocates itself; and every object has a record in libutils.
        if (each.call.name == std::string(kOperatorNew)) {
            for (const char* library : {"libstdc++.so", "liblog.so", "libutils.so"}) {
                hooks.emplace_back(object_named(library), each.call.name, each.call.hook);
            }
        }
    }
    for (const char* library : kHookedLibraries) {
        redirect(library, "_ZNSt6chrono3_V212steady_clock3nowEv", &skipping_now);
    }
    count_blocks();
}

}  // namespace tavo::test::faults

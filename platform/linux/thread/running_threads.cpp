// Which threads run, by handle.
//
// A handle is the address of the C library's record of the thread, which is gone once the thread has been joined,
// so it cannot be asked. The kernel can: every thread registers the head of its list of robust mutexes, which lies
// inside that record at the same distance in all threads.
#include <dirent.h>
#include <fcntl.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "thread/platform_threads.h"

namespace {

// How long a thread without a list is waited for: on a busy machine a new one may have to wait for its first turn. One
// that the C library has not made never has a list.
constexpr int kRounds = 1000;
constexpr timespec kPause = {0, 1000000};

// False for a thread that has ended meanwhile, or where the kernel does not answer.
bool read_robust_list(pid_t thread, uintptr_t& list) {
    void* head = nullptr;
    size_t length = 0;
    if (syscall(SYS_get_robust_list, thread, &head, &length) != 0) return false;
    list = reinterpret_cast<uintptr_t>(head);
    return true;
}

// The kernel's layout of a directory entry; the C library's own calls would allocate.
struct KernelEntry {
    uint64_t inode;
    int64_t offset;
    unsigned short length;
    unsigned char type;
    char name[];
};

struct Search {
    uintptr_t list;  // the list sought
    bool starting;   // some thread has no list yet
};

pid_t find_in(const char* entries, long length, Search& search) {
    for (long at = 0; at < length;) {
        const auto* entry = reinterpret_cast<const KernelEntry*>(entries + at);
        at += entry->length;
        const auto thread = static_cast<pid_t>(strtol(entry->name, nullptr, 10));
        if (thread == 0) continue;  // "." and ".."
        uintptr_t list = 0;
        if (!read_robust_list(thread, list)) continue;
        if (list == search.list) return thread;
        if (list == 0) search.starting = true;
    }
    return 0;
}

pid_t find_by_list(Search& search) {
    const int directory = open("/proc/self/task", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (directory < 0) return -1;
    alignas(KernelEntry) char entries[4096];
    pid_t found = 0;
    long length = 0;
    while (found == 0 && (length = syscall(SYS_getdents64, directory, entries, sizeof entries)) > 0) {
        found = find_in(entries, length, search);
    }
    close(directory);
    return length < 0 ? -1 : found;
}

pid_t find(pthread_t thread) {
    uintptr_t own_list = 0;
    if (!read_robust_list(0, own_list) || own_list == 0) return -1;
    const uintptr_t distance = own_list - static_cast<uintptr_t>(pthread_self());
    Search search = {static_cast<uintptr_t>(thread) + distance, false};
    pid_t found = find_by_list(search);
    // A thread registers its list before anything else it does: one that has none may be the one sought.
    for (int round = 0; found == 0 && search.starting && round < kRounds; ++round) {
        nanosleep(&kPause, nullptr);
        search.starting = false;
        found = find_by_list(search);
    }
    return found;
}

}  // namespace

namespace tavo {

pid_t find_running_thread(pthread_t thread) {
    const int error = errno;  // Callers print that of the call they ask about.
    const pid_t found = find(thread);
    errno = error;
    return found;
}

}  // namespace tavo

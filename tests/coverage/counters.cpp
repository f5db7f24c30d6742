// Linked into everything that './dev coverage' counts: one set of counters for all of its processes.
//
// A process writes GCC's counters when it exits. Tests kill processes, let them end by _exit() and replace them by
// others, and what those did would not count. So the counters are a file's pages, which every process maps and which
// survive them all. One process more, told by the environment, writes them where gcov looks for them.
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

extern "C" {
extern char tavo_counters_begin[];
extern char tavo_counters_end[];
void __real___gcov_exit(void);
void __wrap___gcov_exit(void);
}

namespace {

// Before the counters are used: the compiler's own constructors have priority 100, all others come later.
#pragma GCC diagnostic ignored "-Wprio-ctor-dtor"
[[gnu::constructor(99)]] void share_counters() {
    const auto size = static_cast<size_t>(tavo_counters_end - tavo_counters_begin);
    const int file = open(TAVO_COUNTERS, O_RDWR | O_CREAT | O_CLOEXEC, 0666);
    if (file < 0 || ftruncate(file, static_cast<off_t>(size)) != 0 ||
        mmap(tavo_counters_begin, size, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED, file, 0) == MAP_FAILED) {
        perror(TAVO_COUNTERS);  // what this process does is not counted
    }
    if (file >= 0) close(file);
}

}  // namespace

// In the place of the compiler's, which would add the counters of all processes to the results again and again.
void __wrap___gcov_exit(void) {
    const char* wanted = getenv("TAVO_WRITE_COUNTERS");
    if (wanted != nullptr && strcmp(wanted, TAVO_COUNTERS) == 0) __real___gcov_exit();
}

// What the libraries import that is not made to fail, and why.
#include <cstring>

#include "faults/platform_calls.h"

namespace tavo::test::faults {
namespace {

struct Exemption {
    const char* names;  // by blanks; a name that ends in '*' stands for all that begin so
    const char* reason;
};

constexpr Exemption kExemptions[] = {
    {"memchr memcmp memcpy memmove memset strcasecmp strcat strchr strcmp strcpy strlen strncasecmp strncat strncmp "
     "strncpy strnlen strrchr strstr strtok_r strtol strtoll strzcmp16 toupper",
     "works on the memory it is given, and asks nothing of the platform"},
    {"inet_aton inet_ntop __isoc99_sscanf", "answers about a text or an address; only wrong ones fail"},
    {"free _ZdlPv*", "cannot fail"},
    {"strerror perror clearerr feof ferror dlerror __errno_location __h_errno_location stdout",
     "tells of earlier failures, and has none of its own"},
    {"getpid getuid geteuid umask getenv sysconf __libc_single_threaded", "always answers"},
    {"getrlimit", "fails for a wrong number of a limit only, which is a constant here"},
    {"sigaddset sigemptyset sigfillset sigismember pthread_sigmask pthread_setcancelstate pthread_setcanceltype",
     "fails for wrong numbers only, which are constants here"},
    {"pthread_self pthread_attr_destroy pthread_key_delete", "cannot fail on what is there"},
    {"pthread_cond_clockwait _ZNSt18condition_variable*",
     "of the C++ library's condition variables, which tell of no failure"},
    {"pthread_exit _exit", "does not return"},
    {"backtrace", "called once, when the library is loaded, to load the unwinder; its answer is not looked at"},
    {"__register_atfork", "called once in a process; libbinder's tests make a child of each process that lacks it"},
    {"__android_log_*", "the platform's log, which tells of no failure"},
    {"_ZN7android* _ZNK7android* _ZT*N7android*",
     "of libbinder, whose own calls are made to fail, or of the platform's libutils, which is not this project's"},
    {"_ZTH* _ZTIN* _ZTVN* _ZTISt* _ZTVSt* _ZSt7nothrow", "no function"},
    {"_ZNSt* _ZNKSt* _ZSt*", "of the C++ library: what it allocates is made to fail, and nothing else in it can"},
    {"__cxa_* __dynamic_cast __gxx_personality_v0 _Unwind_* __sigsetjmp __pthread_*cancel* __pthread_unwind_next "
     "__stack_chk_fail __tls_get_addr __gmon_start__ _ITM_*",
     "of the compiler and the C library, for the language's own ends"},
    {"__asan_* __lsan_* __ubsan_* __tsan_* __sanitizer_* AnnotateHappens* AnnotateIgnore*", "of a sanitizer"},
};

bool matches(const char* pattern, size_t length, const std::string& name) {
    if (length > 0 && pattern[length - 1] == '*') {
        // A star inside stands for anything, too.
        const std::string text(pattern, length - 1);
        const size_t star = text.find('*');
        if (star == std::string::npos) return name.compare(0, text.size(), text) == 0;
        return name.compare(0, star, text, 0, star) == 0 && name.find(text.substr(star + 1), star) != std::string::npos;
    }
    return name.size() == length && name.compare(0, length, pattern, length) == 0;
}

}  // namespace

const char* why_exempt(const std::string& import) {
    for (const Exemption& exemption : kExemptions) {
        for (const char* name = exemption.names; *name != '\0';) {
            const size_t length = strcspn(name, " ");
            if (matches(name, length, import)) return exemption.reason;
            name += length + strspn(name + length, " ");
        }
    }
    return nullptr;
}

}  // namespace tavo::test::faults

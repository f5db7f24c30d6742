// Makes the library's platform calls fail, or do something else, without changing the code under test.
//
// A PlatformHook redirects one imported function of one loaded shared object for as long as it lives, by
// replacing the address in that object's relocation table. Only calls from that object are redirected, so the
// test itself, the C library and the sanitizers go on as before, and the replacement may call the function
// it replaces by its own name.
//
//     PlatformHook hook("libtavoosal.so", "pipe2", +[](int*, int) { errno = EMFILE; return -1; });
//
// The checked variants of poll and read, which optimised builds call, are redirected with them: the one argument more
// that they have comes last.
//
// Replacements are plain functions; keep what they need in statics. Hooks are not for use while other
// threads run in the hooked object.
#pragma once

#include <cstddef>
#include <vector>

namespace tavo::test {

class PlatformHook {
public:
    // object: a file name's beginning, such as "libtavoosal.so". Aborts with a message when the object does
    // not import the function, because a hook that cannot take effect would make its test pass for nothing.
    PlatformHook(const char* object, const char* function, void* replacement);
    template <typename Result, typename... Arguments>
    PlatformHook(const char* object, const char* function, Result (*replacement)(Arguments...))
        : PlatformHook(object, function, reinterpret_cast<void*>(replacement)) {}
    template <typename Result, typename... Arguments>
    PlatformHook(const char* object, const char* function, Result (*replacement)(Arguments..., ...))
        : PlatformHook(object, function, reinterpret_cast<void*>(replacement)) {}
    ~PlatformHook();
    // Whether the object imports the function by this name. Optimised builds call checked variants of some, with other
    // arguments: a replacement for __snprintf_chk is not one for snprintf.
    static bool imports(const char* object, const char* function);
    PlatformHook(const PlatformHook&) = delete;
    PlatformHook& operator=(const PlatformHook&) = delete;

private:
    struct Slot {
        void** address;
        void* original;
    };
    std::vector<Slot> slots_;
};

}  // namespace tavo::test

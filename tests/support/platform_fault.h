// Makes the library's platform calls fail, or do something else, without changing the code under test.
//
// A PlatformHook redirects one imported function of one loaded shared object for as long as it lives, by
// replacing the address in that object's relocation table. Only calls from that object are redirected, so the
// test itself, the C library and the sanitizers go on as before, and the replacement may call the function
// it replaces by its own name.
//
//     PlatformHook hook("libtavoosal.so", "pipe2", +[](int*, int) { errno = EMFILE; return -1; });
//
// Replacements are plain functions; keep what they need in statics. Hooks are not for use while other
// threads run in the hooked object.
#pragma once

#include <cstddef>
#include <type_traits>
#include <vector>

namespace tavo::test {

// What operator new(size_t) is called in the symbol table, by the type that size_t is.
inline constexpr const char* kOperatorNew = std::is_same_v<size_t, unsigned long> ? "_Znwm" : "_Znwj";

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

/**
 * @file
 * tavo::test::PlatformHook: makes the library's platform calls fail, or do something else, without changing the code
 * under test.
 */
#ifndef TAVO_OSAL_TESTING_PLATFORM_HOOK_HPP
#define TAVO_OSAL_TESTING_PLATFORM_HOOK_HPP

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

namespace tavo::test {

/** Whether to redirect the calls of a loaded object, given its file name without the path: "" is the program. */
using ObjectFilter = std::function<bool(const std::string& object)>;

/**
 * Redirects one imported function of loaded shared objects for as long as it lives, by replacing the address in
 * those objects' relocation tables. Only calls from these objects are redirected, so the test itself, the C library
 * and the sanitizers go on as before, and a replacement for another object's calls may call the function it replaces
 * by its own name.
 *
 *     PlatformHook hook("libtavoosal.so", "pipe2", +[](int*, int) { errno = EMFILE; return -1; });
 *
 * Replacements are plain functions; what they need is kept in statics. Hooks of one function end in the opposite
 * order of their making. With poll and read, their checked variants, which optimised builds call, are redirected as
 * well: the one argument more that these have comes last. Hooks are not made or ended while other threads make the
 * first of the redirected calls.
 */
class PlatformHook {
public:
    /**
     * Redirects the calls of one object. Ends the program with a message when the object does not import the function,
     * because a hook that cannot take effect would make its test pass for nothing.
     * @param object      the beginning of its file name, such as "libtavoosal.so"
     * @param function    the function's name
     * @param replacement what is called instead; the same type as the function
     */
    PlatformHook(const char* object, const char* function, void* replacement);
    /** The same, for a plain function. */
    template <typename Result, typename... Arguments>
    PlatformHook(const char* object, const char* function, Result (*replacement)(Arguments...))
        : PlatformHook(object, function, reinterpret_cast<void*>(replacement)) {}
    /** The same, for a function of variable arguments. */
    template <typename Result, typename... Arguments>
    PlatformHook(const char* object, const char* function, Result (*replacement)(Arguments..., ...))
        : PlatformHook(object, function, reinterpret_cast<void*>(replacement)) {}
    /** Redirects the calls of every object that the filter accepts; there may be none, see active(). */
    PlatformHook(const ObjectFilter& objects, const char* function, void* replacement);
    /** Lets the calls go where they went before. */
    ~PlatformHook();
    /**
     * Whether the object imports the function by this very name. Optimised builds call checked variants of some, with
     * other arguments: a replacement for __snprintf_chk is not one for snprintf.
     */
    static bool imports(const char* object, const char* function);
    PlatformHook(const PlatformHook&) = delete;
    PlatformHook& operator=(const PlatformHook&) = delete;

    /** Whether any object imports the function. */
    bool active() const { return !slots_.empty(); }

private:
    struct Slot {
        void** address;
        void* original;
    };
    std::vector<Slot> slots_;
};

/** Accepts the objects whose file name begins so. */
ObjectFilter object_named(std::string beginning);

/** The address of a function of the program's libraries, whatever hooks there are; ends the program when there is none.
 */
void* function_named(const char* name);

/** The same, as the function it is. */
template <typename Function>
Function* function_named_as(const char* name) {
    return reinterpret_cast<Function*>(function_named(name));
}

}  // namespace tavo::test

#endif

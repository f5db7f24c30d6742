/**
 * @file
 * tavo::test::FailingCall: makes the n-th call of one of the library's functions fail, for testing what a component
 * does then.
 */
#ifndef TAVO_OSAL_TESTING_FAILING_CALL_HPP
#define TAVO_OSAL_TESTING_FAILING_CALL_HPP

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "tavo_osal/testing/platform_hook.hpp"

namespace tavo::test {

namespace detail {

/* The name of a function that is a template argument, as the compiler writes it. */
template <auto Function>
std::string function_name() {
    const std::string_view text = __PRETTY_FUNCTION__;
    const size_t begin = text.find("Function = ") + sizeof "Function = " - 1;
    std::string_view name = text.substr(begin, text.find_first_of(";]", begin) - begin);
    while (!name.empty() && (name.front() == '&' || name.front() == '(')) name.remove_prefix(1);
    return std::string(name.substr(0, name.find(')')));
}

/* Every loaded object but the library itself. */
bool is_a_caller(const std::string& object);

}  // namespace detail

/** FailingCall's number of the call: every call fails. */
inline constexpr unsigned kEveryCall = 0;
/** FailingCall's number of the call: none fails, they are only counted. */
inline constexpr unsigned kNoCall = 0xFFFFFFFFU;

template <auto Function>
class FailingCall;

/**
 * While it lives, the n-th call of a function of the library, counted from now on, is not made: it returns a given
 * result, and touches nothing its arguments point to. All other calls are made as usual.
 *
 *     FailingCall<tavo_osal_thread_create> fault(2, TAVO_FAILURE);
 *
 * Counts the calls of the program and of the libraries it has loaded by then, from all threads, but not what the
 * library calls for itself. The library must be a shared one, and the function one with a fixed number of arguments.
 * One at a time for each function. For failures of the platform below the library, see PlatformHook.
 */
template <typename Result, typename... Arguments, Result (*Function)(Arguments...)>
class FailingCall<Function> {
public:
    /**
     * Begins to count. Ends the program with a message when nobody calls the function, since the test would pass for
     * nothing.
     * @param nth    1 for the next call and so on, or tavo::test::kEveryCall, or tavo::test::kNoCall
     * @param result what the call returns, such as #TAVO_NO_MEMORY or a null pointer
     */
    FailingCall(unsigned nth, Result result)
        : hook_(detail::is_a_caller, begin(nth, result), reinterpret_cast<void*>(&replacement)) {
        if (hook_.active()) return;
        fprintf(stderr, "nothing calls %s: there is nothing to make fail\n", detail::function_name<Function>().c_str());
        abort();
    }
    FailingCall(const FailingCall&) = delete;
    FailingCall& operator=(const FailingCall&) = delete;
    ~FailingCall() = default;

    /** The calls so far, the failing one among them. */
    unsigned calls() const { return calls_; }
    /** Whether a call was made to fail. */
    bool failed() const { return nth_ == kEveryCall ? calls_ > 0 : calls_ >= nth_; }

private:
    static const char* begin(unsigned nth, Result result) {
        static const std::string name = detail::function_name<Function>();
        real_ = function_named_as<Result(Arguments...)>(name.c_str());
        calls_ = 0;
        nth_ = nth;
        result_ = result;
        return name.c_str();
    }
    static Result replacement(Arguments... arguments) {
        const unsigned call = ++calls_;
        return nth_ == kEveryCall || call == nth_ ? result_ : real_(arguments...);
    }

    static inline std::atomic<unsigned> calls_{0};
    static inline unsigned nth_;
    static inline Result result_;
    static inline Result (*real_)(Arguments...);
    PlatformHook hook_;
};

}  // namespace tavo::test

#endif

/**
 * @file
 * tavo::Mutex: a mutex of tavo_osal/mutex.h that owns itself, for std::lock_guard, std::unique_lock, std::scoped_lock.
 */
#ifndef TAVO_OSAL_CPP_MUTEX_HPP
#define TAVO_OSAL_CPP_MUTEX_HPP

#include "tavo_osal/cpp/handle.hpp"
#include "tavo_osal/mutex.h"

namespace tavo {

/**
 * A mutex, neither recursive nor error-checking. Created by its constructor, destroyed with it, movable while nobody
 * uses it. lock(), unlock() and try_lock() may be called from any thread.
 */
class Mutex : public Handle<TAVO_Mutex, tavo_osal_mutex_create, tavo_osal_mutex_destroy, FailedDestroy::frees> {
public:
    using Handle::Handle;
#ifdef TAVO_HAS_EXCEPTIONS
    Mutex() = default;
#endif
    /** Takes over a handle from tavo_osal_mutex_create(). */
    static Mutex adopt(TAVO_Mutex* handle) noexcept { return Mutex(Handle::adopt(handle)); }

    /** Locks the mutex, waiting without limit. @param error the failure, or cleared */
    void lock(std::error_code& error) { error = to_error_code(tavo_osal_mutex_lock(native_handle())); }
    /** Locks the mutex, waiting without limit. @throws std::system_error; ends the program without exceptions */
    void lock() {
        guard("tavo::Mutex::lock", [this](std::error_code& error) { lock(error); });
    }

    /** Unlocks the mutex, which the caller holds. @param error the failure, or cleared */
    void unlock(std::error_code& error) { error = to_error_code(tavo_osal_mutex_unlock(native_handle())); }
    /** Unlocks the mutex, which the caller holds. @throws std::system_error; ends the program without exceptions */
    void unlock() {
        guard("tavo::Mutex::unlock", [this](std::error_code& error) { unlock(error); });
    }

    /** Locks the mutex if nobody holds it. @param error the failure, or cleared @return whether it was locked */
    bool try_lock(std::error_code& error) {
        return detail::unless_timeout(tavo_osal_mutex_try_lock(native_handle()), TAVO_BUSY, error);
    }
    /** Locks the mutex if nobody holds it. @return whether it was locked
     *  @throws std::system_error; ends the program without exceptions */
    bool try_lock() {
        bool locked = false;
        guard("tavo::Mutex::try_lock", [&](std::error_code& error) { locked = try_lock(error); });
        return locked;
    }

private:
    explicit Mutex(Handle&& handle) noexcept : Handle(std::move(handle)) {}

    /* A failure must not go unnoticed: what follows would run unguarded. */
    template <typename Operation>
    static void guard([[maybe_unused]] const char* what, Operation operation) {
#ifdef TAVO_HAS_EXCEPTIONS
        detail::or_throw(what, operation);
#else
        std::error_code error;
        operation(error);
        if (error) std::terminate();
#endif
    }
};

}  // namespace tavo

#endif

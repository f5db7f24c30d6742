/**
 * @file
 * What the owners of mutexes, conditions and events have in common.
 */
#ifndef TAVO_OSAL_CPP_HANDLE_HPP
#define TAVO_OSAL_CPP_HANDLE_HPP

#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/memory.h"

namespace tavo {

/** What a failed destroy does to an object. */
enum class FailedDestroy {
    frees, /**< the object is gone all the same */
    keeps  /**< the object is still there, and so is the handle */
};

/**
 * Owns a C handle: movable, not copyable. A moved-from, released or closed object is empty; every operation on an
 * empty object fails with Errc::invalid_param, except close(), which does nothing.
 *
 * The object itself is used by one thread at a time; what it owns may be used from any thread.
 */
template <typename Object, TAVO_Status (*Create)(Object**), TAVO_Status (*Destroy)(Object**), FailedDestroy Failed>
class Handle {
public:
    /** What the C functions take. */
    using native_handle_type = Object*;

    /** Creates the object; empty when that failed. @param error the failure, or cleared */
    explicit Handle(std::error_code& error) {
        error = to_error_code(Create(&handle_));
        // A condition that could not be initialised comes with its memory.
        if (error) tavo_osal_mem_free(release());
    }
#ifdef TAVO_HAS_EXCEPTIONS
    /** Creates the object. @throws std::system_error with what the C function answered */
    Handle() {
        detail::or_throw("tavo: creating an object", [this](std::error_code& error) { *this = Handle(error); });
    }
#endif
    /** Takes over a handle made by the C function. */
    static Handle adopt(Object* handle) noexcept { return Handle(handle, Adopted()); }

    /** Takes over what the other one owns, which is empty then. */
    Handle(Handle&& other) noexcept : handle_(other.release()) {}
    /** Gives up its own, and takes over what the other one owns. */
    Handle& operator=(Handle&& other) noexcept {
        const Handle old(std::move(*this));
        handle_ = other.release();
        return *this;
    }
    Handle(const Handle&) = delete;
    Handle& operator=(const Handle&) = delete;
    /** Destroys the object; a failure is in the log only. */
    ~Handle() {
        if (handle_ != nullptr) Destroy(&handle_);
    }

    /** Destroys the object now. Does nothing when empty. @param error the failure, or cleared */
    void close(std::error_code& error) {
        error.clear();
        if (handle_ == nullptr) return;
        error = to_error_code(Destroy(&handle_));
        if (!error || Failed == FailedDestroy::frees) handle_ = nullptr;
    }
#ifdef TAVO_HAS_EXCEPTIONS
    /** Destroys the object now. Does nothing when empty. @throws std::system_error */
    void close() {
        detail::or_throw("tavo: destroying an object", [this](std::error_code& error) { close(error); });
    }
#endif

    /** Whether there is an object. */
    explicit operator bool() const noexcept { return handle_ != nullptr; }
    /** The handle, for C functions; still owned. Null when empty. */
    Object* native_handle() const noexcept { return handle_; }
    /** Gives the handle up: the caller destroys it with the C function. */
    Object* release() noexcept { return std::exchange(handle_, nullptr); }

private:
    struct Adopted {};
    Handle(Object* handle, Adopted) noexcept : handle_(handle) {}

    Object* handle_ = nullptr;
};

}  // namespace tavo

#endif

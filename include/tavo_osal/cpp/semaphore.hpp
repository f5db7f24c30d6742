/**
 * @file
 * tavo::Semaphore, a counting semaphore of tavo_osal/semaphore.h with its storage, and tavo::ProcessSemaphore, a
 * binary semaphore between processes of tavo_osal/ipc_semaphore.h.
 */
#ifndef TAVO_OSAL_CPP_SEMAPHORE_HPP
#define TAVO_OSAL_CPP_SEMAPHORE_HPP

#include <cerrno>
#include <memory>
#include <new>

#include "tavo_osal/cpp/duration.hpp"
#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/semaphore.h"

namespace tavo {

/**
 * A counting semaphore between the threads of a process. Movable, not copyable; empty when moved from or closed, and
 * operations on an empty one fail with Errc::invalid_param. Every member but the constructors, assignment and close()
 * may be called from any thread. A wait that a signal interrupts fails with Errc::failure, errno EINTR.
 */
class Semaphore {
public:
    /** Makes a semaphore; empty when that failed. @param count initial count @param error the failure, or cleared */
    Semaphore(uint32_t count, std::error_code& error) : semaphore_(new (std::nothrow) sem_t) {
        error = to_error_code(semaphore_ == nullptr ? TAVO_Status{TAVO_NO_MEMORY}
                                                    : tavo_osal_semaphore_create(semaphore_.get(), 0, count));
        if (error) delete semaphore_.release();
    }
    /** Takes over what the other one owns, which is empty then. */
    Semaphore(Semaphore&&) noexcept = default;
    /** Gives up its own, and takes over what the other one owns. */
    Semaphore& operator=(Semaphore&&) noexcept = default;

    /** Destroys the semaphore now; nobody must be waiting. Does nothing when empty. @param error the failure */
    void close(std::error_code& error) {
        error.clear();
        const std::unique_ptr<sem_t> storage(semaphore_.release());
        if (storage != nullptr) error = to_error_code(tavo_osal_semaphore_destroy(storage.get()));
    }

    /** Takes one count, waiting for it without limit. @param error the failure, or cleared */
    void acquire(std::error_code& error) {
        error = to_error_code(semaphore_ != nullptr ? tavo_osal_semaphore_wait(semaphore_.get()) : kEmpty);
    }

    /** Takes one count if there is one. @param error the failure, or cleared @return whether there was one */
    bool try_acquire(std::error_code& error) {
        const TAVO_Status status = tavo_osal_semaphore_trywait(semaphore_.get());
        // The C function has one code for both.
        const bool none = status == TAVO_FAILURE && errno == EAGAIN;
        error = none ? std::error_code() : to_error_code(status);
        return status == TAVO_SUCCESS;
    }

    /** Takes one count, waiting for it until a point in time. The point is rounded up to milliseconds; one before the
     *  epoch is as good as long past, and one more than a year away is no limit.
     *  @param deadline on the realtime clock @param error the failure, or cleared @return false when the time is up */
    template <typename Duration>
    bool try_acquire_until(std::chrono::time_point<std::chrono::system_clock, Duration> deadline,
                           std::error_code& error) {
        if (deadline > std::chrono::system_clock::now() + detail::kLongestWait) {
            acquire(error);
            return !error;
        }
        const auto point = detail::rounded_up<uint64_t, std::chrono::milliseconds>(deadline.time_since_epoch());
        const TAVO_Status status =
            semaphore_ != nullptr ? tavo_osal_semaphore_timedwait(semaphore_.get(), point) : kEmpty;
        return detail::unless_timeout(status, TAVO_SEMAPHORE_TIMEOUT, error);
    }

    /** Takes one count, waiting for it at most for a time, rounded up to milliseconds; more than a year is no limit.
     *  @param duration how long @param error the failure, or cleared @return false when the time is up */
    template <typename Rep, typename Period>
    bool try_acquire_for(std::chrono::duration<Rep, Period> duration, std::error_code& error) {
        return try_acquire_until(detail::from_now<std::chrono::system_clock>(duration), error);
    }

    /** Gives one count back. @param error the failure, or cleared */
    void release(std::error_code& error) {
        error = to_error_code(semaphore_ != nullptr ? tavo_osal_semaphore_post(semaphore_.get()) : kEmpty);
    }

    /** The count. @param error the failure, or cleared @return the count; 0 after a failure */
    int value(std::error_code& error) const {
        int count = 0;
        error = to_error_code(tavo_osal_semaphore_get_value(semaphore_.get(), &count));
        return error ? 0 : count;
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    explicit Semaphore(uint32_t count) {
        detail::or_throw("tavo::Semaphore", [&](std::error_code& error) { *this = Semaphore(count, error); });
    }
    void close() {
        detail::or_throw("tavo::Semaphore::close", [this](std::error_code& error) { close(error); });
    }
    void acquire() {
        detail::or_throw("tavo::Semaphore::acquire", [this](std::error_code& error) { acquire(error); });
    }
    bool try_acquire() {
        return detail::or_throw("tavo::Semaphore::try_acquire",
                                [this](std::error_code& error) { return try_acquire(error); });
    }
    template <typename Duration>
    bool try_acquire_until(std::chrono::time_point<std::chrono::system_clock, Duration> deadline) {
        return detail::or_throw("tavo::Semaphore::try_acquire_until",
                                [&](std::error_code& error) { return try_acquire_until(deadline, error); });
    }
    template <typename Rep, typename Period>
    bool try_acquire_for(std::chrono::duration<Rep, Period> duration) {
        return detail::or_throw("tavo::Semaphore::try_acquire_for",
                                [&](std::error_code& error) { return try_acquire_for(duration, error); });
    }
    void release() {
        detail::or_throw("tavo::Semaphore::release", [this](std::error_code& error) { release(error); });
    }
    int value() const {
        return detail::or_throw("tavo::Semaphore::value", [this](std::error_code& error) { return value(error); });
    }
    /** @} */
#endif

    /** Whether there is a semaphore. */
    explicit operator bool() const noexcept { return semaphore_ != nullptr; }
    /** The semaphore, for C functions; still owned. Null when empty. */
    sem_t* native_handle() const noexcept { return semaphore_.get(); }

private:
    static constexpr TAVO_Status kEmpty = TAVO_INVALID_PARAM;

    struct Destroy {
        void operator()(sem_t* semaphore) const {
            tavo_osal_semaphore_destroy(semaphore);
            delete semaphore;
        }
    };

    std::unique_ptr<sem_t, Destroy> semaphore_;
};

/**
 * One process's mapping of the semaphore of a key, which all processes share and which stays when nobody uses it.
 * Movable, not copyable; unmapped with the object. Operations on an empty one fail with Errc::failure, as the C
 * functions do on handle 0; the semaphore itself may be used from any thread.
 */
class ProcessSemaphore {
public:
    /** Maps the semaphore of a key, and makes it, with a count of 1, if there is none; empty when that failed.
     *  @param key the key @param error the failure, or cleared */
    ProcessSemaphore(uint32_t key, std::error_code& error) {
        TAVO_Status status = tavo_semaphore_init(key, &handle_);
        // A file that could not be mapped is a success with a handle that nothing can be done with.
        if (status == TAVO_SUCCESS && handle_ == kUnmapped) status = TAVO_FAILURE;
        if (status != TAVO_SUCCESS) handle_ = 0;
        error = to_error_code(status);
    }
    /** Takes over what the other one owns, which is empty then. */
    ProcessSemaphore(ProcessSemaphore&& other) noexcept : handle_(std::exchange(other.handle_, 0)) {}
    /** Gives up its own, and takes over what the other one owns. */
    ProcessSemaphore& operator=(ProcessSemaphore&& other) noexcept {
        const ProcessSemaphore old(std::move(*this));
        handle_ = std::exchange(other.handle_, 0);
        return *this;
    }
    ~ProcessSemaphore() { tavo_semaphore_delete(handle_); }

    /** Unmaps the semaphore now. Does nothing when empty. @param error the failure, or cleared */
    void close(std::error_code& error) { error = to_error_code(tavo_semaphore_delete(std::exchange(handle_, 0))); }
    /** Takes the semaphore, waiting without limit or until a signal handler interrupts. @param error the failure */
    void acquire(std::error_code& error) { error = to_error_code(tavo_semaphore_acquire(handle_)); }
    /** Releases the semaphore; not checked, any process may. @param error the failure, or cleared */
    void release(std::error_code& error) { error = to_error_code(tavo_semaphore_release(handle_)); }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    explicit ProcessSemaphore(uint32_t key) {
        detail::or_throw("tavo::ProcessSemaphore",
                         [&](std::error_code& error) { *this = ProcessSemaphore(key, error); });
    }
    void close() {
        detail::or_throw("tavo::ProcessSemaphore::close", [this](std::error_code& error) { close(error); });
    }
    void acquire() {
        detail::or_throw("tavo::ProcessSemaphore::acquire", [this](std::error_code& error) { acquire(error); });
    }
    void release() {
        detail::or_throw("tavo::ProcessSemaphore::release", [this](std::error_code& error) { release(error); });
    }
    /** @} */
#endif

    /** Whether there is a mapping. */
    explicit operator bool() const noexcept { return handle_ != 0; }
    /** The handle, for C functions; still owned. 0 when empty. */
    TAVO_INT64 native_handle() const noexcept { return handle_; }

private:
    static constexpr TAVO_INT64 kUnmapped = -1;

    TAVO_INT64 handle_ = 0;
};

}  // namespace tavo

#endif

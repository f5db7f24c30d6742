/**
 * @file
 * The status codes as std::error_code, and the way the C++ interface reports failures.
 *
 * Every operation comes in two forms, as in std::filesystem: one throws std::system_error, the other has a
 * std::error_code& as its last parameter, which it sets to the failure or clears. Both leave errno as the C function
 * left it. What waits with a limit returns false when the time is up; that is no failure.
 *
 * Where exceptions are off (-fno-exceptions), the throwing forms are not there. Locking and unlocking a tavo::Mutex
 * stay, because std::lock_guard needs them, and end the program where they would throw.
 */
#ifndef TAVO_OSAL_CPP_ERROR_HPP
#define TAVO_OSAL_CPP_ERROR_HPP

#include <cstdio>
#include <exception>
#include <string>
#include <system_error>
#include <type_traits>
#include <utility>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

#if defined(__cpp_exceptions)
/** Defined where the throwing forms are there. */
#define TAVO_HAS_EXCEPTIONS 1
#endif

namespace tavo {

/** The status codes, for comparing a std::error_code with: `if (error == tavo::Errc::message_too_large)`. */
enum class Errc : TAVO_Status {
    write_failed = -1,                    /**< a message could not be written; errno says why */
    not_reachable = 1,                    /**< attaching to a queue: there is no service */
    failure = TAVO_FAILURE,               /**< #TAVO_FAILURE */
    invalid_param = TAVO_INVALID_PARAM,   /**< #TAVO_INVALID_PARAM; also every operation on an empty object */
    no_memory = TAVO_NO_MEMORY,           /**< #TAVO_NO_MEMORY; also a framework without a free timer */
    destroy_failed = TAVO_DESTROY_FAILED, /**< #TAVO_DESTROY_FAILED */
    not_supported = TAVO_NOT_SUPPORTED,   /**< #TAVO_NOT_SUPPORTED */
    busy = TAVO_BUSY,                     /**< #TAVO_BUSY */
    out_of_range = TAVO_OUT_OF_RANGE,     /**< #TAVO_OUT_OF_RANGE */
    timeout = TAVO_TIMEOUT,               /**< #TAVO_TIMEOUT */
    socket_create_failed = TAVO_SOCKET_CREATE_FAILED,   /**< #TAVO_SOCKET_CREATE_FAILED */
    socket_connect_failed = TAVO_SOCKET_CONNECT_FAILED, /**< #TAVO_SOCKET_CONNECT_FAILED */
    socket_close_failed = TAVO_SOCKET_CLOSE_FAILED,     /**< #TAVO_SOCKET_CLOSE_FAILED */
    socket_select_timeout = TAVO_SOCKET_SELECT_TIMEOUT, /**< #TAVO_SOCKET_SELECT_TIMEOUT */
    socket_select_failed = TAVO_SOCKET_SELECT_FAILED,   /**< #TAVO_SOCKET_SELECT_FAILED */
    socket_send_failed = TAVO_SOCKET_SEND_FAILED,       /**< #TAVO_SOCKET_SEND_FAILED */
    socket_option_failed = TAVO_SOCKET_OPTION_FAILED,   /**< #TAVO_SOCKET_OPTION_FAILED */
    queue_key_failed = TAVO_MQ_KEY_FAILED,              /**< #TAVO_MQ_KEY_FAILED */
    queue_invalid_pointer = TAVO_MQ_INVALID_POINTER,    /**< #TAVO_MQ_INVALID_POINTER */
    queue_failure = TAVO_MQ_FAILURE,                    /**< #TAVO_MQ_FAILURE */
    message_too_large = TAVO_MQ_MSG_TOO_LARGE,          /**< #TAVO_MQ_MSG_TOO_LARGE */
    queue_not_available = TAVO_MQ_NOT_AVAILABLE,        /**< #TAVO_MQ_NOT_AVAILABLE */
    condition_timeout = TAVO_CONDITION_TIMEOUT,         /**< #TAVO_CONDITION_TIMEOUT */
    semaphore_delete_failed = TAVO_SEM_DELETE_FAILED,   /**< #TAVO_SEM_DELETE_FAILED */
    semaphore_timeout = TAVO_SEMAPHORE_TIMEOUT,         /**< #TAVO_SEMAPHORE_TIMEOUT */
    dl_open_failed = TAVO_DL_OPEN_FAILED,               /**< #TAVO_DL_OPEN_FAILED */
    dl_symbol_failed = TAVO_DL_SYMBOL_FAILED,           /**< #TAVO_DL_SYMBOL_FAILED */
    dl_close_failed = TAVO_DL_CLOSE_FAILED              /**< #TAVO_DL_CLOSE_FAILED */
};

namespace detail {

struct StatusText {
    Errc code;
    std::errc condition; /* {} where the standard's conditions have nothing like it */
    const char* text;
};

inline constexpr StatusText kStatusTexts[] = {
    {Errc::write_failed, {}, "the message could not be written"},
    {Errc::not_reachable, {}, "the service is not reachable"},
    {Errc::failure, {}, "a platform call failed, or the service is not reachable"},
    {Errc::invalid_param, std::errc::invalid_argument, "invalid parameter"},
    {Errc::no_memory, std::errc::not_enough_memory, "no memory, or no free place"},
    {Errc::destroy_failed, {}, "a part of the object could not be destroyed"},
    {Errc::not_supported, std::errc::not_supported, "not supported on this platform"},
    {Errc::busy, std::errc::device_or_resource_busy, "the mutex is held"},
    {Errc::out_of_range, std::errc::result_out_of_range, "the number does not fit in 32 bits"},
    {Errc::timeout, std::errc::timed_out, "the wait timed out"},
    {Errc::socket_create_failed, {}, "the socket could not be created"},
    {Errc::socket_connect_failed, {}, "the socket could not be connected, bound or accepted"},
    {Errc::socket_close_failed, {}, "the socket could not be closed, shut down or reset"},
    {Errc::socket_select_timeout, std::errc::timed_out, "the wait for the socket timed out"},
    {Errc::socket_select_failed, {}, "the wait for the socket failed"},
    {Errc::socket_send_failed, {}, "not everything was sent"},
    {Errc::socket_option_failed, {}, "the socket option could not be set"},
    {Errc::queue_key_failed, {}, "no message-queue key could be generated"},
    {Errc::queue_invalid_pointer, std::errc::invalid_argument, "null handle or key"},
    {Errc::queue_failure, {}, "no queue object, or a failed receive"},
    {Errc::message_too_large, std::errc::message_size, "the message is larger than a queue carries"},
    {Errc::queue_not_available, std::errc::identifier_removed, "no such queue, or it was removed"},
    {Errc::condition_timeout, std::errc::timed_out, "the wait for the condition timed out"},
    {Errc::semaphore_delete_failed, {}, "the semaphore could not be unmapped"},
    {Errc::semaphore_timeout, std::errc::timed_out, "the wait for the semaphore timed out"},
    {Errc::dl_open_failed, {}, "the shared object could not be loaded"},
    {Errc::dl_symbol_failed, {}, "the symbol was not found"},
    {Errc::dl_close_failed, {}, "the shared object could not be closed"},
};

constexpr const StatusText* find_text(int value) noexcept {
    for (const StatusText& entry : kStatusTexts) {
        if (static_cast<int>(entry.code) == value) return &entry;
    }
    return nullptr;
}

class TAVO_API StatusCategory final : public std::error_category {
public:
    const char* name() const noexcept override { return "tavo_osal"; }

    std::string message(int value) const override {
        if (value == TAVO_SUCCESS) return "success";
        if (const StatusText* entry = find_text(value)) return entry->text;
        char text[40];
        snprintf(text, sizeof text, "unknown status %d (%#x)", value, static_cast<unsigned int>(value));
        return text;
    }

    std::error_condition default_error_condition(int value) const noexcept override {
        const StatusText* entry = find_text(value);
        if (entry == nullptr || entry->condition == std::errc{}) return {value, *this};
        return std::make_error_condition(entry->condition);
    }
};

}  // namespace detail

/**
 * The category of the library's codes, named "tavo_osal". Codes that have a counterpart among std::errc compare equal
 * to it: `error == std::errc::timed_out` holds for every time-out of the library. May be called from any thread.
 */
TAVO_API inline const std::error_category& status_category() noexcept {
    static const detail::StatusCategory category;
    return category;
}

/** A code as a std::error_code; found by the standard library when an Errc is compared or assigned. */
inline std::error_code make_error_code(Errc code) noexcept { return {static_cast<int>(code), status_category()}; }

/** What a C function answered, as a std::error_code: false for #TAVO_SUCCESS. */
inline std::error_code to_error_code(TAVO_Status status) noexcept {
    return status == TAVO_SUCCESS ? std::error_code() : std::error_code(status, status_category());
}

namespace detail {

#ifdef TAVO_HAS_EXCEPTIONS
/* The throwing form of an operation, made from the other one. */
template <typename Operation>
std::invoke_result_t<Operation, std::error_code&> or_throw(const char* what, Operation operation) {
    std::error_code error;
    if constexpr (std::is_void_v<std::invoke_result_t<Operation, std::error_code&>>) {
        operation(error);
        if (error) throw std::system_error(error, what);
    } else {
        auto result = operation(error);
        if (error) throw std::system_error(error, what);
        return result;
    }
}
#endif

/* True for success, false for the time-out given, which is no error. */
inline bool unless_timeout(TAVO_Status status, TAVO_Status timeout, std::error_code& error) noexcept {
    error = status == timeout ? std::error_code() : to_error_code(status);
    return status == TAVO_SUCCESS;
}

}  // namespace detail
}  // namespace tavo

/** Lets an Errc stand for a std::error_code. */
template <>
struct std::is_error_code_enum<tavo::Errc> : std::true_type {};

#endif

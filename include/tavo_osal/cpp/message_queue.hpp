/**
 * @file
 * tavo::MessageQueue: a process's attachment to a message queue of tavo_osal/msg_queue.h.
 */
#ifndef TAVO_OSAL_CPP_MESSAGE_QUEUE_HPP
#define TAVO_OSAL_CPP_MESSAGE_QUEUE_HPP

#include <cstddef>
#include <memory>
#include <new>
#include <string_view>
#include <vector>

#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"

namespace tavo {

/**
 * An attachment to the queue of a key. Movable, not copyable. Operations on an empty one (moved from or closed) fail
 * with Errc::invalid_param. Several threads may put messages of up to 4092 bytes at once; longer ones need a single
 * writer. One thread at a time gets.
 */
class MessageQueue {
public:
    /** Bytes of the longest message. */
    static constexpr std::size_t max_size = TAVO_MSG_QUEUE_MAX_SIZE;

    /** Attaches to the queue of a key, which is made if there is none; empty when that failed.
     *  @param key any number but 0
     *  @param error the failure, or cleared; Errc::not_reachable when there is no service */
    MessageQueue(int key, std::error_code& error) {
        error = to_error_code(tavo_msg_queue_init(key, &handle_));
        if (error) handle_ = 0;
    }
    /** Takes over what the other one owns, which is empty then. */
    MessageQueue(MessageQueue&& other) noexcept
        : handle_(std::exchange(other.handle_, 0)), scratch_(std::move(other.scratch_)) {}
    /** Gives up its own, and takes over what the other one owns. */
    MessageQueue& operator=(MessageQueue&& other) noexcept {
        const MessageQueue old(std::move(*this));
        handle_ = std::exchange(other.handle_, 0);
        scratch_ = std::move(other.scratch_);
        return *this;
    }
    /** Gives the attachment up; where the service is not reachable, its descriptors stay open. */
    ~MessageQueue() {
        if (handle_ != 0) tavo_msg_queue_destroy(handle_);
    }

    /** Gives the attachment up now, and with it one use of the key. Does nothing when empty.
     *  @param error the failure, or cleared; the attachment stays after a failure, and can be used and closed again */
    void close(std::error_code& error) {
        error.clear();
        if (handle_ == 0) return;
        error = to_error_code(tavo_msg_queue_destroy(handle_));
        if (!error) handle_ = 0;
    }

    /** Sends one message; blocks while the queue is full.
     *  @param message its bytes; null only with a size of 0 @param size at most max_size @param error the failure */
    void put(const void* message, std::size_t size, std::error_code& error) {
        static unsigned char nothing;
        if (handle_ == 0) {
            error = make_error_code(Errc::invalid_param);
        } else if (size > max_size) {
            error = make_error_code(Errc::message_too_large);
        } else {
            // The C function only reads, whatever its type says.
            auto* bytes = static_cast<unsigned char*>(const_cast<void*>(message));
            if (bytes == nullptr && size == 0) bytes = &nothing;
            error = to_error_code(tavo_msg_queue_put(handle_, bytes, static_cast<unsigned int>(size)));
        }
    }
    /** Sends one message. @param message its bytes @param error the failure, or cleared */
    void put(std::string_view message, std::error_code& error) { put(message.data(), message.size(), error); }

    /** Receives one message; blocks until there is one.
     *  @param message receives the bytes, its room is used again; empty after a failure
     *  @param error the failure, or cleared */
    void get(std::vector<unsigned char>& message, std::error_code& error) {
        message.clear();
        // The C function knows no limit but the longest message.
        if (scratch_ == nullptr) scratch_.reset(new (std::nothrow) unsigned char[max_size]);
        if (handle_ == 0 || scratch_ == nullptr) {
            error = make_error_code(handle_ == 0 ? Errc::invalid_param : Errc::no_memory);
            return;
        }
        auto size = static_cast<unsigned int>(max_size);
        error = to_error_code(tavo_msg_queue_get(handle_, scratch_.get(), &size));
        if (!error) message.assign(scratch_.get(), scratch_.get() + size);
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** @name The same, throwing std::system_error
     *  @{ */
    /** As the one above with the same name and arguments; a failure is thrown as std::system_error. */
    explicit MessageQueue(int key) {
        detail::or_throw("tavo::MessageQueue", [&](std::error_code& error) { *this = MessageQueue(key, error); });
    }
    void close() {
        detail::or_throw("tavo::MessageQueue::close", [this](std::error_code& error) { close(error); });
    }
    void put(const void* message, std::size_t size) {
        detail::or_throw("tavo::MessageQueue::put", [&](std::error_code& error) { put(message, size, error); });
    }
    void put(std::string_view message) { put(message.data(), message.size()); }
    void get(std::vector<unsigned char>& message) {
        detail::or_throw("tavo::MessageQueue::get", [&](std::error_code& error) { get(message, error); });
    }
    /** @} */
    /** Receives one message; blocks until there is one. @return its bytes @throws std::system_error */
    std::vector<unsigned char> get() {
        std::vector<unsigned char> message;
        get(message);
        return message;
    }
#endif

    /** Whether there is an attachment. */
    explicit operator bool() const noexcept { return handle_ != 0; }
    /** The handle, for C functions; still owned. 0 when empty. */
    TAVO_INT64 native_handle() const noexcept { return handle_; }

private:
    TAVO_INT64 handle_ = 0;
    std::unique_ptr<unsigned char[]> scratch_;
};

}  // namespace tavo

#endif

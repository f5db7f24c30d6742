/**
 * @file
 * tavo::SharedBlock: a block of memory of tavo_osal/shared_memory.h, mapped into this process.
 */
#ifndef TAVO_OSAL_CPP_SHARED_BLOCK_HPP
#define TAVO_OSAL_CPP_SHARED_BLOCK_HPP

#include <cstddef>
#include <cstdint>

#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/memory.h"
#include "tavo_osal/shared_memory.h"

namespace tavo {

/**
 * The block of a key, mapped and counted as one use of it. Movable, not copyable; given up with the object. data() and
 * size() may be called from any thread; what is in the block is for its users to guard.
 */
class SharedBlock {
public:
    /** Maps the block of a key, which is made, zeroed, if there is none; empty when that failed.
     *  @param key  1 to INT32_MAX: the service gives up no others
     *  @param size bytes, 1 to INT32_MAX. A block that exists has the size that it was made with, whatever is said here
     *  @param error the failure, or cleared */
    SharedBlock(uint32_t key, std::size_t size, std::error_code& error) {
        if (key == 0 || key > INT32_MAX || size > INT32_MAX) {
            error = make_error_code(Errc::invalid_param);
            return;
        }
        error = to_error_code(tavo_shm_init(key, &handle_, static_cast<uint32_t>(size)));
        if (!error) error = to_error_code(tavo_shm_acquire(handle_, &data_));
        // Nothing was counted, so tavo_shm_delete() would take back somebody else's use.
        if (error) free_handle();
    }
    /** Takes over what the other one owns, which is empty then. */
    SharedBlock(SharedBlock&& other) noexcept
        : handle_(std::exchange(other.handle_, nullptr)), data_(std::exchange(other.data_, nullptr)) {}
    /** Gives up its own, and takes over what the other one owns. */
    SharedBlock& operator=(SharedBlock&& other) noexcept {
        const SharedBlock old(std::move(*this));
        handle_ = std::exchange(other.handle_, nullptr);
        data_ = std::exchange(other.data_, nullptr);
        return *this;
    }
    /** Unmaps the block and gives up its use; a failure of the latter is in the log only. */
    ~SharedBlock() {
        std::error_code ignored;
        close(ignored);
        free_handle();
    }

    /** Unmaps the block now, and gives up its use in the service. Does nothing when empty.
     *  @param error the failure, or cleared; when the service is not reachable, the block is unmapped all the same, and
     *               closing again gives up the use */
    void close(std::error_code& error) {
        error.clear();
        if (handle_ == nullptr) return;
        if (data_ != nullptr) tavo_shm_release(std::exchange(data_, nullptr));
        const TAVO_Status status = tavo_shm_delete(handle_);
        error = to_error_code(status);
        // Any other answer is the service's, which has no such one for these keys, and the handle is gone.
        if (status != TAVO_FAILURE) handle_ = nullptr;
    }

#ifdef TAVO_HAS_EXCEPTIONS
    /** Maps the block of a key. @param key as above @param size as above @throws std::system_error */
    SharedBlock(uint32_t key, std::size_t size) {
        detail::or_throw("tavo::SharedBlock", [&](std::error_code& error) { *this = SharedBlock(key, size, error); });
    }
    /** Unmaps the block now, and gives up its use. @throws std::system_error */
    void close() {
        detail::or_throw("tavo::SharedBlock::close", [this](std::error_code& error) { close(error); });
    }
#endif

    /** The block's first byte, on a page's beginning. Null when empty. */
    void* data() const noexcept { return data_; }
    /** The bytes that were asked for. 0 when empty. */
    std::size_t size() const noexcept { return data_ != nullptr ? handle_->uiSize : 0; }
    /** Whether there is a mapping. */
    explicit operator bool() const noexcept { return data_ != nullptr; }

private:
    void free_handle() noexcept { tavo_osal_mem_free(std::exchange(handle_, nullptr)); }

    TavoShmHandle* handle_ = nullptr;
    void* data_ = nullptr;
};

}  // namespace tavo

#endif

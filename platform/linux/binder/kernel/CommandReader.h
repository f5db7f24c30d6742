// What the kernel's driver says, command by command.
#pragma once

#include <linux/android/binder.h>
#include <sys/ioctl.h>

#include <cstddef>
#include <cstdint>
#include <cstring>

namespace android::kernel_driver {

// What newer kernels say of a oneway call to a frozen process: that it will be served when the process thaws.
constexpr uint32_t kBrTransactionPendingFrozen = _IO('r', 20);

// A command's number says how long its payload is, so those that are not known can be skipped.
class Command {
public:
    // The longest payload that is looked at.
    static constexpr size_t kMaxPayload = sizeof(binder_transaction_data_secctx);

    uint32_t code() const { return code_; }
    // Only for a command whose number says that it carries a T.
    template <typename T>
    T payload() const {
        static_assert(sizeof(T) <= kMaxPayload, "it is not kept");
        T value;
        memcpy(&value, payload_, sizeof value);
        return value;
    }

private:
    friend class CommandReader;

    uint32_t code_ = BR_NOOP;
    alignas(uint64_t) uint8_t payload_[kMaxPayload] = {};
};

class CommandReader {
public:
    enum class Result {
        kCommand,
        kEnd,
        kBroken,  // the rest makes no sense, and is dropped
    };

    CommandReader() = default;
    // The bytes are not copied.
    CommandReader(const uint8_t* bytes, size_t size) : next_(bytes), left_(size) {}

    bool atEnd() const { return left_ == 0; }

    Result next(Command& command) {
        if (left_ == 0) return Result::kEnd;
        uint32_t code = 0;
        if (left_ < sizeof code) return broken();
        memcpy(&code, next_, sizeof code);
        const size_t size = _IOC_SIZE(code);
        if (_IOC_TYPE(code) != 'r' || left_ - sizeof code < size) return broken();
        command.code_ = code;
        if (size <= Command::kMaxPayload) memcpy(command.payload_, next_ + sizeof code, size);
        next_ += sizeof code + size;
        left_ -= sizeof code + size;
        return Result::kCommand;
    }

private:
    Result broken() {
        left_ = 0;
        return Result::kBroken;
    }

    const uint8_t* next_ = nullptr;
    size_t left_ = 0;
};

}  // namespace android::kernel_driver

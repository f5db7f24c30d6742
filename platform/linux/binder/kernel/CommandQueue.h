// What is to be said to the kernel's driver, command by command.
#pragma once

#include <linux/android/binder.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

namespace android::kernel_driver {

class CommandQueue {
public:
    bool empty() const { return bytes_.empty(); }
    size_t size() const { return bytes_.size(); }
    const uint8_t* data() const { return bytes_.data(); }

    template <uint32_t code>
    void add() {
        static_assert(_IOC_SIZE(code) == 0, "it has a payload");
        append(&kCode<code>, kCodeSize);
    }
    template <uint32_t code, typename T>
    void add(const T& payload) {
        static_assert(_IOC_SIZE(code) == sizeof payload, "it has another payload");
        append(&kCode<code>, kCodeSize);
        append(&payload, sizeof payload);
    }

    // The place where the next command will be.
    uint64_t mark() const { return consumed_ + bytes_.size(); }
    // Takes back the command that was added there, unless it has been said.
    template <uint32_t code>
    void takeBack(uint64_t mark) {
        if (mark < consumed_) return;
        const auto start = bytes_.begin() + static_cast<std::ptrdiff_t>(mark - consumed_);
        bytes_.erase(start, start + static_cast<std::ptrdiff_t>(kCodeSize + _IOC_SIZE(code)));
    }
    // So many bytes have been said.
    void consume(size_t size) {
        size = std::min(size, bytes_.size());
        bytes_.erase(bytes_.begin(), bytes_.begin() + static_cast<std::ptrdiff_t>(size));
        consumed_ += size;
    }

private:
    static constexpr size_t kCodeSize = sizeof(uint32_t);
    template <uint32_t code>
    static constexpr uint32_t kCode = code;

    void append(const void* data, size_t size) {
        const auto* bytes = static_cast<const uint8_t*>(data);
        bytes_.insert(bytes_.end(), bytes, bytes + size);
    }

    std::vector<uint8_t> bytes_;
    uint64_t consumed_ = 0;
};

}  // namespace android::kernel_driver

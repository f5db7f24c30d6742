// A binder device that says what a test wants it to say, and notes what it is told: in place of the kernel's, for
// tests of the driver that speaks with it.
//
//     FakeBinderDevice& device = FakeBinderDevice::install();
//     device.say(Said().add(BR_TRANSACTION_COMPLETE).add(BR_REPLY, device.parcel(reply)));
//
// What is said is given to whoever reads, in order. Nothing ever waits: where nothing is left to be said, reading
// fails with ENODEV, which is also how a test has a thread leave the pool.
#pragma once

#include <linux/android/binder.h>
#include <sys/types.h>

#include <cstdint>
#include <cstring>
#include <deque>
#include <map>
#include <memory>
#include <vector>

namespace tavo::test {

// Commands, as the kernel puts them behind one another.
class Said {
public:
    Said& add(uint32_t code) { return append(&code, sizeof code); }
    template <typename T>
    Said& add(uint32_t code, const T& payload) {
        add(code);
        return append(&payload, sizeof payload);
    }
    Said& append(const void* bytes, size_t size);

    const std::vector<uint8_t>& bytes() const { return bytes_; }

private:
    std::vector<uint8_t> bytes_;
};

// One command of the driver's, and of a transaction also what it carries.
struct Told {
    uint32_t code = 0;
    std::vector<uint8_t> payload;
    std::vector<uint8_t> data;
    std::vector<binder_size_t> offsets;

    template <typename T>
    T as() const {
        T value = {};
        if (payload.size() == sizeof value) memcpy(&value, payload.data(), sizeof value);
        return value;
    }
};

class FakeBinderDevice {
public:
    // Stands in front of libbinder's system calls from now on. Before anything of binder is used.
    static FakeBinderDevice& install();

    // Error numbers of what fails; 0 lets it work.
    int open_error = 0;
    int version_error = 0;
    int map_error = 0;
    int max_threads_error = 0;
    int context_manager_error = 0;
    int version = BINDER_CURRENT_PROTOCOL_VERSION;

    // One reading's worth. The kernel says nothing behind a transaction, a reply or a death.
    void say(const Said& said) { answers_.push_back({0, said.bytes(), SIZE_MAX}); }
    // The next call fails, and has taken so many bytes of what it was told.
    void fail(int error, size_t taken = SIZE_MAX) { answers_.push_back({error, {}, taken}); }
    // A transaction or a reply in the memory that the kernel receives into, until it is given back.
    binder_transaction_data parcel(const void* data, size_t size, const std::vector<binder_size_t>& offsets = {});

    // What was told since.
    std::vector<Told> told() const { return told_; }
    std::vector<uint32_t> told_codes() const;
    void forget_told() { told_.clear(); }
    size_t buffers_in_use() const { return buffers_.size(); }

    uint32_t max_threads = 0;
    int threads_ended = 0;
    int reads = 0;
    int writes_alone = 0;
    size_t mapped_size = 0;

private:
    struct Answer {
        int error;
        std::vector<uint8_t> bytes;
        size_t taken;
    };
    struct Buffer {
        std::vector<uint8_t> data;
        std::vector<binder_size_t> offsets;
    };

    static int open(const char* path, int flags, ...);
    static int ioctl(int fd, unsigned long request, ...);
    static void* mmap(void* address, size_t size, int protection, int flags, int fd, off_t offset);
    int control(unsigned long request, void* argument);
    int write_read(binder_write_read& request);
    void take(const uint8_t* bytes, size_t size);

    int fd_ = -1;
    std::deque<Answer> answers_;
    std::vector<Told> told_;
    std::map<binder_uintptr_t, std::unique_ptr<Buffer>> buffers_;
};

}  // namespace tavo::test

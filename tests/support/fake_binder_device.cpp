#include "support/fake_binder_device.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdlib>

#include "support/platform_fault.h"

namespace tavo::test {
namespace {

constexpr char kPath[] = "/nowhere/binder";
FakeBinderDevice* g_device = nullptr;

int result(int error) {
    if (error == 0) return 0;
    errno = error;
    return -1;
}

}  // namespace

Said& Said::append(const void* bytes, size_t size) {
    const auto* first = static_cast<const uint8_t*>(bytes);
    bytes_.insert(bytes_.end(), first, first + size);
    return *this;
}

FakeBinderDevice& FakeBinderDevice::install() {
    setenv("BINDER_DRIVER", "kernel", 1);
    setenv("BINDER_DEVICE", kPath, 1);
    // For the rest of the process, which uses it until it has exited.
    g_device = new FakeBinderDevice;
    static const PlatformHook& open = *new PlatformHook("libbinder.so", "open", &FakeBinderDevice::open);
    static const PlatformHook& ioctl = *new PlatformHook("libbinder.so", "ioctl", &FakeBinderDevice::ioctl);
    static const PlatformHook& mmap = *new PlatformHook("libbinder.so", "mmap", &FakeBinderDevice::mmap);
    static_cast<void>(open), static_cast<void>(ioctl), static_cast<void>(mmap);
    return *g_device;
}

int FakeBinderDevice::open(const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const auto mode = (flags & O_CREAT) != 0 ? va_arg(arguments, unsigned) : 0U;
    va_end(arguments);
    if (strcmp(path, kPath) != 0) return ::open(path, flags, mode);
    if (g_device->open_error != 0) return result(g_device->open_error);
    g_device->fd_ = memfd_create("fake binder", MFD_CLOEXEC);
    return g_device->fd_;
}

void* FakeBinderDevice::mmap(void* address, size_t size, int protection, int flags, int fd, off_t offset) {
    if (fd < 0 || fd != g_device->fd_) return ::mmap(address, size, protection, flags, fd, offset);
    if (g_device->map_error != 0) {
        errno = g_device->map_error;
        return MAP_FAILED;
    }
    g_device->mapped_size = size;
    return ::mmap(address, size, protection, flags | MAP_ANONYMOUS, -1, 0);
}

int FakeBinderDevice::ioctl(int, unsigned long request, ...) {
    va_list arguments;
    va_start(arguments, request);
    void* argument = va_arg(arguments, void*);
    va_end(arguments);
    return result(g_device->control(request, argument));
}

int FakeBinderDevice::control(unsigned long request, void* argument) {
    switch (request) {
        case BINDER_VERSION: static_cast<binder_version*>(argument)->protocol_version = version; return version_error;
        case BINDER_SET_MAX_THREADS: max_threads = *static_cast<uint32_t*>(argument); return max_threads_error;
        case BINDER_SET_CONTEXT_MGR: return context_manager_error;
        case BINDER_THREAD_EXIT: ++threads_ended; return 0;
        case BINDER_WRITE_READ: return write_read(*static_cast<binder_write_read*>(argument));
        default: return EINVAL;
    }
}

int FakeBinderDevice::write_read(binder_write_read& request) {
    const bool reads_too = request.read_size > 0;
    ++(reads_too ? reads : writes_alone);
    // Only what reads is answered, but any call may be made to fail.
    Answer answer = {reads_too ? ENODEV : 0, {}, SIZE_MAX};
    if (!answers_.empty() && (reads_too || answers_.front().error != 0)) {
        answer = answers_.front();
        answers_.pop_front();
    }
    const auto* bytes = reinterpret_cast<const uint8_t*>(static_cast<uintptr_t>(request.write_buffer));
    const size_t left = static_cast<size_t>(request.write_size - request.write_consumed);
    const size_t taken = std::min(answer.taken, left);
    take(bytes + request.write_consumed, taken);
    request.write_consumed += taken;
    if (answer.error != 0) return answer.error;
    const size_t size = std::min(answer.bytes.size(), static_cast<size_t>(request.read_size));
    auto* to = reinterpret_cast<uint8_t*>(static_cast<uintptr_t>(request.read_buffer));
    if (size > 0) memcpy(to, answer.bytes.data(), size);
    request.read_consumed = size;
    return 0;
}

void FakeBinderDevice::take(const uint8_t* bytes, size_t size) {
    for (size_t position = 0; size - position >= sizeof(uint32_t);) {
        Told told;
        memcpy(&told.code, bytes + position, sizeof told.code);
        position += sizeof told.code;
        const size_t length = std::min<size_t>(_IOC_SIZE(told.code), size - position);
        told.payload.assign(bytes + position, bytes + position + length);
        position += length;
        if (told.code == BC_TRANSACTION || told.code == BC_REPLY) {
            const auto transaction = told.as<binder_transaction_data>();
            const auto* data = reinterpret_cast<const uint8_t*>(static_cast<uintptr_t>(transaction.data.ptr.buffer));
            const auto* offsets =
                reinterpret_cast<const binder_size_t*>(static_cast<uintptr_t>(transaction.data.ptr.offsets));
            told.data.assign(data, data + transaction.data_size);
            told.offsets.assign(offsets, offsets + transaction.offsets_size / sizeof(binder_size_t));
        }
        if (told.code == BC_FREE_BUFFER) buffers_.erase(told.as<binder_uintptr_t>());
        told_.push_back(std::move(told));
    }
}

binder_transaction_data FakeBinderDevice::parcel(const void* data, size_t size,
                                                 const std::vector<binder_size_t>& offsets) {
    auto buffer = std::make_unique<Buffer>();
    const auto* bytes = static_cast<const uint8_t*>(data);
    // Never empty: every buffer has an address.
    buffer->data.reserve(size + 1);
    buffer->data.assign(bytes, bytes + size);
    buffer->offsets = offsets;
    binder_transaction_data transaction = {};
    transaction.data_size = size;
    transaction.offsets_size = offsets.size() * sizeof(binder_size_t);
    transaction.data.ptr.buffer = reinterpret_cast<uintptr_t>(buffer->data.data());
    transaction.data.ptr.offsets = reinterpret_cast<uintptr_t>(buffer->offsets.data());
    buffers_[transaction.data.ptr.buffer] = std::move(buffer);
    return transaction;
}

std::vector<uint32_t> FakeBinderDevice::told_codes() const {
    std::vector<uint32_t> codes;
    for (const Told& told : told_) codes.push_back(told.code);
    return codes;
}

}  // namespace tavo::test

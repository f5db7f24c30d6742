#include "support/loopback_driver.h"

#include <binder/BpBinder.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "platform/linux/binder/DriverRegistry.h"

namespace tavo::test {

using android::BBinder;
using android::BpBinder;
using android::IBinder;
using android::Parcel;
using android::sp;
using android::status_t;
using android::wp;

namespace {

LoopbackDriver* g_driver = nullptr;

std::unique_ptr<android::Driver> make_driver(android::Driver::Process& process) {
    auto driver = std::make_unique<LoopbackDriver>(process);
    g_driver = driver.get();
    return driver;
}

}  // namespace

// What a received parcel keeps for as long as it is not freed.
struct LoopbackDriver::Buffer {
    LoopbackDriver* driver;
    std::vector<uint8_t> bytes;
    std::vector<binder_size_t> offsets;
    std::vector<int32_t> handles;
    std::vector<sp<BBinder>> objects;
    std::vector<int> descriptors;

    ~Buffer() {
        for (const int fd : descriptors) close(fd);
        for (const int32_t handle : handles) driver->release(handle);
    }
};

LoopbackDriver& LoopbackDriver::open() {
    static std::once_flag once;
    std::call_once(once, [] {
        android::registerDriver("loopback", make_driver);
        setenv("BINDER_DRIVER", "loopback", 1);
        android::ProcessState::self();
    });
    return *g_driver;
}

int32_t LoopbackDriver::publish(const sp<BBinder>& object) {
    const std::lock_guard<std::mutex> lock(mutex_);
    return publish_locked(object);
}

int32_t LoopbackDriver::publish_locked(const sp<BBinder>& object) {
    for (const auto& [handle, known] : objects_) {
        if (known.object == object) return handle;
    }
    objects_[next_handle_].object = object;
    return next_handle_++;
}

sp<IBinder> LoopbackDriver::proxy(const sp<BBinder>& object) {
    return android::ProcessState::self()->getStrongProxyForHandle(publish(object));
}

void LoopbackDriver::set_context_object(const sp<BBinder>& object) {
    const std::lock_guard<std::mutex> lock(mutex_);
    context_ = object;
}

void LoopbackDriver::kill(int32_t handle) {
    sp<BpBinder> proxy;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        Object& object = objects_.at(handle);
        object.dead = true;
        if (std::exchange(object.notify, false)) {
            --counts_.notifications;
            proxy = object.proxy.promote();
        }
    }
    if (proxy != nullptr) proxy->sendObituary();
}

void LoopbackDriver::fail_with(status_t status) {
    const std::lock_guard<std::mutex> lock(mutex_);
    failure_ = status;
}

LoopbackDriver::Counts LoopbackDriver::counts() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return counts_;
}

int LoopbackDriver::references(int32_t handle) const {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto object = objects_.find(handle);
    return object != objects_.end() ? object->second.references : 0;
}

size_t LoopbackDriver::max_threads() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return max_threads_;
}

std::vector<std::string> LoopbackDriver::wait_for_threads(size_t count) {
    std::unique_lock<std::mutex> lock(mutex_);
    joined_.wait_for(lock, std::chrono::seconds(20), [&] { return threads_.size() >= count; });
    return threads_;
}

status_t LoopbackDriver::transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    sp<BBinder> target;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        ++counts_.transactions;
        counts_.last_flags = flags;
        if (failure_ != android::NO_ERROR) return failure_;
        const auto object = objects_.find(handle);
        if (object == objects_.end()) return android::BAD_TYPE;
        if (object->second.dead) return android::DEAD_OBJECT;
        target = object->second.object;
    }
    Parcel request, answer;
    status_t status = carry(data, &request);
    if (status != android::NO_ERROR) return status;
    status = process_.execute(target, kCaller, code, request, &answer, flags);
    if ((flags & IBinder::FLAG_ONEWAY) != 0) return android::NO_ERROR;
    if (status == android::NO_ERROR && reply != nullptr) status = carry(answer, reply);
    return status;
}

status_t LoopbackDriver::carry(const Parcel& from, Parcel* to) {
    auto buffer = std::make_unique<Buffer>();
    buffer->driver = this;
    buffer->bytes.assign(from.data(), from.data() + from.ipcDataSize());
    const auto* offsets = reinterpret_cast<const binder_size_t*>(from.ipcObjects());
    buffer->offsets.assign(offsets, offsets + from.ipcObjectsCount());
    for (const binder_size_t offset : buffer->offsets) {
        flat_binder_object object;
        memcpy(&object, buffer->bytes.data() + offset, sizeof object);
        const status_t status = translate(object, *buffer);
        if (status != android::NO_ERROR) return status;
        memcpy(buffer->bytes.data() + offset, &object, sizeof object);
    }
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        ++counts_.buffers;
    }
    Buffer* received = buffer.release();
    to->ipcSetDataReference(received->bytes.data(), received->bytes.size(), received->offsets.data(),
                            received->offsets.size(), free_buffer, received);
    return android::NO_ERROR;
}

status_t LoopbackDriver::translate(flat_binder_object& object, Buffer& buffer) {
    switch (object.hdr.type) {
        case BINDER_TYPE_BINDER: {
            const sp<BBinder> local = reinterpret_cast<BBinder*>(static_cast<uintptr_t>(object.cookie));
            const int32_t handle = publish(local);
            acquire(handle);
            buffer.handles.push_back(handle);
            object.hdr.type = BINDER_TYPE_HANDLE;
            object.binder = object.cookie = 0;
            object.handle = static_cast<uint32_t>(handle);
            return android::NO_ERROR;
        }
        case BINDER_TYPE_HANDLE: {
            const std::lock_guard<std::mutex> lock(mutex_);
            const auto known = objects_.find(static_cast<int32_t>(object.handle));
            if (known == objects_.end()) return android::FAILED_TRANSACTION;
            const sp<BBinder>& local = known->second.object;
            buffer.objects.push_back(local);
            object.hdr.type = BINDER_TYPE_BINDER;
            object.binder = reinterpret_cast<uintptr_t>(local->getWeakRefs());
            object.cookie = reinterpret_cast<uintptr_t>(local.get());
            return android::NO_ERROR;
        }
        default: {
            const int fd = fcntl(static_cast<int>(object.handle), F_DUPFD_CLOEXEC, 0);
            if (fd < 0) return android::FAILED_TRANSACTION;
            buffer.descriptors.push_back(fd);
            object.handle = static_cast<uint32_t>(fd);
            return android::NO_ERROR;
        }
    }
}

void LoopbackDriver::free_buffer(Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie) {
    const std::unique_ptr<Buffer> buffer(static_cast<Buffer*>(cookie));
    const std::lock_guard<std::mutex> lock(buffer->driver->mutex_);
    --buffer->driver->counts_.buffers;
}

void LoopbackDriver::acquire(int32_t handle) {
    const std::lock_guard<std::mutex> lock(mutex_);
    ++counts_.references;
    ++objects_[handle].references;
}

void LoopbackDriver::release(int32_t handle) {
    const std::lock_guard<std::mutex> lock(mutex_);
    --counts_.references;
    --objects_[handle].references;
}

status_t LoopbackDriver::requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) {
    const std::lock_guard<std::mutex> lock(mutex_);
    Object& object = objects_.at(handle);
    if (object.dead) return android::DEAD_OBJECT;
    ++counts_.requests;
    if (!std::exchange(object.notify, true)) ++counts_.notifications;
    object.proxy = proxy;
    return android::NO_ERROR;
}

status_t LoopbackDriver::clearDeathNotification(int32_t handle) {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (std::exchange(objects_.at(handle).notify, false)) --counts_.notifications;
    return android::NO_ERROR;
}

sp<IBinder> LoopbackDriver::contextObject() {
    sp<BBinder> context;
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        context = context_;
    }
    return context != nullptr ? proxy(context) : nullptr;
}

void LoopbackDriver::setMaxThreads(size_t count) {
    const std::lock_guard<std::mutex> lock(mutex_);
    max_threads_ = count;
}

void LoopbackDriver::joinThreadPool(bool isMain) {
    char name[16] = {};
    pthread_getname_np(pthread_self(), name, sizeof name);
    const std::lock_guard<std::mutex> lock(mutex_);
    threads_.push_back(std::string(name) + (isMain ? " main" : ""));
    joined_.notify_all();
}

void LoopbackDriver::quiesce() {
    if (on_quiesce != nullptr) on_quiesce();
}

}  // namespace tavo::test

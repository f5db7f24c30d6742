#include "ipc/ITavoBinder.h"

#include <android/log.h>
#include <binder/Parcel.h>
#include <fcntl.h>

#include <new>

#include "log/module_log.h"

namespace android {
namespace {

constexpr char kTag[] = "BINDER_IFACE";

// The transaction codes are fixed numbers that other builds of the library use as well. They do not follow
// the order of the operations.
enum : uint32_t {
    kGetSharedMem = 3,
    kDeleteSharedMem = 4,
    kCreateMessageQueue = 5,
    kDeleteMessageQueue = 6,
    kGetWriteFd = 7,
    kGetFd = 8,
};

// Descriptor 0 stands for an absent one in message queues, so no queue may be given it.
constexpr int kLowestDescriptor = 1;

// Sends one request. Whether it arrived is deliberately not looked at: the result is what the reply yields, and
// an empty reply yields 0, no heap and no descriptor.
void request(IBinder* service, uint32_t code, Parcel* reply, int key, const int* size = nullptr) {
    TAVO_TRACE_SCOPE(kTag);
    // The one operation that says more, and it names another one. Users' log filters know it by that.
    if (code == kDeleteSharedMem) TAVO_LOG(kTag, TAVO_LOG_INFO, "Key received at get_shared_memory is %d", key);
    Parcel data;
    data.writeInterfaceToken(ITavoBinder::descriptor);
    data.writeInt32(key);
    if (size != nullptr) data.writeInt32(*size);
    try {
        service->transact(code, data, reply, 0);
    } catch (const std::bad_alloc&) {
        // As any other failure on the way: the reply is empty.
    }
}

int request_int(IBinder* service, uint32_t code, int key) {
    Parcel reply;
    request(service, code, &reply, key);
    return reply.readInt32();
}

// The reply closes its own descriptor, so the caller gets a duplicate.
int request_descriptor(IBinder* service, uint32_t code, int key) {
    Parcel reply;
    request(service, code, &reply, key);
    return fcntl(reply.readFileDescriptor(), F_DUPFD_CLOEXEC, kLowestDescriptor);
}

}  // namespace

const String16 ITavoBinder::descriptor("tavo.mq");

ITavoBinder::ITavoBinder() = default;
ITavoBinder::~ITavoBinder() = default;

const String16& ITavoBinder::getInterfaceDescriptor() const { return descriptor; }

sp<ITavoBinder> ITavoBinder::asInterface(const sp<IBinder>& obj) {
    if (obj == nullptr) return nullptr;
    const sp<IInterface> local = obj->queryLocalInterface(descriptor);
    if (local != nullptr) return static_cast<ITavoBinder*>(local.get());
    sp<ITavoBinder> proxy = new BpTavoBinder(obj);
    __android_log_print(ANDROID_LOG_DEBUG, nullptr, "Constructor");
    return proxy;
}

BpTavoBinder::BpTavoBinder(const sp<IBinder>& impl) : BpInterface<ITavoBinder>(impl) {}
BpTavoBinder::~BpTavoBinder() = default;

int BpTavoBinder::get_fd(int key) { return request_descriptor(remote(), kGetFd, key); }

int BpTavoBinder::get_write_fd(int key) { return request_descriptor(remote(), kGetWriteFd, key); }

int BpTavoBinder::create_message_queue(int key) { return request_int(remote(), kCreateMessageQueue, key); }

int BpTavoBinder::delete_message_queue(int key) { return request_int(remote(), kDeleteMessageQueue, key); }

sp<IMemoryHeap> BpTavoBinder::get_shared_mem(int key, int size) {
    Parcel reply;
    request(remote(), kGetSharedMem, &reply, key, &size);
    try {
        return IMemoryHeap::asInterface(reply.readStrongBinder());
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

int BpTavoBinder::delete_shared_mem(int key) { return request_int(remote(), kDeleteSharedMem, key); }

status_t BnTavoBinder::onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    if (code < kGetSharedMem || code > kGetFd) return BBinder::onTransact(code, data, reply, flags);
    if (!data.checkInterface(this)) return PERMISSION_DENIED;

    // The queue operations report normal traffic at the highest level, and users' log filters rely on seeing it.
    const int key = data.readInt32();
    switch (code) {
        case kGetSharedMem: {
            const int size = data.readInt32();
            TAVO_LOG(kTag, TAVO_LOG_INFO, "Key received at get_shared_memory is %d \n", key);
            TAVO_LOG(kTag, TAVO_LOG_INFO, "Size received at get_shared_memory is %d \n", size);
            const sp<IMemoryHeap> heap = get_shared_mem(key, size);
            if (heap != nullptr) reply->writeStrongBinder(IInterface::asBinder(heap));
            break;
        }
        case kDeleteSharedMem:
            TAVO_LOG(kTag, TAVO_LOG_INFO, "Key received at get_shared_memory is %d \n", key);
            reply->writeInt32(delete_shared_mem(key));
            break;
        case kCreateMessageQueue:
            TAVO_LOG(kTag, TAVO_LOG_ERROR, "CREATE MSG %d \n", key);
            reply->writeInt32(create_message_queue(key));
            break;
        case kDeleteMessageQueue: reply->writeInt32(delete_message_queue(key)); break;
        case kGetWriteFd:
            TAVO_LOG(kTag, TAVO_LOG_ERROR, "Key received at  GET FD WRITE is %d", key);
            reply->writeFileDescriptor(get_write_fd(key), false);
            break;
        case kGetFd:
            TAVO_LOG(kTag, TAVO_LOG_ERROR, "Key received at FD READ KEY  is %d", key);
            reply->writeFileDescriptor(get_fd(key), false);
            break;
    }
    return NO_ERROR;
}

}  // namespace android

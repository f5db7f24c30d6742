#include "tavo_osal/msg_queue.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>

#include "ipc/ITavoBinder.h"
#include "ipc/TAVO_MessageQueue.h"
#include "ipc/service_lookup.h"
#include "log/module_log.h"

using android::IBinder;
using android::ITavoBinder;
using android::sp;
using android::TAVO_MessageQueue;

namespace {

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kAttachSignature[] = "TAVO_Status tavo_msg_queue_sender_init(TAVO_CHAR*, TAVO_INT64*)";
// Callers know an unreachable service by this number, which is none of the status codes.
constexpr TAVO_Status kServiceUnreachable = 1;
// Descriptor 0 stands for an absent one in message queues, so no queue may be given it.
constexpr int kLowestDescriptor = 1;

// A handle is the queue's address, and positive: only such a handle can be given back, so an address in the upper half
// of a 32-bit address space is not extended by its sign.
TAVO_INT64 handle_of(const TAVO_MessageQueue* queue) {
    return static_cast<TAVO_INT64>(reinterpret_cast<uintptr_t>(queue));
}

// The address is in the low bits, however the caller has stored it.
TAVO_MessageQueue* queue_of(TAVO_INT64 handle) {
    return reinterpret_cast<TAVO_MessageQueue*>(static_cast<intptr_t>(handle));
}

// The key in a decimal text, of which as much is looked at as a queue object stores: attaching and destroying must
// come to the same key. Numbers beyond 32 bits count as the nearest that fits.
int key_of(const char* text) {
    char name[sizeof(TAVO_MessageQueue::acServiceName) + 1] = {};
    memcpy(name, text, strnlen(text, sizeof name - 1));
    return static_cast<int>(std::clamp<long long>(strtoll(name, nullptr, 10), INT32_MIN, INT32_MAX));
}

// One use of a key in the service, given back unless it is kept.
class Use {
public:
    // Attaching to a queue and creating it are one call. What it says only tells whether the use was counted: a queue
    // that is not there has no descriptors.
    Use(const sp<ITavoBinder>& service, int key)
        : service_(service), key_(key), counted_(service->create_message_queue(key) >= 0) {}
    // A thread may be cancelled, which unwinds its stack, while it calls the service.
    ~Use() noexcept(false) {
        if (counted_) service_->delete_message_queue(key_);
    }
    Use(const Use&) = delete;
    Use& operator=(const Use&) = delete;
    void keep() { counted_ = false; }

private:
    const sp<ITavoBinder>& service_;
    const int key_;
    bool counted_;
};

// The proxy's descriptors belong to its caller; the service in this very process answers with its own.
int own(const sp<ITavoBinder>& service, int descriptor) {
    const sp<IBinder> binder = android::IInterface::asBinder(service);
    const bool is_local = binder->queryLocalInterface(ITavoBinder::descriptor) != nullptr;
    return is_local ? fcntl(descriptor, F_DUPFD_CLOEXEC, kLowestDescriptor) : descriptor;
}

// What a failed transfer is called: a queue that was removed has a code of its own.
TAVO_Status transfer_failure(TAVO_Status other) { return errno == EIDRM ? TAVO_MQ_NOT_AVAILABLE : other; }

// Gives a fresh queue object the descriptors of the service's queue.
TAVO_Status connect(TAVO_MessageQueue& queue, const sp<ITavoBinder>& service, int key) {
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "%s () : getting fd for %d \n", kAttachSignature, key);
    const int read_end = own(service, service->get_fd(key));
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "%s () GOT FD \n", kAttachSignature);
    const int write_end = own(service, service->get_write_fd(key));
    if (read_end < 0 || write_end < 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, " Service Exists!!But no queue in that service : fd %d : %d \n", read_end,
                 write_end);
        if (read_end >= 0) close(read_end);
        if (write_end >= 0) close(write_end);
        return TAVO_MQ_NOT_AVAILABLE;
    }
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "%s() successfully obtained message queue \n", kAttachSignature);
    queue.tavo_android_msg_queue_set_fd(read_end);
    queue.tavo_android_msg_queue_set_write_fd(write_end);
    return TAVO_SUCCESS;
}

}  // namespace

TAVO_Status tavo_android_msg_queue_init(TAVO_INT64* piMqId) {
    TAVO_TRACE_SCOPE(kTag);
    if (piMqId == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid pointer passed piMqId\n");
        return TAVO_MQ_INVALID_POINTER;
    }
    auto* queue = new (std::nothrow) TAVO_MessageQueue;
    if (queue == nullptr) {
        *piMqId = -1;
        return TAVO_MQ_FAILURE;
    }
    *piMqId = handle_of(queue);
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Message queue object returned: %d\n", static_cast<int>(*piMqId));
    return TAVO_SUCCESS;
}

TAVO_Status tavo_msg_queue_sender_init(TAVO_CHAR* pcServiceName, TAVO_INT64* piMqId) {
    TAVO_TRACE_SCOPE(kTag);
    if (pcServiceName == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid pointer passed pcServiceName\n");
        return TAVO_MQ_INVALID_POINTER;
    }
    if (piMqId == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid pointer passed piMqId\n");
        return TAVO_MQ_INVALID_POINTER;
    }
    const sp<ITavoBinder> service = tavo_osal_get_service(pcServiceName);
    if (service == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "tavo_osal_get_service() failed\n");
        return kServiceUnreachable;
    }
    const int key = key_of(pcServiceName);
    Use use(service, key);
    std::unique_ptr<TAVO_MessageQueue> queue(new (std::nothrow) TAVO_MessageQueue);
    if (queue == nullptr) return TAVO_NO_MEMORY;
    // Without a temporary pipe there is nothing for the received descriptors, or the destructor, to close.
    if (!queue->has_pipe()) queue->disown_descriptors();
    const TAVO_Status status = connect(*queue, service, key);
    if (status != TAVO_SUCCESS) return status;
    queue->tavo_android_msg_queue_set_service_name(reinterpret_cast<unsigned char*>(pcServiceName));
    *piMqId = handle_of(queue.get());
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Message queue object returned: addr %p  :  service %s\n",
             static_cast<void*>(queue.get()), pcServiceName);
    static_cast<void>(queue.release());  // the handle's now
    use.keep();
    return TAVO_SUCCESS;
}

TAVO_Status tavo_msg_queue_put(TAVO_INT64 iMqId, unsigned char* pbMsg, unsigned int uiSize) {
    TAVO_TRACE_SCOPE(kTag);
    const TAVO_Status status = queue_of(iMqId)->tavo_android_msg_queue_put(pbMsg, uiSize);
    if (status >= 0) return status;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "Message send on MQ failed. errno is 0x%x.\n", static_cast<unsigned>(errno));
    return transfer_failure(status);
}

TAVO_Status tavo_msg_queue_get(TAVO_INT64 iMqId, unsigned char* pbMsg, unsigned int* puiSize) {
    TAVO_TRACE_SCOPE(kTag);
    const int32_t size = queue_of(iMqId)->tavo_android_msg_queue_get(pbMsg, puiSize);
    if (size >= 0) {
        *puiSize = static_cast<unsigned int>(size);
        return TAVO_SUCCESS;
    }
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "Receive message from MQ failed. errno is 0x%x.\n", static_cast<unsigned>(errno));
    return transfer_failure(TAVO_MQ_FAILURE);
}

TAVO_Status tavo_msg_queue_destroy(TAVO_INT64 iMqId) {
    TAVO_TRACE_SCOPE(kTag);
    if (iMqId <= 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Message queue id can't be less than or equal to zero \n");
        return TAVO_FAILURE;
    }
    TAVO_MessageQueue* queue = queue_of(iMqId);
    char name[sizeof queue->acServiceName + 1] = {};
    memcpy(name, queue->tavo_android_msg_queue_get_service_name(), sizeof queue->acServiceName);
    const sp<ITavoBinder> service = tavo_osal_get_service(name);
    if (service == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "tavo_osal_get_service() failed\n");
        return TAVO_FAILURE;
    }
    service->delete_message_queue(key_of(name));
    delete queue;
    return TAVO_SUCCESS;
}

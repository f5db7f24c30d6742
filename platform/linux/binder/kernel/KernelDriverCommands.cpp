// What the kernel tells this process: transactions of others', who holds its objects, and who died.
#include <android/log.h>
#include <binder/Parcel.h>
#include <unistd.h>

#include <cstring>
#include <utility>
#include <vector>

#include "../Forked.h"
#include "KernelDriver.h"

namespace android::kernel_driver {
namespace {

constexpr char kTag[] = "BinderKernel";
// How deep calls may be nested on one thread. Others decide how often they call back before they answer, so
// something must keep them from using up the stack.
constexpr size_t kMaxDepth = 256;
// A buffer of this size is a part of what all calls may take that somebody will miss.
constexpr size_t kLargeBuffer = size_t{64} * 1024;

template <typename T>
T* pointer(binder_uintptr_t value) {
    return reinterpret_cast<T*>(static_cast<uintptr_t>(value));
}

// The kernel opens descriptors for a process that receives some, and leaves it to close them.
std::vector<UniqueFd> descriptorsIn(const uint8_t* data, size_t size, const binder_size_t* objects, size_t count) {
    std::vector<UniqueFd> descriptors;
    for (size_t i = 0; i < count; ++i) {
        flat_binder_object object;
        if (objects[i] > size || size - objects[i] < sizeof object) continue;
        memcpy(&object, data + objects[i], sizeof object);
        if (object.hdr.type == BINDER_TYPE_FD) descriptors.emplace_back(static_cast<int>(object.handle));
    }
    return descriptors;
}

}  // namespace

// Answers a transaction, with a failure if a program ends the thread that runs it: the caller is not to take
// the whole process for dead.
class KernelDriver::Answer {
public:
    Answer(KernelDriver& driver, Conversation& thread, bool isWanted)
        : driver_(driver), thread_(thread), isWanted_(isWanted) {}
    ~Answer() {
        if (isWanted_) send(FAILED_TRANSACTION, Parcel());
    }
    Answer(const Answer&) = delete;
    Answer& operator=(const Answer&) = delete;

    // Returns when the kernel has the reply: until then its objects need their references.
    void send(status_t status, const Parcel& reply) {
        if (!std::exchange(isWanted_, false)) return;
        if (status == OK) status = reply.errorCheck();
        binder_transaction_data answer = {};
        if (status == OK) {
            answer.data_size = reply.ipcDataSize();
            answer.data.ptr.buffer = reply.ipcData();
            answer.offsets_size = reply.ipcObjectsCount() * sizeof(binder_size_t);
            answer.data.ptr.offsets = reply.ipcObjects();
        } else {
            answer.flags = TF_STATUS_CODE;
            answer.data_size = sizeof status;
            answer.data.ptr.buffer = reinterpret_cast<uintptr_t>(&status);
        }
        const uint64_t mark = thread_.queue.mark();
        thread_.queue.add<BC_REPLY>(answer);
        // Whatever became of it: the caller has been told by the kernel.
        driver_.await(thread_, Outcome::kTaken, nullptr);
        thread_.queue.takeBack<BC_REPLY>(mark);
    }

private:
    KernelDriver& driver_;
    Conversation& thread_;
    bool isWanted_;
};

void KernelDriver::handle(Conversation& thread, const Command& command) {
    switch (command.code()) {
        case BR_TRANSACTION: serve(thread, command.payload<binder_transaction_data>()); break;
        case BR_TRANSACTION_SEC_CTX:
            serve(thread, command.payload<binder_transaction_data_secctx>().transaction_data);
            break;
        // An answer that nobody waits for.
        case BR_REPLY: takeReply(command.payload<binder_transaction_data>(), nullptr); break;

        case BR_INCREFS: {
            const auto object = command.payload<binder_ptr_cookie>();
            if (object.ptr != 0) pointer<RefBase::weakref_type>(object.ptr)->incWeak(this);
            thread.queue.add<BC_INCREFS_DONE>(object);
            thread.owesAnswers = true;
            break;
        }
        case BR_ACQUIRE: {
            const auto object = command.payload<binder_ptr_cookie>();
            if (object.cookie != 0) pointer<BBinder>(object.cookie)->incStrong(this);
            thread.queue.add<BC_ACQUIRE_DONE>(object);
            thread.owesAnswers = true;
            break;
        }
        case BR_RELEASE: {
            const auto object = command.payload<binder_ptr_cookie>();
            if (object.cookie != 0) thread.strongReferences.push_back(pointer<BBinder>(object.cookie));
            break;
        }
        case BR_DECREFS: {
            const auto object = command.payload<binder_ptr_cookie>();
            if (object.ptr != 0) thread.weakReferences.push_back(pointer<RefBase::weakref_type>(object.ptr));
            break;
        }

        case BR_DEAD_BINDER: tellOfDeath(thread, command.payload<binder_uintptr_t>()); break;
        case BR_SPAWN_LOOPER: startThread(); break;

        // The outcome of what nobody waits for, and what no kernel says.
        case BR_NOOP:
        case BR_OK:
        case BR_ERROR:
        case BR_FINISHED:
        case BR_ACQUIRE_RESULT:
        case BR_ATTEMPT_ACQUIRE:
        case BR_DEAD_REPLY:
        case BR_FAILED_REPLY:
        case BR_FROZEN_REPLY:
        case BR_TRANSACTION_COMPLETE:
        case BR_ONEWAY_SPAM_SUSPECT:
        case BR_CLEAR_DEATH_NOTIFICATION_DONE:
        case kBrTransactionPendingFrozen: break;
        default:
            __android_log_print(ANDROID_LOG_WARN, kTag, "The driver said something unknown: %#x", command.code());
            break;
    }
}

void KernelDriver::receive(const binder_transaction_data& transaction, Parcel& parcel, Parcel::release_func giveBack) {
    parcel.ipcSetDataReference(pointer<const uint8_t>(transaction.data.ptr.buffer),
                               static_cast<size_t>(transaction.data_size),
                               pointer<const binder_size_t>(transaction.data.ptr.offsets),
                               static_cast<size_t>(transaction.offsets_size / sizeof(binder_size_t)), giveBack, this);
}

void KernelDriver::releaseReply(Parcel* parcel, const uint8_t* data, size_t size, const binder_size_t* objects,
                                size_t count, void* driver) {
    // The kernel does not let copies have the memory.
    if (isForked()) return;
    descriptorsIn(data, size, objects, count).clear();
    releaseMemory(parcel, data, size, objects, count, driver);
}

void KernelDriver::releaseMemory(Parcel*, const uint8_t* data, size_t size, const binder_size_t*, size_t count,
                                 void* driver) {
    if (isForked()) return;
    auto& self = *static_cast<KernelDriver*>(driver);
    Conversation& thread = self.self();
    thread.queue.add<BC_FREE_BUFFER>(binder_uintptr_t{reinterpret_cast<uintptr_t>(data)});
    // As long as the kernel has it, others' objects in it are held.
    if (count > 0 || size >= kLargeBuffer) self.flushUnlessSoon(thread);
}

void KernelDriver::serve(Conversation& thread, const binder_transaction_data& transaction) {
    const RunningCalls::Call running(running_);
    Parcel data;
    receive(transaction, data, releaseMemory);
    // The reply may hold descriptors that came with the request.
    const std::vector<UniqueFd> descriptors = descriptorsIn(
        data.data(), data.dataSize(), reinterpret_cast<const binder_size_t*>(data.ipcObjects()), data.objectsCount());
    Answer answer(*this, thread, (transaction.flags & TF_ONE_WAY) == 0);
    Parcel reply;
    const status_t status = run(thread, transaction, data, reply);
    // Before the caller, once it has its reply, sends as much again.
    data.freeData();
    answer.send(status, reply);
}

status_t KernelDriver::run(Conversation& thread, const binder_transaction_data& transaction, const Parcel& data,
                           Parcel& reply) {
    struct Deeper {
        size_t& depth;
        explicit Deeper(size_t& counter) : depth(counter) { ++depth; }
        ~Deeper() { --depth; }
    };
    const sp<BBinder> target = targetOf(transaction);
    if (target == nullptr || thread.depth >= kMaxDepth) return FAILED_TRANSACTION;
    const Deeper deeper(thread.depth);
    const Caller caller{transaction.sender_pid, transaction.sender_euid};
    return process_.execute(target, caller, transaction.code, data, &reply, transaction.flags);
}

sp<BBinder> KernelDriver::targetOf(const binder_transaction_data& transaction) {
    if (transaction.target.ptr == 0) {
        const std::lock_guard<std::mutex> lock(contextMutex_);
        return context_;
    }
    auto* block = pointer<RefBase::weakref_type>(transaction.target.ptr);
    if (!block->attemptIncStrong(this)) return nullptr;
    const sp<BBinder> target = pointer<BBinder>(transaction.cookie);
    target->decStrong(this);
    return target;
}

void KernelDriver::tellOfDeath(Conversation& thread, uint64_t cookie) {
    const RunningCalls::Call running(running_);
    Handles::Death death;
    const bool isWanted = handles_.died(cookie, death);
    const sp<BpBinder> proxy = isWanted ? death.mourner.promote() : nullptr;
    if (isWanted) takeBackNotification(thread, death.handle, cookie);
    thread.queue.add<BC_DEAD_BINDER_DONE>(binder_uintptr_t{cookie});
    if (proxy != nullptr) proxy->sendObituary();
}

}  // namespace android::kernel_driver

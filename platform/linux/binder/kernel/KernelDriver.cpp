#include "KernelDriver.h"

#include <android/log.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "../Forked.h"

namespace android {

bool isKernelDriverThere() { return kernel_driver::Device::isThere(); }

std::unique_ptr<Driver> openKernelDriver(Driver::Process& process) {
    auto driver = std::make_unique<kernel_driver::KernelDriver>(process);
    if (!driver->open()) return nullptr;
    return driver;
}

namespace kernel_driver {
namespace {

constexpr char kTag[] = "BinderKernel";
constexpr std::chrono::milliseconds kQuiesceLimit{1000};
constexpr std::chrono::milliseconds kBetweenTries{100};

// The calling thread's. Trivially destroyed, so that it can be used until the very end of a thread: what it points to
// goes with the thread's key, after everything that C++ destroys.
thread_local Conversation* t_conversation = nullptr;

void logFailure(const char* what, int error) {
    __android_log_print(ANDROID_LOG_ERROR, kTag, "%s failed: %s", what, strerror(error));
}

}  // namespace

KernelDriver::~KernelDriver() {
    if (!hasKey_) return;
    if (t_conversation != nullptr && &t_conversation->driver == this) {
        pthread_setspecific(key_, nullptr);
        delete std::exchange(t_conversation, nullptr);
    }
    pthread_key_delete(key_);
}

bool KernelDriver::open() {
    watchForForks();
    const int error = pthread_key_create(&key_, endThread);
    if (error != 0) logFailure("pthread_key_create", error);
    hasKey_ = error == 0;
    return hasKey_ && device_.open();
}

// -- Threads

Conversation& KernelDriver::self() {
    if (t_conversation == nullptr) {
        auto made = std::make_unique<Conversation>(*this);
        pthread_setspecific(key_, made.get());
        t_conversation = made.release();
    }
    return *t_conversation;
}

void KernelDriver::endThread(void* conversation) {
    const std::unique_ptr<Conversation> ended(static_cast<Conversation*>(conversation));
    if (!isForked()) {
        KernelDriver& driver = ended->driver;
        // A program that left a call has not unwound it if it ended the thread by other means.
        ended->depth = 0;
        driver.settle(*ended);
        driver.flush(*ended);
        driver.device_.endThread();
    }
    t_conversation = nullptr;
}

// A thread of the pool, for as long as this lives.
class KernelDriver::Membership {
public:
    Membership(KernelDriver& driver, Conversation& thread) : driver_(driver), thread_(thread) {
        thread_.isPooled = true;
    }
    ~Membership() {
        thread_.isPooled = false;
        if (std::exchange(thread_.isRegistered, false)) thread_.queue.add<BC_EXIT_LOOPER>();
        driver_.flush(thread_);
        // The program has ended it in the middle of a call. The kernel does not learn to count backwards.
        if (isOver) return;
        ++driver_.freePlaces_;
        driver_.startThread();
    }
    Membership(const Membership&) = delete;
    Membership& operator=(const Membership&) = delete;

    // It goes in order, and for good.
    bool isOver = false;

private:
    KernelDriver& driver_;
    Conversation& thread_;
};

void KernelDriver::joinThreadPool(bool isMain) {
    // It would take what is sent to the process it was copied from.
    if (isForked()) return;
    Conversation& thread = self();
    Membership membership(*this, thread);
    // Only threads that the kernel has asked for may say that it did.
    bool isAskedFor = !isMain;
    for (size_t free = freePlaces_; isAskedFor && free > 0;) {
        if (freePlaces_.compare_exchange_weak(free, free - 1)) isAskedFor = false;
    }
    for (;;) {
        if (!std::exchange(thread.isRegistered, true)) {
            if (isAskedFor) {
                thread.queue.add<BC_REGISTER_LOOPER>();
            } else {
                thread.queue.add<BC_ENTER_LOOPER>();
            }
            isAskedFor = false;
        }
        settle(thread);
        startOwedThread();
        Command command;
        const int error = thread.next(device_, command);
        if (error == EPROTO) {
            logFailure("Reading what the driver says", error);
        } else if (error != 0) {
            logFailure("BINDER_WRITE_READ", error);
            membership.isOver = true;
            return;
        } else {
            handle(thread, command);
        }
    }
}

void KernelDriver::startThread() {
    if (process_.spawnPooledThread()) return;
    triedLast_ = std::chrono::steady_clock::now().time_since_epoch().count();
    ++owed_;
}

// The kernel asks for one thread at a time, and for no other until that one is there.
void KernelDriver::startOwedThread() {
    if (owed_ == 0) return;
    const std::chrono::steady_clock::duration last(triedLast_);
    if (std::chrono::steady_clock::now().time_since_epoch() - last < kBetweenTries) return;
    for (size_t owed = owed_; owed > 0;) {
        if (!owed_.compare_exchange_weak(owed, owed - 1)) continue;
        startThread();
        return;
    }
}

void KernelDriver::flush(Conversation& thread) {
    const int error = thread.flush(device_);
    if (error != 0) logFailure("BINDER_WRITE_READ", error);
}

// Nobody knows when a thread that is the program's own will next have to do with the driver.
void KernelDriver::flushUnlessSoon(Conversation& thread) {
    if (!thread.isPooled && thread.depth == 0) flush(thread);
}

// The kernel may have taken what it will answer some time: the thread must not take that for an answer to what it asks
// next. So it becomes a new one.
void KernelDriver::abandon(Conversation& thread, int error) {
    logFailure("BINDER_WRITE_READ", error);
    thread.startAnew();
    device_.endThread();
}

void KernelDriver::settle(Conversation& thread) {
    if (thread.depth > 0 || !thread.reader.atEnd()) return;
    if (thread.strongReferences.empty() && thread.weakReferences.empty()) return;
    const RunningCalls::Call running(running_);
    // What goes away may give up others, and lead to more news.
    while (!thread.strongReferences.empty() || !thread.weakReferences.empty()) {
        for (const BBinder* object : std::exchange(thread.strongReferences, {})) object->decStrong(this);
        for (RefBase::weakref_type* block : std::exchange(thread.weakReferences, {})) block->decWeak(this);
    }
}

void KernelDriver::setMaxThreads(size_t count) {
    if (isForked()) return;
    const int error = device_.setMaxThreads(count > UINT32_MAX ? UINT32_MAX : static_cast<uint32_t>(count));
    if (error != 0) logFailure("BINDER_SET_MAX_THREADS", error);
}

void KernelDriver::flushCommands() {
    if (!isForked()) flush(self());
}

void KernelDriver::quiesce() {
    if (!isForked()) running_.stop(kQuiesceLimit);
}

// -- Calling

status_t KernelDriver::transact(int32_t handle, uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    if (isForked()) return INVALID_OPERATION;
    if (reply != nullptr) reply->freeData();
    Conversation& thread = self();

    binder_transaction_data transaction = {};
    transaction.target.handle = static_cast<uint32_t>(handle);
    transaction.code = code;
    transaction.flags = flags | TF_ACCEPT_FDS;
    transaction.data_size = data.ipcDataSize();
    transaction.data.ptr.buffer = data.ipcData();
    transaction.offsets_size = data.ipcObjectsCount() * sizeof(binder_size_t);
    transaction.data.ptr.offsets = data.ipcObjects();

    const uint64_t mark = thread.queue.mark();
    thread.queue.add<BC_TRANSACTION>(transaction);
    const bool oneway = (flags & TF_ONE_WAY) != 0;
    bool isDead = false;
    status_t status = await(thread, oneway ? Outcome::kTaken : Outcome::kReply, reply, &isDead);
    // Its parcel is the caller's again.
    thread.queue.takeBack<BC_TRANSACTION>(mark);
    if (isDead) handles_.markDead(handle);
    if (status == FAILED_TRANSACTION && handle != 0 && !handles_.isKnown(handle)) status = BAD_TYPE;
    settle(thread);
    if (std::exchange(thread.owesAnswers, false)) flushUnlessSoon(thread);
    return status;
}

status_t KernelDriver::await(Conversation& thread, Outcome awaited, Parcel* reply, bool* isDead) {
    for (const size_t generation = thread.generation; generation == thread.generation;) {
        Command command;
        const int error = thread.next(device_, command);
        if (error != 0) {
            abandon(thread, error);
            break;
        }
        switch (command.code()) {
            case BR_ONEWAY_SPAM_SUSPECT:
                __android_log_print(ANDROID_LOG_WARN, kTag, "This process sends more oneway calls than are served");
                [[fallthrough]];
            case BR_TRANSACTION_COMPLETE:
            case kBrTransactionPendingFrozen:
                if (awaited == Outcome::kTaken) return OK;
                break;
            case BR_REPLY: {
                const auto transaction = command.payload<binder_transaction_data>();
                if (awaited == Outcome::kReply) return takeReply(transaction, reply);
                // Nobody waits for it, but what it brings along is there.
                takeReply(transaction, nullptr);
                break;
            }
            case BR_DEAD_REPLY:
                if (isDead != nullptr) *isDead = true;
                return DEAD_OBJECT;
            case BR_FAILED_REPLY:
            case BR_FROZEN_REPLY:
            case BR_ERROR: return FAILED_TRANSACTION;
            default: handle(thread, command);
        }
    }
    return FAILED_TRANSACTION;
}

status_t KernelDriver::takeReply(const binder_transaction_data& transaction, Parcel* reply) {
    Parcel unwanted;
    const bool isStatus = (transaction.flags & TF_STATUS_CODE) != 0;
    Parcel& target = reply != nullptr && !isStatus ? *reply : unwanted;
    receive(transaction, target, releaseReply);
    if (!isStatus) return OK;
    int32_t status = OK;
    return unwanted.readInt32(&status) == OK ? status : status_t{FAILED_TRANSACTION};
}

// -- References

// Handle 0 means the service manager, whether there is one or not: the kernel looks for it every time.

void KernelDriver::acquire(int32_t handle) {
    if (isForked() || !handles_.acquire(handle) || handle == 0) return;
    Conversation& thread = self();
    thread.queue.add<BC_INCREFS>(static_cast<uint32_t>(handle));
    thread.queue.add<BC_ACQUIRE>(static_cast<uint32_t>(handle));
    // At once: another thread may be given the handle and give it back before this one has anything else to say.
    flush(thread);
}

void KernelDriver::release(int32_t handle) {
    if (isForked()) return;
    const Handles::Released released = handles_.release(handle);
    if (!released.isLast) return;
    Conversation& thread = self();
    if (released.cookie != Handles::kNone) takeBackNotification(thread, handle, released.cookie);
    if (handle != 0) {
        thread.queue.add<BC_RELEASE>(static_cast<uint32_t>(handle));
        thread.queue.add<BC_DECREFS>(static_cast<uint32_t>(handle));
    }
    flushUnlessSoon(thread);
}

status_t KernelDriver::requestDeathNotification(int32_t handle, const wp<BpBinder>& proxy) {
    if (isForked()) return INVALID_OPERATION;
    uint64_t cookie = Handles::kNone;
    const status_t status = handles_.mourn(handle, proxy, cookie);
    if (status != OK || cookie == Handles::kNone) return status;
    Conversation& thread = self();
    if (handle == 0) thread.queue.add<BC_INCREFS>(uint32_t{0});
    thread.queue.add<BC_REQUEST_DEATH_NOTIFICATION>(binder_handle_cookie{static_cast<uint32_t>(handle), cookie});
    flush(thread);
    return OK;
}

status_t KernelDriver::clearDeathNotification(int32_t handle) {
    if (isForked()) return INVALID_OPERATION;
    if (!handles_.isKnown(handle)) return BAD_TYPE;
    const uint64_t cookie = handles_.forget(handle);
    if (cookie == Handles::kNone) return OK;
    Conversation& thread = self();
    takeBackNotification(thread, handle, cookie);
    flush(thread);
    return OK;
}

void KernelDriver::takeBackNotification(Conversation& thread, int32_t handle, uint64_t cookie) {
    thread.queue.add<BC_CLEAR_DEATH_NOTIFICATION>(binder_handle_cookie{static_cast<uint32_t>(handle), cookie});
    if (handle == 0) thread.queue.add<BC_DECREFS>(uint32_t{0});
}

// -- The service manager

sp<IBinder> KernelDriver::contextObject() {
    {
        const std::lock_guard<std::mutex> lock(contextMutex_);
        if (context_ != nullptr) return context_;
    }
    return ProcessState::self()->getStrongProxyForHandle(0);
}

status_t KernelDriver::becomeContextManager(const sp<BBinder>& object) {
    if (isForked()) return INVALID_OPERATION;
    if (object == nullptr) return BAD_VALUE;
    const std::lock_guard<std::mutex> lock(contextMutex_);
    if (context_ != nullptr) return ALREADY_EXISTS;
    const int error = device_.becomeContextManager();
    if (error != 0) return error == EBUSY ? status_t{ALREADY_EXISTS} : -error;
    context_ = object;
    return OK;
}

}  // namespace kernel_driver
}  // namespace android

#include "test_service.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <thread>
#include <utility>

namespace tavo::test {

using namespace android;

bool is_kernel_driver() {
    const char* driver = getenv("BINDER_DRIVER");
    return driver != nullptr && strcmp(driver, "kernel") == 0;
}

TestService::~TestService() { --count_; }

status_t TestService::onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    switch (code) {
        case kEcho: return reply->appendFrom(&data, 0, data.dataSize());
        case kCallerIds:
            reply->writeInt32(IPCThreadState::self()->getCallingPid());
            return reply->writeInt32(static_cast<int32_t>(IPCThreadState::self()->getCallingUid()));
        case kThreadId: return reply->writeInt32(gettid());
        case kBlock: {
            const int entered = data.readFileDescriptor();
            const int closed = data.readFileDescriptor();
            char byte = 0;
            if (write(entered, &byte, 1) != 1) return UNKNOWN_ERROR;
            while (read(closed, &byte, 1) < 0 && errno == EINTR) {
            }
            return reply->writeInt32(0);
        }
        case kRelay: return relay(data, reply, flags);
        case kOpenPipe: {
            int ends[2];
            if (pipe2(ends, O_CLOEXEC) != 0) return UNKNOWN_ERROR;
            reply->writeFileDescriptor(ends[0], true);
            return reply->writeFileDescriptor(ends[1], true);
        }
        case kReplyDescriptor: {
            const int descriptor = data.readInt32();
            const std::vector<uint8_t> bytes(static_cast<size_t>(data.readInt32()), 7);
            reply->write(bytes.data(), bytes.size());
            return reply->writeFileDescriptor(descriptor);
        }
        case kBytes: {
            const std::vector<uint8_t> bytes(static_cast<size_t>(data.readInt32()), 5);
            return reply->write(bytes.data(), bytes.size());
        }
        case kAppend: {
            const int32_t number = data.readInt32();
            std::this_thread::sleep_for(std::chrono::milliseconds(data.readInt32()));
            const std::lock_guard<std::mutex> lock(mutex_);
            appended_.push_back(number);
            return reply->writeInt32(0);
        }
        case kAppended: {
            const std::lock_guard<std::mutex> lock(mutex_);
            reply->writeInt32(static_cast<int32_t>(appended_.size()));
            return reply->write(appended_.data(), appended_.size() * sizeof(int32_t));
        }
        case kPublish: {
            const String16 name = data.readString16();
            return reply->writeInt32(defaultServiceManager()->addService(name, data.readStrongBinder()));
        }
        case kCheck: return reply->writeStrongBinder(defaultServiceManager()->checkService(data.readString16()));
        case kEndThread: pthread_exit(nullptr);
        case kExit: exit(0);
        default: return onObject(code, data, reply);
    }
}

status_t TestService::onObject(uint32_t code, const Parcel& data, Parcel* reply) {
    const std::lock_guard<std::mutex> lock(mutex_);
    switch (code) {
        case kPingPong: {
            const int32_t depth = data.readInt32();
            const sp<IBinder> other = data.readStrongBinder();
            if (depth == 0) return reply->writeInt32(0);
            // Not locked while calling out.
            mutex_.unlock();
            Parcel request, answer;
            request.writeInt32(depth - 1);
            request.writeStrongBinder(this);
            const status_t status = other->transact(kPingPong, request, &answer);
            mutex_.lock();
            return status == OK ? reply->writeInt32(answer.readInt32() + 1) : status;
        }
        case kKeep: kept_ = data.readStrongBinder(); return reply->writeInt32(0);
        case kKept: return reply->writeStrongBinder(kept_);
        case kTakeKept: return reply->writeStrongBinder(std::exchange(kept_, nullptr));
        case kIsKept: return reply->writeInt32(data.readStrongBinder() == kept_);
        case kIsKeptNamed: {
            const sp<IBinder> kept = kept_;
            mutex_.unlock();
            const sp<IBinder> found = defaultServiceManager()->checkService(data.readString16());
            mutex_.lock();
            return reply->writeInt32(found == kept);
        }
        case kPassKept: {
            Parcel request;
            request.writeStrongBinder(std::exchange(kept_, nullptr));
            return data.readStrongBinder()->transact(kKeep, request, reply);
        }
        case kIsThis: return reply->writeInt32(data.readStrongBinder() == this);
        case kCallKept: {
            const sp<IBinder> kept = kept_;
            mutex_.unlock();
            const auto inner = static_cast<uint32_t>(data.readInt32());
            Parcel request;
            request.appendFrom(&data, data.dataPosition(), data.dataAvail());
            const status_t status = kept->transact(inner, request, reply);
            mutex_.lock();
            return status;
        }
        case kPingKept: {
            const sp<IBinder> kept = kept_;
            mutex_.unlock();
            const status_t status = kept->pingBinder();
            mutex_.lock();
            return reply->writeInt32(status);
        }
        case kWatchKept: watcher_ = new Watcher; return reply->writeInt32(kept_->linkToDeath(watcher_));
        case kDeaths: return reply->writeInt32(watcher_->deaths);
        default: return BBinder::onTransact(code, data, reply, 0);
    }
}

status_t TestService::relay(const Parcel& data, Parcel* reply, uint32_t flags) {
    const auto code = static_cast<uint32_t>(data.readInt32());
    const int32_t count = data.readInt32();
    if (count == 0) return onTransact(code, data, reply, flags);
    const sp<IBinder> next = data.readStrongBinder();
    Parcel request;
    request.writeInt32(static_cast<int32_t>(code));
    request.writeInt32(count - 1);
    for (int32_t i = 1; i < count; ++i) request.writeStrongBinder(data.readStrongBinder());
    return next->transact(kRelay, request, reply);
}

Gate::Gate() {
    if (pipe2(entered_, O_CLOEXEC) != 0 || pipe2(closed_, O_CLOEXEC) != 0) abort();
}

Gate::~Gate() {
    open();
    close(entered_[0]);
    close(entered_[1]);
    close(closed_[0]);
}

status_t Gate::call(const sp<IBinder>& service, uint32_t flags) const {
    Parcel data, reply;
    write_to(data);
    return service->transact(TestService::kBlock, data, &reply, flags);
}

status_t Gate::call_kept(const sp<IBinder>& service) const {
    Parcel data, reply;
    data.writeInt32(TestService::kBlock);
    write_to(data);
    return service->transact(TestService::kCallKept, data, &reply);
}

void Gate::write_to(Parcel& data) const {
    data.writeFileDescriptor(entered_[1]);
    data.writeFileDescriptor(closed_[0]);
}

bool Gate::wait_for(int count) const {
    for (int i = 0; i < count; ++i) {
        pollfd entered{entered_[0], POLLIN, 0};
        char byte = 0;
        if (poll(&entered, 1, 10000) != 1 || read(entered_[0], &byte, 1) != 1) return false;
    }
    return true;
}

bool Gate::is_quiet() const {
    pollfd entered{entered_[0], POLLIN, 0};
    return poll(&entered, 1, 0) == 0;
}

void Gate::open() {
    if (closed_[1] >= 0) close(std::exchange(closed_[1], -1));
}

namespace {

TEST_ROLE(server) {
    ProcessState::self()->setThreadPoolMaxThreadCount(static_cast<size_t>(atoi(arguments[1].c_str())));
    if (defaultServiceManager()->addService(String16(arguments[0].c_str()), new TestService) != OK) return 1;
    ProcessState::self()->startThreadPool();
    puts("ready");
    IPCThreadState::self()->joinThreadPool();
    return 0;
}

}  // namespace

Process start_server(const std::string& name, size_t max_threads) {
    Process server = Process::start("server", {name, std::to_string(max_threads)});
    EXPECT_EQ(server.read_line(), "ready");
    return server;
}

sp<IBinder> find_service(const std::string& name) {
    return defaultServiceManager()->checkService(String16(name.c_str()));
}

int32_t ask(const sp<IBinder>& service, uint32_t code, const Parcel& data) {
    Parcel reply;
    const status_t status = service->transact(code, data, &reply);
    EXPECT_EQ(status, OK) << "of code " << code;
    return status == OK ? reply.readInt32() : -1000;
}

int32_t ask(const sp<IBinder>& service, uint32_t code) { return ask(service, code, Parcel()); }

int32_t ask(const sp<IBinder>& service, uint32_t code, const sp<IBinder>& object) {
    Parcel data;
    data.writeStrongBinder(object);
    return ask(service, code, data);
}

sp<IBinder> ask_for_object(const sp<IBinder>& service, uint32_t code) {
    Parcel reply;
    EXPECT_EQ(service->transact(code, Parcel(), &reply), OK);
    return reply.readStrongBinder();
}

size_t count_threads_named(pid_t pid, const std::string& start) {
    const std::string path = "/proc/" + std::to_string(pid) + "/task";
    const std::unique_ptr<DIR, int (*)(DIR*)> tasks(opendir(path.c_str()), closedir);
    size_t count = 0;
    while (const dirent* task = tasks != nullptr ? readdir(tasks.get()) : nullptr) {
        std::string name;
        std::getline(std::ifstream(path + "/" + task->d_name + "/comm"), name);
        count += name.rfind(start, 0) == 0;
    }
    return count;
}

void start_pool(size_t max_threads) {
    ProcessState::self()->setThreadPoolMaxThreadCount(max_threads);
    ProcessState::self()->startThreadPool();
}

}  // namespace tavo::test

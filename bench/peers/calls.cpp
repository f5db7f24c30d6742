// Calls: a request to another process, and its answer with as many bytes. A bare socket, sd-bus and binder.
#include <binder/Binder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <thread>

#include "message.h"

namespace tavo::peers {
namespace {

constexpr size_t kSizes[] = {0, 64, 4096, 65536};

// --- a bare socket: a length, then the bytes

class SocketParty : public Party {
public:
    SocketParty(int socket, size_t size, bool answers)
        : socket_(socket), messages_(size), answers_(answers), out_(sizeof(uint32_t) + size), in_(out_.size()) {}

    void run(size_t operations) override {
        for (; operations > 0; --operations) {
            if (!answers_) send();
            receive();
            if (answers_) send();
        }
    }
    Tally tally() override { return messages_.tally(); }

private:
    void send() {
        const auto length = static_cast<uint32_t>(messages_.size());
        memcpy(out_.data(), &length, sizeof length);
        messages_.write(out_.data() + sizeof length);
        for (size_t done = 0; done < out_.size();) {
            const ssize_t count = ::send(socket_, out_.data() + done, out_.size() - done, MSG_NOSIGNAL);
            if (count <= 0) fail("send");
            done += static_cast<size_t>(count);
        }
    }
    void receive() {
        // Nothing can be behind the one message, so all of it may be asked for at once.
        for (size_t done = 0; done < in_.size();) {
            const ssize_t count = recv(socket_, in_.data() + done, in_.size() - done, 0);
            if (count <= 0) fail("recv");
            done += static_cast<size_t>(count);
        }
        uint32_t length = 0;
        memcpy(&length, in_.data(), sizeof length);
        messages_.come({in_.data() + sizeof length, length});
    }

    const int socket_;
    Messages messages_;
    const bool answers_;
    std::vector<unsigned char> out_;
    std::vector<unsigned char> in_;
};

class SocketPair {
public:
    SocketPair() {
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends_) != 0) fail("socketpair");
    }
    ~SocketPair() {
        close(ends_[0]);
        close(ends_[1]);
    }
    SocketPair(const SocketPair&) = delete;
    SocketPair& operator=(const SocketPair&) = delete;

    int operator[](size_t end) const { return ends_[end]; }

private:
    int ends_[2];
};

class SocketSetting : public Setting {
public:
    explicit SocketSetting(size_t size) : size_(size) {}
    std::unique_ptr<Party> driver() override { return std::make_unique<SocketParty>(ends_[0], size_, false); }
    std::unique_ptr<Party> partner() override { return std::make_unique<SocketParty>(ends_[1], size_, true); }

private:
    const SocketPair ends_;
    const size_t size_;
};

// --- sd-bus, with no bus in between: the two processes are each other's only peers

void bus_must(int result, const char* what) {
    if (result >= 0) return;
    errno = -result;
    fail(what);
}

constexpr char kPath[] = "/bench";
constexpr char kInterface[] = "bench.Answer";
constexpr char kMethod[] = "Answer";

void append(sd_bus_message* message, Messages& messages) {
    void* space = nullptr;
    bus_must(sd_bus_message_append_array_space(message, 'y', messages.size(), &space), "sd_bus_message_append_array");
    messages.write(static_cast<unsigned char*>(space));
}

void take(sd_bus_message* message, Messages& messages) {
    const void* bytes = nullptr;
    size_t size = 0;
    bus_must(sd_bus_message_read_array(message, 'y', &bytes, &size), "sd_bus_message_read_array");
    messages.come({static_cast<const unsigned char*>(bytes), size});
}

class BusCaller : public Party {
public:
    BusCaller(int socket, size_t size) : messages_(size) {
        bus_must(sd_bus_new(&bus_), "sd_bus_new");
        bus_must(sd_bus_set_fd(bus_, dup(socket), dup(socket)), "sd_bus_set_fd");
        bus_must(sd_bus_start(bus_), "sd_bus_start");
    }
    ~BusCaller() override { sd_bus_close_unref(bus_); }

    void run(size_t operations) override {
        for (; operations > 0; --operations) {
            sd_bus_message* request = nullptr;
            sd_bus_message* reply = nullptr;
            bus_must(sd_bus_message_new_method_call(bus_, &request, nullptr, kPath, kInterface, kMethod),
                     "sd_bus_message_new_method_call");
            append(request, messages_);
            bus_must(sd_bus_call(bus_, request, 0, nullptr, &reply), "sd_bus_call");
            take(reply, messages_);
            sd_bus_message_unref(reply);
            sd_bus_message_unref(request);
        }
    }
    Tally tally() override { return messages_.tally(); }

private:
    sd_bus* bus_ = nullptr;
    Messages messages_;
};

class BusAnswerer : public Party {
public:
    BusAnswerer(int socket, size_t size) : messages_(size) {
        sd_id128_t id;
        bus_must(sd_id128_randomize(&id), "sd_id128_randomize");
        bus_must(sd_bus_new(&bus_), "sd_bus_new");
        bus_must(sd_bus_set_fd(bus_, dup(socket), dup(socket)), "sd_bus_set_fd");
        bus_must(sd_bus_set_server(bus_, 1, id), "sd_bus_set_server");
        bus_must(sd_bus_add_object_vtable(bus_, nullptr, kPath, kInterface, kMethods, this),
                 "sd_bus_add_object_vtable");
        bus_must(sd_bus_start(bus_), "sd_bus_start");
    }
    ~BusAnswerer() override { sd_bus_close_unref(bus_); }

    void run(size_t operations) override {
        const uint64_t last = messages_.tally().out.count + operations;
        while (messages_.tally().out.count < last) {
            const int result = sd_bus_process(bus_, nullptr);
            bus_must(result, "sd_bus_process");
            if (result == 0) bus_must(sd_bus_wait(bus_, UINT64_MAX), "sd_bus_wait");
        }
        bus_must(sd_bus_flush(bus_), "sd_bus_flush");
    }
    Tally tally() override { return messages_.tally(); }

private:
    static int answer(sd_bus_message* request, void* self, sd_bus_error*) {
        Messages& messages = static_cast<BusAnswerer*>(self)->messages_;
        take(request, messages);
        sd_bus_message* reply = nullptr;
        bus_must(sd_bus_message_new_method_return(request, &reply), "sd_bus_message_new_method_return");
        append(reply, messages);
        bus_must(sd_bus_send(nullptr, reply, nullptr), "sd_bus_send");
        sd_bus_message_unref(reply);
        return 1;
    }

    static const sd_bus_vtable kMethods[];

    sd_bus* bus_ = nullptr;
    Messages messages_;
};

const sd_bus_vtable BusAnswerer::kMethods[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD(kMethod, "ay", "ay", BusAnswerer::answer, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

class BusSetting : public Setting {
public:
    explicit BusSetting(size_t size) : size_(size) {}
    std::unique_ptr<Party> driver() override { return std::make_unique<BusCaller>(ends_[0], size_); }
    std::unique_ptr<Party> partner() override { return std::make_unique<BusAnswerer>(ends_[1], size_); }

private:
    const SocketPair ends_;
    const size_t size_;
};

// --- binder, as a service of the platform

using android::Parcel;
using android::sp;
using android::status_t;
using android::String16;

const String16& token() {
    static const String16 text("bench.answer");
    return text;
}

void append(Parcel& parcel, Messages& messages) {
    parcel.writeInt32(static_cast<int32_t>(messages.size()));
    unsigned char none;
    messages.write(messages.size() == 0 ? &none : static_cast<unsigned char*>(parcel.writeInplace(messages.size())));
}

void take(const Parcel& parcel, Messages& messages) {
    const auto size = static_cast<size_t>(parcel.readInt32());
    const void* const bytes = size == 0 ? nullptr : parcel.readInplace(size);
    messages.come({static_cast<const unsigned char*>(bytes), size});
}

class Service : public android::BBinder {
public:
    explicit Service(size_t size) : messages_(size) {}

    Tally tally_when(uint64_t answered) {
        while (answered_.load() < answered) std::this_thread::sleep_for(std::chrono::milliseconds(1));
        return messages_.tally();
    }

private:
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        if (code != FIRST_CALL_TRANSACTION) return BBinder::onTransact(code, data, reply, flags);
        if (!data.enforceInterface(token())) return android::PERMISSION_DENIED;
        take(data, messages_);
        append(*reply, messages_);
        ++answered_;
        return android::OK;
    }

    Messages messages_;
    std::atomic<uint64_t> answered_{0};
};

class BinderAnswerer : public Party {
public:
    BinderAnswerer(const String16& name, size_t size) : service_(new Service(size)) {
        android::defaultServiceManager()->addService(name, service_);
        android::ProcessState::self()->startThreadPool();
    }

    // The pool's threads answer.
    void run(size_t operations) override { answered_ += operations; }
    Tally tally() override { return service_->tally_when(answered_); }

private:
    const sp<Service> service_;
    uint64_t answered_ = 0;
};

class BinderCaller : public Party {
public:
    BinderCaller(const String16& name, size_t size)
        : service_(android::defaultServiceManager()->getService(name)), messages_(size) {
        if (service_ == nullptr) fail("getService", "is this run with tests/support/sandbox.sh?");
    }

    void run(size_t operations) override {
        for (; operations > 0; --operations) {
            Parcel data, reply;
            data.writeInterfaceToken(token());
            append(data, messages_);
            if (service_->transact(android::IBinder::FIRST_CALL_TRANSACTION, data, &reply) != android::OK) {
                fail("transact");
            }
            take(reply, messages_);
        }
    }
    Tally tally() override { return messages_.tally(); }

private:
    const sp<android::IBinder> service_;
    Messages messages_;
};

class BinderSetting : public Setting {
public:
    explicit BinderSetting(size_t size) : size_(size) {}
    std::unique_ptr<Party> driver() override { return std::make_unique<BinderCaller>(token(), size_); }
    std::unique_ptr<Party> partner() override { return std::make_unique<BinderAnswerer>(token(), size_); }

private:
    const size_t size_;
};

template <typename T>
auto maker(size_t size) {
    return [size] { return std::make_unique<T>(size); };
}

}  // namespace

std::vector<Contest> call_contests() {
    std::vector<Contest> contests;
    for (const int cpus : {1, 2}) {
        for (const size_t size : kSizes) {
            contests.push_back({"calls",
                                "call",
                                size,
                                cpus,
                                {{"bare socket", Role::limit, maker<SocketSetting>(size)},
                                 {"TAVO binder", Role::ours, maker<BinderSetting>(size)},
                                 {"sd-bus", Role::peer, maker<BusSetting>(size)}}});
        }
    }
    return contests;
}

}  // namespace tavo::peers

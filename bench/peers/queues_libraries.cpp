// Queues of libraries: Boost.Interprocess, ZeroMQ and nng, each set up for the fastest that it offers between two
// processes of one machine.
#include <nng/nng.h>
#include <nng/protocol/pair0/pair.h>
#include <unistd.h>
#include <zmq.h>

#include <algorithm>
#include <boost/interprocess/ipc/message_queue.hpp>
#include <cstdlib>

#include "queue.h"

namespace tavo::peers {
namespace {

// --- Boost.Interprocess: a queue in shared memory for each direction

using BoostQueue = boost::interprocess::message_queue;

class BoostLink : public Link {
public:
    BoostLink(BoostQueue& in, BoostQueue& out) : in_(in), out_(out) {}

    unsigned char* blank(size_t) override { return message_.data(); }
    void send(size_t size) override { out_.send(message_.data(), size, 0); }
    View receive() override {
        BoostQueue::size_type size = 0;
        unsigned int priority = 0;
        in_.receive(received_.data(), received_.size(), size, priority);
        return {received_.data(), size};
    }

private:
    BoostQueue& in_;
    BoostQueue& out_;
    std::vector<unsigned char> message_ = std::vector<unsigned char>(in_.get_max_msg_size());
    std::vector<unsigned char> received_ = std::vector<unsigned char>(in_.get_max_msg_size());
};

class BoostWire : public Wire {
public:
    explicit BoostWire(size_t largest) {
        for (size_t i = 0; i < 2; ++i) {
            const std::string name = "tavo-bench-" + std::to_string(getpid()) + "-" + std::to_string(i);
            const size_t size = std::max<size_t>(largest, 1);
            const size_t messages = std::clamp<size_t>(kRoom / size, 16, 1024);
            queues_[i] = std::make_unique<BoostQueue>(boost::interprocess::create_only, name.c_str(), messages, size);
            // Both processes have inherited the mapping.
            BoostQueue::remove(name.c_str());
        }
    }

    std::unique_ptr<Link> open(End end) override {
        const size_t in = end == End::driver ? 1 : 0;
        return std::make_unique<BoostLink>(*queues_[in], *queues_[1 - in]);
    }

private:
    static constexpr size_t kRoom = 1 << 20;

    std::unique_ptr<BoostQueue> queues_[2];
};

// A socket's name in the file system, in a directory of its own.
class Address {
public:
    Address() {
        if (mkdtemp(directory_) == nullptr) fail("mkdtemp");
    }
    ~Address() {
        unlink((std::string(directory_) + "/socket").c_str());
        rmdir(directory_);
    }
    Address(const Address&) = delete;
    Address& operator=(const Address&) = delete;

    std::string url() const { return std::string("ipc://") + directory_ + "/socket"; }

private:
    char directory_[64] = "/tmp/tavo-bench-XXXXXX";
};

template <typename LinkType>
class AddressWire : public Wire {
public:
    explicit AddressWire(size_t) {}
    std::unique_ptr<Link> open(End end) override { return std::make_unique<LinkType>(address_.url(), end); }

private:
    const Address address_;
};

// --- ZeroMQ: messages are written where they are sent from

void zmq_must(int result, const char* what) {
    if (result < 0) fail(what, zmq_strerror(zmq_errno()));
}

class ZmqLink : public Link {
public:
    ZmqLink(const std::string& url, End end) : context_(zmq_ctx_new()), socket_(zmq_socket(context_, ZMQ_PAIR)) {
        const int linger = 0;
        zmq_must(zmq_setsockopt(socket_, ZMQ_LINGER, &linger, sizeof linger), "zmq_setsockopt");
        zmq_must(end == End::partner ? zmq_bind(socket_, url.c_str()) : zmq_connect(socket_, url.c_str()),
                 "zmq_connect");
        zmq_msg_init(&received_);
    }
    ~ZmqLink() override {
        zmq_msg_close(&received_);
        zmq_close(socket_);
        zmq_ctx_term(context_);
    }

    unsigned char* blank(size_t size) override {
        zmq_must(zmq_msg_init_size(&message_, size), "zmq_msg_init_size");
        return static_cast<unsigned char*>(zmq_msg_data(&message_));
    }
    void send(size_t) override { zmq_must(zmq_msg_send(&message_, socket_, 0), "zmq_msg_send"); }
    View receive() override {
        zmq_must(zmq_msg_recv(&received_, socket_, 0), "zmq_msg_recv");
        return {static_cast<const unsigned char*>(zmq_msg_data(&received_)), zmq_msg_size(&received_)};
    }

private:
    void* const context_;
    void* const socket_;
    zmq_msg_t message_;
    zmq_msg_t received_;
};

// --- nng: the same

void nng_must(int error, const char* what) {
    if (error != 0) fail(what, nng_strerror(error));
}

class NngLink : public Link {
public:
    NngLink(const std::string& url, End end) {
        nng_must(nng_pair0_open(&socket_), "nng_pair0_open");
        for (const char* buffer : {NNG_OPT_SENDBUF, NNG_OPT_RECVBUF}) {
            nng_must(nng_socket_set_int(socket_, buffer, kMessages), buffer);
        }
        // A dialer that does not wait tries again until the other side listens.
        nng_must(end == End::partner ? nng_listen(socket_, url.c_str(), nullptr, 0)
                                     : nng_dial(socket_, url.c_str(), nullptr, NNG_FLAG_NONBLOCK),
                 "nng_dial");
    }
    ~NngLink() override {
        if (received_ != nullptr) nng_msg_free(received_);
        nng_close(socket_);
    }

    unsigned char* blank(size_t size) override {
        nng_must(nng_msg_alloc(&message_, size), "nng_msg_alloc");
        return static_cast<unsigned char*>(nng_msg_body(message_));
    }
    void send(size_t) override { nng_must(nng_sendmsg(socket_, message_, 0), "nng_sendmsg"); }
    View receive() override {
        if (received_ != nullptr) nng_msg_free(received_);
        received_ = nullptr;
        nng_must(nng_recvmsg(socket_, &received_, 0), "nng_recvmsg");
        return {static_cast<const unsigned char*>(nng_msg_body(received_)), nng_msg_len(received_)};
    }

private:
    static constexpr int kMessages = 128;

    nng_socket socket_ = NNG_SOCKET_INITIALIZER;
    nng_msg* message_ = nullptr;
    nng_msg* received_ = nullptr;
};

template <typename T>
auto maker() {
    return [](size_t largest) { return std::make_unique<T>(largest); };
}

}  // namespace

std::vector<QueuePeer> library_queues() {
    return {
        {"Boost.Interprocess", Role::peer, maker<BoostWire>()},
        {"ZeroMQ", Role::peer, maker<AddressWire<ZmqLink>>()},
        {"nng", Role::peer, maker<AddressWire<NngLink>>()},
    };
}

}  // namespace tavo::peers

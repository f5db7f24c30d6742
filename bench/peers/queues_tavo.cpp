// This library's queue as its users have it: a process serves, two others attach by key.
#include <fcntl.h>
#include <unistd.h>

#include "child.h"
#include "queue.h"
#include "tavo_osal/init.h"
#include "tavo_osal/msg_queue.h"

namespace tavo::peers {
namespace {

class TavoLink : public Link {
public:
    TavoLink(const char* in, const char* out) : in_(attach(in)), out_(attach(out)) {}
    ~TavoLink() override {
        tavo_msg_queue_destroy(in_);
        tavo_msg_queue_destroy(out_);
    }

    unsigned char* blank(size_t) override { return message_.data(); }
    void send(size_t size) override {
        if (tavo_msg_queue_put(out_, message_.data(), static_cast<unsigned>(size)) != 0) fail("tavo_msg_queue_put");
    }
    View receive() override {
        unsigned int size = TAVO_MSG_QUEUE_MAX_SIZE;
        if (tavo_msg_queue_get(in_, received_.data(), &size) != 0) fail("tavo_msg_queue_get");
        return {received_.data(), size};
    }

private:
    static TAVO_INT64 attach(const char* key) {
        std::string text = key;
        TAVO_INT64 handle = 0;
        if (tavo_msg_queue_sender_init(text.data(), &handle) != TAVO_SUCCESS) fail("tavo_msg_queue_sender_init");
        return handle;
    }

    const TAVO_INT64 in_;
    const TAVO_INT64 out_;
    std::vector<unsigned char> message_ = std::vector<unsigned char>(TAVO_MSG_QUEUE_MAX_SIZE);
    std::vector<unsigned char> received_ = std::vector<unsigned char>(TAVO_MSG_QUEUE_MAX_SIZE);
};

class TavoWire : public Wire {
public:
    TavoWire() {
        int ready[2];
        if (pipe2(ready, O_CLOEXEC) != 0) fail("pipe2");
        server_.emplace([&ready] {
            const TAVO_Status status = tavo_osal_init(16, 16);
            if (write(ready[1], &status, sizeof status) != sizeof status) fail("write");
            for (;;) pause();
        });
        close(ready[1]);
        TAVO_Status status = TAVO_FAILURE;
        const bool told = read(ready[0], &status, sizeof status) == sizeof status;
        close(ready[0]);
        if (!told || status != TAVO_SUCCESS) fail("tavo_osal_init", "is this run with tests/support/sandbox.sh?");
    }

    std::unique_ptr<Link> open(End end) override {
        const bool driver = end == End::driver;
        return std::make_unique<TavoLink>(driver ? "8" : "7", driver ? "7" : "8");
    }

private:
    std::optional<Child> server_;
};

}  // namespace

QueuePeer our_queue() {
    return {"TAVO queue", Role::ours, [](size_t) { return std::make_unique<TavoWire>(); }};
}

}  // namespace tavo::peers

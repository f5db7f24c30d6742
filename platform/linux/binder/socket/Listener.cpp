#include "Listener.h"

#include <fcntl.h>
#include <sys/socket.h>

#include <cerrno>
#include <chrono>
#include <thread>
#include <utility>

namespace android::socket_driver {
namespace {

// How long a crowd at the door is ignored when nobody can even be turned away.
constexpr std::chrono::milliseconds kPause{10};

UniqueFd anyDescriptor() { return UniqueFd(open("/dev/null", O_RDONLY | O_CLOEXEC)); }

}  // namespace

Listener::Listener(UniqueFd socket, std::function<void(UniqueFd)> welcome)
    : socket_(std::move(socket)), welcome_(std::move(welcome)), spare_(anyDescriptor()) {}

void Listener::onReady() {
    if (letIn()) return;
    if (errno == EMFILE || errno == ENFILE || errno == ENOMEM || errno == ENOBUFS) turnAway();
}

void Listener::finish() {
    for (int i = 0; i < SOMAXCONN && letIn(); ++i) {
    }
}

bool Listener::letIn() {
    UniqueFd connection(accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!connection.valid()) return false;
    welcome_(std::move(connection));
    return true;
}

// Without descriptors left, nobody can be let in; but nobody is to wait at the door for ever either.
void Listener::turnAway() {
    spare_.reset();
    UniqueFd connection(accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!connection.valid()) std::this_thread::sleep_for(kPause);
    connection.reset();
    spare_ = anyDescriptor();
}

}  // namespace android::socket_driver

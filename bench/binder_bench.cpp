// One transaction through libbinder's socket driver beside a bare ping-pong of the same bytes over a Unix-domain
// socket, without and with a descriptor in the reply. Wants an empty runtime directory: tests/support/sandbox.sh runs
// it in one.
#include <binder/Binder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "bench/cpus.h"
#include "bench/paired.h"

namespace {

using android::BBinder;
using android::IBinder;
using android::Parcel;
using android::sp;
using android::status_t;
using android::String16;

const String16 kName("bench.answer");
const String16 kToken("tavo.mq");
enum Code : uint32_t { kNumber = IBinder::FIRST_CALL_TRANSACTION, kDescriptor };

// What the frames of such a transaction come to: a header, a token and a number; a header and a number or an object.
constexpr size_t kRequestSize = 80;
constexpr size_t kReplySize = 56;
constexpr size_t kObjectReplySize = 80;

[[noreturn]] void fail(const char* what) {
    perror(what);
    exit(1);
}

class AnswerService : public BBinder {
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        if (code != kNumber && code != kDescriptor) return BBinder::onTransact(code, data, reply, flags);
        if (!data.enforceInterface(kToken)) return android::PERMISSION_DENIED;
        const int32_t number = data.readInt32();
        return code == kNumber ? reply->writeInt32(number) : reply->writeFileDescriptor(STDIN_FILENO);
    }
};

// A process that works for as long as this one lives.
template <typename Work>
void start(int cpu, Work work) {
    const pid_t pid = fork();
    if (pid < 0) fail("fork");
    if (pid > 0) return;
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    tavo::bench::run_on(cpu);
    work();
    _exit(0);
}

void send_with(int socket, const char* bytes, size_t size, int descriptor) {
    iovec part{const_cast<char*>(bytes), size};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof descriptor)];
    if (descriptor >= 0) {
        message.msg_control = control;
        message.msg_controllen = sizeof control;
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(sizeof descriptor);
        memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
    }
    if (sendmsg(socket, &message, 0) != static_cast<ssize_t>(size)) fail("sendmsg");
}

// The descriptor that came along, or -1.
int receive_with(int socket, char* bytes, size_t size) {
    iovec part{bytes, size};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))];
    message.msg_control = control;
    message.msg_controllen = sizeof control;
    if (recvmsg(socket, &message, MSG_CMSG_CLOEXEC) <= 0) _exit(0);
    const cmsghdr* header = CMSG_FIRSTHDR(&message);
    int descriptor = -1;
    if (header != nullptr) memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
    return descriptor;
}

// A bare socket to a process that answers each request with so many bytes, and with a descriptor if asked for.
int start_bare(int cpu, size_t reply_size, int descriptor) {
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) fail("socketpair");
    start(cpu, [=] {
        close(ends[0]);
        char bytes[kRequestSize];
        for (;;) {
            receive_with(ends[1], bytes, sizeof bytes);
            send_with(ends[1], bytes, reply_size, descriptor);
        }
    });
    close(ends[1]);
    return ends[0];
}

void start_service(int cpu, const String16& name) {
    start(cpu, [=] {
        android::defaultServiceManager()->addService(name, new AnswerService);
        android::ProcessState::self()->startThreadPool();
        android::IPCThreadState::self()->joinThreadPool();
    });
}

// As a client takes a descriptor: a duplicate of the one in the reply, closed after use.
void use(int descriptor) {
    const int own = fcntl(descriptor, F_DUPFD_CLOEXEC, 1);
    if (own < 0) fail("F_DUPFD_CLOEXEC");
    close(own);
}

tavo::bench::Side bare_side(int socket, size_t reply_size) {
    return [=](size_t operations) {
        char bytes[kRequestSize] = {};
        while (operations-- > 0) {
            send_with(socket, bytes, sizeof bytes, -1);
            const int descriptor = receive_with(socket, bytes, reply_size);
            if (descriptor < 0) continue;
            use(descriptor);
            close(descriptor);
        }
    };
}

tavo::bench::Side binder_side(const String16& name, uint32_t code) {
    return [=](size_t operations) {
        static const sp<IBinder>* services[2] = {};
        const sp<IBinder>*& service = services[name == kName ? 0 : 1];
        if (service == nullptr) service = new sp<IBinder>(android::defaultServiceManager()->getService(name));
        if (*service == nullptr) fail("getService");
        while (operations-- > 0) {
            Parcel data, reply;
            data.writeInterfaceToken(kToken);
            data.writeInt32(7);
            if ((*service)->transact(code, data, &reply) != android::OK) fail("transact");
            if (code == kDescriptor) {
                use(reply.readFileDescriptor());
            } else if (reply.readInt32() != 7) {
                fail("reply");
            }
        }
    };
}

}  // namespace

int main(int argc, char** argv) {
    const tavo::bench::Cpus cpus;
    const String16 other("bench.answer.other");
    std::vector<tavo::bench::Pair> pairs;
    for (const int cpu : {cpus.first, cpus.last}) {
        const bool same = cpu == cpus.first;
        const String16& name = same ? kName : other;
        const std::string where = same ? ", one CPU" : ", two CPUs";
        start_service(cpu, name);
        pairs.push_back({"number" + where, bare_side(start_bare(cpu, kReplySize, -1), kReplySize),
                         binder_side(name, kNumber), 1.4});
        pairs.push_back({"descriptor" + where,
                         bare_side(start_bare(cpu, kObjectReplySize, STDIN_FILENO), kObjectReplySize),
                         binder_side(name, kDescriptor), 1.4});
        if (cpus.first == cpus.last) break;
    }
    tavo::bench::run_on(cpus.first);
    return tavo::bench::run_pairs(argc, argv, pairs);
}

// One transaction through the kernel's binder driver beside the same through sockets. Wants an empty runtime directory,
// as binder_bench does, and a binder device; where that has no service manager yet, it is given one.
//
// A process has one driver. So each side is a client process of its own that does as many calls as it is told.
#include <binder/Binder.h>
#include <binder/IPCThreadState.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "bench/cpus.h"
#include "bench/paired.h"
#include "platform/linux/binder/servicemanager/ServiceRegistry.h"

namespace {

using namespace android;

const String16 kToken("tavo.mq");
enum Code : uint32_t { kNumber = IBinder::FIRST_CALL_TRANSACTION, kDescriptor, kBytes };
constexpr size_t kMuch = 4096;

[[noreturn]] void fail(const char* what) {
    perror(what);
    exit(1);
}

class AnswerService : public BBinder {
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) override {
        if (code < kNumber || code > kBytes) return BBinder::onTransact(code, data, reply, flags);
        if (!data.enforceInterface(kToken)) return PERMISSION_DENIED;
        const int32_t number = data.readInt32();
        if (code == kDescriptor) return reply->writeFileDescriptor(STDIN_FILENO);
        if (code == kBytes) return reply->writeInplace(kMuch) != nullptr ? OK : NO_MEMORY;
        return reply->writeInt32(number);
    }
};

// A process with a driver of its own, which says when it is ready, and works for as long as this one lives.
struct Child {
    int to = -1;
    int from = -1;
};

template <typename Work>
Child start(const char* driver, int cpu, Work work) {
    int to[2], from[2];
    if (pipe2(to, O_CLOEXEC) != 0 || pipe2(from, O_CLOEXEC) != 0) fail("pipe2");
    const pid_t pid = fork();
    if (pid < 0) fail("fork");
    if (pid == 0) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        tavo::bench::run_on(cpu);
        setenv("BINDER_DRIVER", driver, 1);
        work(to[0], from[1]);
        _exit(0);
    }
    close(to[0]);
    close(from[1]);
    return {to[1], from[0]};
}

void say(int pipe, size_t number) {
    if (write(pipe, &number, sizeof number) != sizeof number) _exit(0);
}

size_t hear(int pipe) {
    size_t number = 0;
    return read(pipe, &number, sizeof number) == sizeof number ? number : 0;
}

void keep_names(int, int from) {
    const status_t status = ProcessState::self()->becomeContextManager(new ServiceRegistry);
    // Another will do.
    say(from, status == OK || status == ALREADY_EXISTS ? 1 : 0);
    if (status == OK) IPCThreadState::self()->joinThreadPool();
    pause();
}

void serve(const String16& name, int from) {
    const status_t status = defaultServiceManager()->addService(name, new AnswerService);
    ProcessState::self()->startThreadPool();
    say(from, status == OK ? 1 : 0);
    IPCThreadState::self()->joinThreadPool();
}

void call(const String16& name, uint32_t code, int to, int from) {
    const sp<IBinder> service = defaultServiceManager()->getService(name);
    say(from, service != nullptr ? 1 : 0);
    while (size_t operations = hear(to)) {
        while (operations-- > 0) {
            Parcel data, reply;
            data.writeInterfaceToken(kToken);
            data.writeInt32(7);
            if (service->transact(code, data, &reply) != OK) fail("transact");
            if (code == kNumber && reply.readInt32() != 7) fail("reply");
            if (code == kDescriptor && reply.readFileDescriptor() < 0) fail("descriptor");
        }
        say(from, 1);
    }
}

tavo::bench::Side side(const char* driver, const String16& name, uint32_t code, int cpu) {
    const Child child = start(driver, cpu, [&](int to, int from) { call(name, code, to, from); });
    if (hear(child.from) == 0) fail("a client");
    return [child](size_t operations) {
        say(child.to, operations);
        if (hear(child.from) == 0) fail("a client");
    };
}

}  // namespace

int main(int argc, char** argv) {
    const char* device = getenv("BINDER_DEVICE");
    if (access(device != nullptr && *device != '\0' ? device : "/dev/binder", R_OK | W_OK) != 0) {
        puts("there is no binder device here to set beside sockets");
        return 0;
    }
    const tavo::bench::Cpus cpus;
    const Child manager = start("kernel", cpus.first, keep_names);
    if (hear(manager.from) == 0) fail("the service manager");
    std::vector<tavo::bench::Pair> pairs;
    for (const int cpu : {cpus.first, cpus.last}) {
        const bool same = cpu == cpus.first;
        const String16 name(same ? "bench.near" : "bench.far");
        for (const char* driver : {"socket", "kernel"}) {
            const Child server = start(driver, cpu, [&](int, int from) { serve(name, from); });
            if (hear(server.from) == 0) fail("a server");
        }
        const struct {
            const char* what;
            uint32_t code;
        } cases[] = {{"number", kNumber}, {"descriptor", kDescriptor}, {"4096 bytes", kBytes}};
        for (const auto& one : cases) {
            pairs.push_back({std::string(one.what) + (same ? ", one CPU" : ", two CPUs"),
                             side("socket", name, one.code, cpus.first), side("kernel", name, one.code, cpus.first),
                             1.0});
        }
        if (cpus.first == cpus.last) break;
    }
    puts("bare: sockets, tavo: the kernel's driver");
    return tavo::bench::run_pairs(argc, argv, pairs);
}

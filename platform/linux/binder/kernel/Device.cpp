// Compiled without exceptions: a program may cancel a thread by leaving it from a signal's handler, and the C library
// declares that nothing leaves ioctl() but by returning. Where no function has anything to clean up, unwinding
// does not stop at that.
#include "Device.h"

#include <android/log.h>
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace android::kernel_driver {
namespace {

constexpr char kTag[] = "BinderKernel";
constexpr char kDefaultPath[] = "/dev/binder";

static_assert(sizeof(binder_uintptr_t) == 8 && BINDER_CURRENT_PROTOCOL_VERSION == 8,
              "kernels of today speak 64-bit binder only, to 32-bit processes as well");

const char* path() {
    const char* chosen = getenv("BINDER_DEVICE");
    return chosen != nullptr && *chosen != '\0' ? chosen : kDefaultPath;
}

// What all calls to the process and all replies to it may take at one time: the platform's measure, which leaves
// room for a guard page on either side.
size_t mappedSize() { return size_t{1024} * 1024 - 2 * static_cast<size_t>(sysconf(_SC_PAGESIZE)); }

int openDevice() { return ::open(path(), O_RDWR | O_CLOEXEC); }

bool speaksOurVersion(int fd) {
    binder_version version = {};
    if (ioctl(fd, BINDER_VERSION, &version) != 0) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "%s is no binder device: %s", path(), strerror(errno));
        return false;
    }
    if (version.protocol_version != BINDER_CURRENT_PROTOCOL_VERSION) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "%s speaks version %d of the protocol, not %d", path(),
                            version.protocol_version, BINDER_CURRENT_PROTOCOL_VERSION);
        return false;
    }
    return true;
}

void logThatItCannotBeOpened(int priority) {
    __android_log_print(priority, kTag, "%s cannot be opened: %s", path(), strerror(errno));
}

int result(int returned) { return returned < 0 ? errno : 0; }

}  // namespace

Device::~Device() {
    if (memory_ != nullptr) munmap(memory_, mappedSize());
}

bool Device::isThere() {
    const UniqueFd fd(openDevice());
    if (fd.valid()) return speaksOurVersion(fd.get());
    if (errno != ENOENT && errno != ENXIO && errno != ENODEV) logThatItCannotBeOpened(ANDROID_LOG_INFO);
    return false;
}

bool Device::open() {
    fd_.reset(openDevice());
    if (!fd_.valid()) {
        logThatItCannotBeOpened(ANDROID_LOG_ERROR);
        return false;
    }
    if (!speaksOurVersion(fd_.get())) return false;
    // The kernel alone writes there.
    void* memory = mmap(nullptr, mappedSize(), PROT_READ, MAP_PRIVATE | MAP_NORESERVE, fd_.get(), 0);
    if (memory == MAP_FAILED) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "%s cannot be mapped: %s", path(), strerror(errno));
        return false;
    }
    memory_ = memory;
    return true;
}

int Device::writeRead(binder_write_read& request) {
    for (;;) {
        // When it is interrupted, what it has consumed of the writing is noted, and not said twice.
        const int error = result(ioctl(fd_.get(), BINDER_WRITE_READ, &request));
        if (error == EAGAIN) {
            const timespec moment{0, 1000000};
            nanosleep(&moment, nullptr);
        } else if (error != EINTR) {
            return error;
        }
    }
}

int Device::setMaxThreads(uint32_t count) { return result(ioctl(fd_.get(), BINDER_SET_MAX_THREADS, &count)); }

int Device::becomeContextManager() {
    int32_t unused = 0;
    return result(ioctl(fd_.get(), BINDER_SET_CONTEXT_MGR, &unused));
}

int Device::endThread() {
    int32_t unused = 0;
    return result(ioctl(fd_.get(), BINDER_THREAD_EXIT, &unused));
}

}  // namespace android::kernel_driver

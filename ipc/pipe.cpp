#include "ipc/pipe.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/uio.h>

#include <atomic>
#include <cerrno>
#include <chrono>

// Not every platform's C library has it, nor declares it where it has.
extern "C" ssize_t read_with_flags(int, const iovec*, int, long offset, int flags) __asm__("preadv2")
    __attribute__((weak));

namespace tavo {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kPatience(1000);
// Enough for a reader to find whole frames, and for two processes that share a CPU not to take turns at every few
// frames: from 8 to 16, messages of a page become a tenth faster; from 16 to 32 hardly.
constexpr int kFramesOfRoom = 16;
constexpr int kLargestPipe = 1 << 20;

bool is_interruption(int error) { return error == EINTR || error == EAGAIN; }

// Waits until more can be read or written (events), or the other side has gone, which the next call tells.
bool becomes_ready(int fd, short events) {
    using std::chrono::steady_clock;
    const auto deadline = steady_clock::now() + kPatience;
    auto left = kPatience;
    for (;;) {
        pollfd slot = {fd, events, 0};
        const int ready = poll(&slot, 1, static_cast<int>(left.count()));
        if (ready >= 0 || errno != EINTR) return ready > 0;
        // Signals must not make the wait any longer.
        left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now());
        left = std::max(left, milliseconds(0));
    }
}

// Waits until something can be read, or the other side has gone.
bool comes(int fd) {
    // Far cheaper than a poll, which tells no more when something is there.
    int bytes = 0;
    return (ioctl(fd, FIONREAD, &bytes) == 0 && bytes > 0) || becomes_ready(fd, POLLIN);
}

// Asks and reads in one call. A negative result says nothing about the pipe: older kernels cannot do this to one.
ssize_t read_at_once(int fd, unsigned char* buffer, size_t size) {
    constexpr int kNoWait = 8;  // RWF_NOWAIT, which headers may lack
    static std::atomic<bool> possible{true};
    if (read_with_flags == nullptr || !possible.load(std::memory_order_relaxed)) return -1;
    iovec part = {buffer, size};
    const ssize_t count = read_with_flags(fd, &part, 1, -1, kNoWait);
    if (count < 0 && (errno == EOPNOTSUPP || errno == ENOSYS)) possible.store(false, std::memory_order_relaxed);
    return count;
}

}  // namespace

int make_pipe(int (&ends)[2]) {
    const int result = pipe2(ends, O_CLOEXEC);
    if (result != 0) return result;
    // A process that runs without standard input would be given descriptor 0, which a queue takes as absent.
    int* const zero = std::find(ends, ends + 2, 0);
    if (zero == ends + 2) return 0;
    *zero = fcntl(0, F_DUPFD_CLOEXEC, 1);
    close(0);
    if (*zero > 0) return 0;
    close(zero == ends ? ends[1] : ends[0]);
    return -1;
}

void make_room(int fd, int frame_size) {
    const int current = fcntl(fd, F_GETPIPE_SZ);
    if (current < 0) return;
    int wanted = std::min(kFramesOfRoom * frame_size, kLargestPipe);
    while (wanted > current && fcntl(fd, F_SETPIPE_SZ, wanted) < 0) wanted /= 2;
}

bool write_rest(int fd, const unsigned char* data, size_t length, ssize_t count) {
    size_t done = 0;
    for (;;) {
        if (count >= 0) {
            done += static_cast<size_t>(count);
            if (done == length) return true;
        } else if (done == 0 || !is_interruption(errno)) {
            // Nothing of the frame is out, or nothing more can get out. To give it up in between could make the
            // reader take the next frame for its rest.
            return false;
        } else if (errno == EAGAIN && !becomes_ready(fd, POLLOUT)) {
            // Nobody reads, and the writer has asked not to be kept.
            errno = EAGAIN;
            return false;
        }
        count = write(fd, data + done, length - done);
    }
}

ssize_t read_rest(int fd, unsigned char* buffer, size_t room, size_t length, ssize_t count, bool begun) {
    size_t total = 0;
    size_t filled = 0;
    for (;;) {
        const int error = errno;
        if (count > 0) {
            total += static_cast<size_t>(count);
            filled += static_cast<size_t>(count);
        }
        if (count == 0 || total == length) return static_cast<ssize_t>(total);

        const bool goes_on = count > 0 || ((begun || total > 0) && is_interruption(error));
        if (!goes_on || !becomes_ready(fd, POLLIN)) {
            errno = error;
            return total > 0 ? static_cast<ssize_t>(total) : -1;
        }
        if (filled == room) filled = 0;
        count = read(fd, buffer + filled, std::min(length - total, room - filled));
    }
}

ssize_t read_all_that_comes(int fd, unsigned char* buffer, size_t room, size_t length) {
    const ssize_t count = read_at_once(fd, buffer, std::min(length, room));
    if (count == static_cast<ssize_t>(length)) return count;
    if (count >= 0) return read_rest(fd, buffer, room, length, count, true);
    return comes(fd) ? read_all(fd, buffer, room, length, true) : 0;
}

}  // namespace tavo

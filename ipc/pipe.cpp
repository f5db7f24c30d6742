#include "ipc/pipe.h"

#include <fcntl.h>
#include <poll.h>

#include <cerrno>
#include <chrono>

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

bool comes(int fd) { return becomes_ready(fd, POLLIN); }

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

}  // namespace tavo

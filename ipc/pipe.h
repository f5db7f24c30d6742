// Pipes that carry frames: made, widened, written and read so that a frame once begun is carried to its end.
#pragma once

#include <unistd.h>

#include <algorithm>

namespace tavo {

// Both ends, close-on-exec and never descriptor 0. Otherwise the platform's negative result, with its errno.
int make_pipe(int (&ends)[2]);

// Lets a pipe hold several frames of this size, a power of two, as far as the platform grants it.
void make_room(int fd, int frame_size);

// What the two calls below do when one system call was not enough; count is its result.
bool write_rest(int fd, const unsigned char* data, size_t length, ssize_t count);
ssize_t read_rest(int fd, unsigned char* buffer, size_t room, size_t length, ssize_t count, bool begun);

// Writes length bytes, with one write unless the pipe takes less. False and errno when it failed: before the first byte
// for any reason, later only when no more can be written, or a non-blocking pipe has had no room for a second.
inline bool write_all(int fd, const unsigned char* data, size_t length) {
    const ssize_t count = write(fd, data, length);
    return __builtin_expect(count == static_cast<ssize_t>(length), 1) || write_rest(fd, data, length, count);
}

// Reads length bytes, with one read when they are all there and the buffer holds them; a buffer that does not is
// filled from its start again and again. Waits for bytes that are late, up to a second each time. Fewer than length
// when the time or the file has ended; -1 and errno when the read failed before the first byte. begun says that the
// bytes before these have been read already, so that an interruption is no reason to fail.
inline ssize_t read_all(int fd, unsigned char* buffer, size_t room, size_t length, bool begun) {
    const ssize_t count = read(fd, buffer, std::min(length, room));
    if (__builtin_expect(count == static_cast<ssize_t>(length), 1)) return count;
    return read_rest(fd, buffer, room, length, count, begun);
}

// read_all for what may never come, its sender having been killed in front of it: waits up to a second for the first
// byte, too. 0 when there is none. The bytes before these have been read already.
ssize_t read_all_that_comes(int fd, unsigned char* buffer, size_t room, size_t length);

}  // namespace tavo

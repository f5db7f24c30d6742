#include "tools/files.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "tools/command.h"
#include "tools/stop_signals.h"

namespace tavo::tool {

Input::Input(const std::string& path) : name_(path == "-" ? "standard input" : path) {
    fd_ = path == "-" ? fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1)
                      : open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd_ < 0) throw Failure("cannot read " + name_ + ": " + strerror(errno));
    struct stat status = {};
    if (fstat(fd_, &status) == 0 && S_ISDIR(status.st_mode)) {
        close(fd_);
        throw Failure("cannot read " + name_ + ": " + strerror(EISDIR));
    }
}

Input::~Input() { close(fd_); }

// False at the end, or when a signal asks for it.
bool Input::fill() {
    pollfd slots[] = {{fd_, POLLIN, 0}, {StopSignals::descriptor(), POLLIN, 0}};
    while (poll(slots, 2, -1) < 0 && errno == EINTR) {
    }
    if (slots[1].revents != 0) return false;
    char piece[65536];
    ssize_t count = -1;
    do {
        count = read(fd_, piece, sizeof piece);
    } while (count < 0 && errno == EINTR);
    if (count < 0) throw Failure("cannot read " + name_ + ": " + strerror(errno));
    buffer_.append(piece, static_cast<size_t>(count));
    return count > 0;
}

std::string Input::read_up_to(size_t limit) {
    while (buffer_.size() < limit && fill()) {
    }
    return buffer_.substr(0, limit);
}

bool Input::read_line(std::string& line, size_t limit) {
    buffer_.erase(0, used_);
    used_ = 0;
    size_t searched = 0;
    for (;;) {
        const size_t end = buffer_.find('\n', searched);
        if (end != std::string::npos) {
            line = buffer_.substr(0, std::min(end, limit));
            used_ = end + 1;
            return true;
        }
        if (buffer_.size() >= limit) {
            line = buffer_.substr(0, limit);
            used_ = limit;
            return true;
        }
        searched = buffer_.size();
        if (!fill()) break;
    }
    // The last line may lack its end. One that a signal cut short is no line.
    if (buffer_.empty() || StopSignals::received() != 0) return false;
    line = buffer_;
    used_ = buffer_.size();
    return true;
}

bool write_all(int fd, const void* data, size_t size) {
    const char* bytes = static_cast<const char*>(data);
    for (size_t done = 0; done < size;) {
        const ssize_t count = write(fd, bytes + done, size - done);
        if (count >= 0) {
            done += static_cast<size_t>(count);
            if (done == size || StopSignals::received() == 0) continue;
            errno = EINTR;  // came while a part was being written
            return false;
        }
        if (errno == EAGAIN) {
            pollfd slot = {fd, POLLOUT, 0};
            poll(&slot, 1, 1000);
        } else if (errno != EINTR || StopSignals::received() != 0) {
            return false;
        }
    }
    return true;
}

}  // namespace tavo::tool

// The service's answer to the platform's dump call, such as "dumpsys android.tavo.osal" makes.
#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <ctime>
#include <mutex>
#include <new>
#include <string>

#include "ipc/TAVO_MessageQueue.h"
#include "ipc/TavoOsalService.h"
#include "ipc/service_figures.h"
#include "ipc/service_lock.h"

namespace android {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr char kUsage[] = "The figures of the message queues and shared-memory blocks. --json gives them as JSON.\n";

// For everything that is written. Whoever asks reads at once, or does not mean to.
constexpr milliseconds kPatience(2000);

// Descriptors come from other processes, and some cannot be written to without waiting. They may keep this many
// threads of the pool, and never all.
constexpr int kWritersAtOnce = 4;
std::atomic<int> g_writers{0};

class WriterPlace {
public:
    WriterPlace() : held_(g_writers.fetch_add(1) < kWritersAtOnce) {}
    ~WriterPlace() { g_writers.fetch_sub(1); }
    WriterPlace(const WriterPlace&) = delete;
    WriterPlace& operator=(const WriterPlace&) = delete;
    bool held() const { return held_; }

private:
    const bool held_;
};

// A pipe whose reader is gone must not end the service: the signal it raises in this thread is taken back.
class NoBrokenPipe {
public:
    NoBrokenPipe() {
        sigemptyset(&signal_);
        sigaddset(&signal_, SIGPIPE);
        sigset_t pending;
        was_pending_ = sigpending(&pending) == 0 && sigismember(&pending, SIGPIPE) == 1;
        pthread_sigmask(SIG_BLOCK, &signal_, &saved_);
    }
    ~NoBrokenPipe() {
        const timespec at_once = {0, 0};
        while (!was_pending_ && sigtimedwait(&signal_, nullptr, &at_once) < 0 && errno == EINTR) {
        }
        pthread_sigmask(SIG_SETMASK, &saved_, nullptr);
    }
    NoBrokenPipe(const NoBrokenPipe&) = delete;
    NoBrokenPipe& operator=(const NoBrokenPipe&) = delete;

private:
    sigset_t signal_, saved_;
    bool was_pending_;
};

// A piece that does not wait: a pipe that polls as ready has room for PIPE_BUF bytes, a socket can be told.
ssize_t write_piece(int fd, const char* data, size_t length) {
    const ssize_t sent = send(fd, data, length, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (sent >= 0 || errno != ENOTSOCK) return sent;
    return write(fd, data, std::min<size_t>(length, PIPE_BUF));
}

status_t write_all(int fd, const std::string& text) {
    if (fd < 0) return -EBADF;  // which poll would take for one that is never ready
    const NoBrokenPipe no_broken_pipe;
    const auto deadline = steady_clock::now() + kPatience;
    for (size_t done = 0; done < text.size();) {
        const auto left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now());
        pollfd slot = {fd, POLLOUT, 0};
        const int ready = left.count() > 0 ? poll(&slot, 1, static_cast<int>(left.count())) : 0;
        if (ready == 0) return TIMED_OUT;
        const ssize_t written = ready > 0 ? write_piece(fd, text.data() + done, text.size() - done) : -1;
        if (written >= 0) {
            done += static_cast<size_t>(written);
        } else if (errno != EINTR && errno != EAGAIN) {
            return -errno;
        }
    }
    return NO_ERROR;
}

bool asks_for(const Vector<String16>& args, const char* option) {
    const String16 wanted(option);
    return std::any_of(args.array(), args.array() + args.size(), [&](const String16& arg) { return arg == wanted; });
}

// Asked without the service's lock: a process that is writing to a pipe holds the pipe's own.
void measure(int pipe, tavo::QueueFigures& queue) {
    queue.capacity = std::max(fcntl(pipe, F_GETPIPE_SZ), -1);
    if (ioctl(pipe, FIONREAD, &queue.pending) != 0) queue.pending = -1;
}

}  // namespace

status_t TavoOsalService::dump(int fd, const Vector<String16>& args) {
    const WriterPlace place;
    if (!place.held()) return WOULD_BLOCK;
    try {
        // Other arguments are the platform's own, such as "-a", and mean nothing here.
        if (asks_for(args, "-h") || asks_for(args, "--help")) return write_all(fd, kUsage);
        const tavo::ServiceFigures figures = collectFigures();
        return write_all(fd, asks_for(args, "--json") ? to_json(figures) : to_text(figures));
    } catch (const std::bad_alloc&) {
        return NO_MEMORY;
    }
}

tavo::ServiceFigures TavoOsalService::collectFigures() const {
    tavo::ServiceFigures figures = snapshot();
    const auto is_gone = [this](tavo::QueueFigures& queue) {
        // One at a time, so that a service with many queues needs no more than one descriptor.
        const int pipe = duplicateReadEnd(queue.key);
        if (pipe < 0) return pipe == -ENOENT;
        measure(pipe, queue);
        close(pipe);
        return false;
    };
    auto& queues = figures.queues;
    queues.erase(std::remove_if(queues.begin(), queues.end(), is_gone), queues.end());
    return figures;
}

tavo::ServiceFigures TavoOsalService::snapshot() const {
    tavo::ServiceFigures figures = {};
    figures.process = getpid();
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    figures.has_queue_table = m_ppQueues != nullptr;
    figures.queue_room = m_uiQueueRoom;
    for (uint32_t i = 0; i < m_uiQueueCount; ++i) {
        const KeyRecord& record = *m_ppQueues[i];
        auto* queue = static_cast<TAVO_MessageQueue*>(record.pvObject);
        figures.queues.push_back({record.iKey, record.uiUseCount, queue->tavo_android_msg_queue_get_fd(),
                                  queue->tavo_android_msg_queue_get_write_fd(), -1, -1});
    }
    figures.has_block_list = m_pBlocks != nullptr && m_pBlocks->pHead != nullptr;
    if (!figures.has_block_list) return figures;
    figures.block_limit = m_pBlocks->uiMaximum;
    for (TAVO_ListNode* link = m_pBlocks->pHead->next; link != m_pBlocks->pHead; link = link->next) {
        KeyRecord* record = recordOf(link);
        const sp<IMemoryHeap>* holder = holderOf(record);
        const bool has_heap = holder != nullptr && *holder != nullptr;
        figures.blocks.push_back(
            {record->iKey, record->uiUseCount, record->iSize, has_heap ? (*holder)->getStrongCount() : 0});
    }
    return figures;
}

// -ENOENT when the queue has gone, or another -errno.
int TavoOsalService::duplicateReadEnd(int key) const {
    const std::lock_guard<std::mutex> lock(tavo::service_lock());
    TAVO_MessageQueue* queue = queueOf(key);
    if (queue == nullptr) return -ENOENT;
    const int duplicate = fcntl(queue->tavo_android_msg_queue_get_fd(), F_DUPFD_CLOEXEC, 0);
    return duplicate >= 0 ? duplicate : -errno;
}

}  // namespace android

// Built without exceptions, like thread/cancellation.cpp and for its reasons.
//
// A semaphore's file has sizeof(sem_t) bytes from the moment that the semaphore in it is initialised, and never
// before: the length is what tells a finished file. Until then it has none, or one byte more. Whoever finds such a file
// makes the semaphore, under the file's lock, whether it created the file or the creator was killed.
#include "tavo_osal/ipc_semaphore.h"

#include <fcntl.h>
#include <semaphore.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <thread>
#include <utility>

#include "log/cancel_shield.h"
#include "log/module_log.h"

#ifdef __EXCEPTIONS
#error "build this file with -fno-exceptions"
#endif

namespace {

constexpr char kTag[] = "TAVO_OSAL";
constexpr mode_t kFileMode = 0666;
constexpr mode_t kFinishedMode = 0775;
constexpr auto kPatience = std::chrono::seconds(5);
constexpr auto kPollInterval = std::chrono::milliseconds(1);

constexpr off_t kFinishedLength = sizeof(sem_t);
constexpr off_t kUnfinishedLength = kFinishedLength + 1;

struct Path {
    explicit Path(uint32_t key) {
        char name[64];
        snprintf(name, sizeof name, "%u", key);
        snprintf(text, sizeof text, "%s/%s", TAVO_STORAGE_ROOT, name);
    }
    char text[256];
};

// A mapping of the semaphore, removed unless it is handed out.
class Mapping {
public:
    explicit Mapping(int fd)
        : sem_(static_cast<sem_t*>(mmap(nullptr, sizeof(sem_t), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0))) {}
    ~Mapping() {
        if (sem_ != MAP_FAILED) munmap(sem_, sizeof(sem_t));
    }
    Mapping(const Mapping&) = delete;
    Mapping& operator=(const Mapping&) = delete;

    sem_t* get() const { return sem_; }
    sem_t* release() { return std::exchange(sem_, static_cast<sem_t*>(MAP_FAILED)); }

private:
    sem_t* sem_;
};

enum class FileState { kFinished, kUnfinished, kForeign };

class SemaphoreFile {
public:
    // Opens the file, or creates it. Where another process creates it first, that one is opened.
    explicit SemaphoreFile(const char* path) : fd_(open(path, O_RDWR | O_CLOEXEC)) {
        if (fd_ >= 0) return;
        fd_ = open(path, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, kFileMode);
        created_ = fd_ >= 0;
        if (!created_ && errno == EEXIST) fd_ = open(path, O_RDWR | O_CLOEXEC);
    }
    ~SemaphoreFile() {
        // The lock belongs to the open file, which the mapping keeps open after this.
        if (locked_) flock(fd_, LOCK_UN);
        if (fd_ >= 0) close(fd_);
    }
    SemaphoreFile(const SemaphoreFile&) = delete;
    SemaphoreFile& operator=(const SemaphoreFile&) = delete;

    FileState state() const {
        struct stat status = {};
        if (fd_ < 0 || fstat(fd_, &status) != 0 || !S_ISREG(status.st_mode)) return FileState::kForeign;
        if (status.st_size == kFinishedLength) return FileState::kFinished;
        const bool begun = status.st_size == 0 || status.st_size == kUnfinishedLength;
        return begun ? FileState::kUnfinished : FileState::kForeign;
    }

    // Waits until somebody has finished the file, or until this process may: kUnfinished means that it may. A process
    // that is killed gives its lock up, but one that is stopped does not, so patience has an end: kForeign.
    FileState wait_for_turn() {
        const auto deadline = std::chrono::steady_clock::now() + kPatience;
        for (;;) {
            locked_ = flock(fd_, LOCK_EX | LOCK_NB) == 0;
            // Where files cannot be locked, only the creator makes the semaphore.
            const bool is_turn = locked_ || (created_ && errno != EWOULDBLOCK);
            const FileState now = state();
            if (is_turn || now != FileState::kUnfinished) return now;
            if (std::chrono::steady_clock::now() >= deadline) return FileState::kForeign;
            std::this_thread::sleep_for(kPollInterval);
        }
    }

    // Makes the semaphore; MAP_FAILED on failure, which leaves the file for the next one to finish.
    sem_t* make() const {
        const char zeros[kUnfinishedLength] = {};
        fchmod(fd_, kFinishedMode);
        // Written, not just lengthened: on a full disk, a mapping of bytes that were never written would kill its
        // users.
        if (pwrite(fd_, zeros, sizeof zeros, 0) != static_cast<ssize_t>(sizeof zeros)) {
            // A part of them would look like somebody else's file.
            [[maybe_unused]] const int result = ftruncate(fd_, 0);
            return failed();
        }
        Mapping mapping(fd_);
        if (mapping.get() == MAP_FAILED) return failed();
        memset(mapping.get(), 0, sizeof(sem_t));
        if (sem_init(mapping.get(), 1, 1) == -1) return failed();
        if (ftruncate(fd_, kFinishedLength) != 0) return failed();
        return mapping.release();
    }

    sem_t* map() const { return Mapping(fd_).release(); }

private:
    static sem_t* failed() { return static_cast<sem_t*>(MAP_FAILED); }

    int fd_;
    bool created_ = false;
    bool locked_ = false;
};

// Addresses are sign-extended, as 32-bit callers store them.
TAVO_INT64 handle_of(const sem_t* sem) { return reinterpret_cast<intptr_t>(sem); }
sem_t* semaphore_of(TAVO_INT64 handle) { return reinterpret_cast<sem_t*>(static_cast<intptr_t>(handle)); }

// Neither 0, for nothing, nor -1, for what could not be mapped, is a semaphore: the platform would be killed by them.
bool is_semaphore(const sem_t* sem) { return sem != nullptr && sem != MAP_FAILED; }

[[gnu::cold, gnu::noinline]] TAVO_Status failed(const char* message, int line = __builtin_LINE()) {
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "%s", message);
    return TAVO_FAILURE;
}

}  // namespace

TAVO_Status tavo_semaphore_key_create(void) { return TAVO_SUCCESS; }

TAVO_Status tavo_semaphore_init(uint32_t uiKey, TAVO_INT64* piSem) {
    // A cancelled thread finishes the file first: nobody can release its lock while the process lives.
    const tavo::CancelShield shield;
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    if (piSem == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameter\n");
        return TAVO_INVALID_PARAM;
    }
    const Path path(uiKey);
    SemaphoreFile file(path.text);
    FileState state = file.state();
    if (state == FileState::kUnfinished) state = file.wait_for_turn();
    if (state == FileState::kForeign) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Error in open shm_file %s\n", path.text);
        return TAVO_FAILURE;
    }
    // Only a semaphore that is made here is looked at; what a finished file is mapped to is handed out as it is.
    // Callers depend on the success.
    const sem_t* sem = state == FileState::kUnfinished ? file.make() : file.map();
    if (sem == MAP_FAILED && state == FileState::kUnfinished) return failed("Failed to create Semaphore\n");
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "Semaphore created %p \n", static_cast<const void*>(sem));
    *piSem = handle_of(sem);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_semaphore_acquire(TAVO_INT64 iSem) {
    sem_t* sem = semaphore_of(iSem);
    if (!is_semaphore(sem)) {
        errno = EINVAL;
    } else if (sem_wait(sem) == 0) {
        return TAVO_SUCCESS;
    }
    return failed("Semaphore Wait failed !");
}

TAVO_Status tavo_semaphore_release(TAVO_INT64 iSem) {
    sem_t* sem = semaphore_of(iSem);
    if (!is_semaphore(sem)) {
        errno = EINVAL;
    } else if (sem_post(sem) == 0) {
        return TAVO_SUCCESS;
    }
    return failed("Release failed !");
}

TAVO_Status tavo_semaphore_delete(TAVO_INT64 iSem) {
    sem_t* sem = semaphore_of(iSem);
    if (sem == nullptr || munmap(sem, sizeof(sem_t)) == 0) return TAVO_SUCCESS;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "Deleting the semaphore failed. errno is 0x%x.\n", static_cast<unsigned>(errno));
    return TAVO_SEM_DELETE_FAILED;
}

#include <android/log.h>
#include <binder/MemoryHeapBase.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

namespace android {
namespace {

constexpr char kTag[] = "MemoryHeapBase";
// What memfd_create leaves of a file name's 255 bytes behind its own prefix.
constexpr size_t kMaxNameLength = 249;

void logFailure(const char* call) {
    __android_log_print(ANDROID_LOG_ERROR, kTag, "%s failed: %s", call, strerror(errno));
}

size_t wholePages(size_t size) {
    const auto page = static_cast<size_t>(sysconf(_SC_PAGESIZE));
    return size > SIZE_MAX - page ? size : (size + page - 1) / page * page;
}

// A memory file that cannot shrink under those who map it; -1, logged, on failure.
int makeFile(const char* name, size_t size) {
    const std::string shown(name, strnlen(name, kMaxNameLength));
    const int fd = memfd_create(shown.c_str(), MFD_CLOEXEC | MFD_ALLOW_SEALING);
    if (fd < 0) {
        logFailure("memfd_create");
        return -1;
    }
    if (ftruncate(fd, static_cast<off_t>(size)) == 0) return fd;
    logFailure("ftruncate");
    close(fd);
    return -1;
}

}  // namespace

MemoryHeapBase::MemoryHeapBase(size_t size, uint32_t flags, const char* name) : mFlags(flags) {
    const size_t whole = wholePages(size);
    mFD = makeFile(name != nullptr ? name : "MemoryHeapBase", whole);
    if (mFD < 0) return;
    if (!map(whole, 0)) {
        dispose();
        return;
    }
    // This process's own mapping stays writable; nobody can make another writable one. Older kernels cannot say so.
    if ((flags & READ_ONLY) != 0) fcntl(mFD, F_ADD_SEALS, F_SEAL_FUTURE_WRITE);
    if (fcntl(mFD, F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL) != 0) logFailure("F_ADD_SEALS");
}

MemoryHeapBase::MemoryHeapBase(int fd, size_t size, uint32_t flags, uint32_t offset) : mFlags(flags) {
    mFD = fcntl(fd, F_DUPFD_CLOEXEC, 0);
    if (mFD < 0) {
        logFailure("F_DUPFD_CLOEXEC");
        return;
    }
    struct stat status = {};
    if (size == 0 && fstat(mFD, &status) == 0) {
        // Offsets may go further than the platform's own type for them.
        const auto end = static_cast<uint64_t>(status.st_size);
        if (end > offset) size = static_cast<size_t>(end - offset);
    }
    if (!map(size, offset)) dispose();
}

MemoryHeapBase::~MemoryHeapBase() { dispose(); }

bool MemoryHeapBase::map(size_t size, uint32_t offset) {
    if ((mFlags & DONT_MAP_LOCALLY) != 0) {
        mBase = nullptr;
    } else {
        void* base = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, mFD, static_cast<off_t>(offset));
        if (base == MAP_FAILED) {
            logFailure("mmap");
            return false;
        }
        mBase = base;
        mMapped = true;
    }
    mSize = size;
    mOffset = offset;
    return true;
}

void MemoryHeapBase::dispose() {
    if (mMapped) munmap(mBase, mSize);
    if (mFD >= 0) close(mFD);
    mMapped = false;
    mBase = MAP_FAILED;
    mSize = 0;
    mFD = -1;
}

}  // namespace android

#include "tools/semaphore_files.h"

#include <dirent.h>
#include <fcntl.h>
#include <semaphore.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <memory>

#include "tools/service.h"

namespace tavo::tool {
namespace {

using Directory = std::unique_ptr<DIR, int (*)(DIR*)>;

bool is_number(const std::string& name) {
    return !name.empty() && name.find_first_not_of("0123456789") == std::string::npos;
}

// Whether a line of /proc/PID/maps is of this file. Some file systems give their files another device there.
bool is_mapping_of(const std::string& line, const struct stat& file, const std::string& path) {
    unsigned device_major = 0, device_minor = 0;
    unsigned long long inode = 0;
    int name_at = 0;
    if (sscanf(line.c_str(), "%*s %*s %*s %x:%x %llu %n", &device_major, &device_minor, &inode, &name_at) < 3) {
        return false;
    }
    const bool same_device = device_major == major(file.st_dev) && device_minor == minor(file.st_dev);
    return inode == file.st_ino && (same_device || line.substr(static_cast<size_t>(name_at)) == path);
}

void find_users(SemaphoreFile& file, const struct stat& status) {
    const Directory processes(opendir("/proc"), closedir);
    while (const dirent* entry = processes != nullptr ? readdir(processes.get()) : nullptr) {
        const pid_t pid = is_number(entry->d_name) ? atoi(entry->d_name) : 0;
        if (pid <= 0 || pid == getpid()) continue;
        errno = 0;
        std::ifstream maps("/proc/" + std::to_string(pid) + "/maps");
        if (!maps && errno == EACCES) file.sees_all_users = false;
        bool uses = false;
        for (std::string line; !uses && std::getline(maps, line);) uses = is_mapping_of(line, status, file.path);
        if (uses) file.users.push_back(pid);
    }
}

SemaphoreState state_of(const struct stat& status) {
    if (!S_ISREG(status.st_mode)) return SemaphoreState::kForeign;
    if (status.st_size == sizeof(sem_t)) return SemaphoreState::kFinished;
    const bool begun = status.st_size == 0 || status.st_size == sizeof(sem_t) + 1;
    return begun ? SemaphoreState::kUnfinished : SemaphoreState::kForeign;
}

}  // namespace

SemaphoreFile look_at_semaphore(uint32_t key) {
    SemaphoreFile file;
    file.key = key;
    file.path = storage_root() + "/" + std::to_string(key);
    const int fd = open(file.path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0) {
        file.state = errno == ENOENT ? SemaphoreState::kMissing : SemaphoreState::kUnreadable;
        return file;
    }
    struct stat status = {};
    file.state = fstat(fd, &status) == 0 ? state_of(status) : SemaphoreState::kUnreadable;
    if (file.state == SemaphoreState::kFinished) {
        void* mapping = mmap(nullptr, sizeof(sem_t), PROT_READ, MAP_SHARED, fd, 0);
        if (mapping == MAP_FAILED) {
            file.state = SemaphoreState::kUnreadable;
        } else {
            sem_getvalue(static_cast<sem_t*>(mapping), &file.count);
            munmap(mapping, sizeof(sem_t));
        }
    }
    close(fd);
    find_users(file, status);
    return file;
}

std::vector<SemaphoreFile> look_at_semaphores() {
    std::vector<SemaphoreFile> files;
    const Directory root(opendir(storage_root().c_str()), closedir);
    while (const dirent* entry = root != nullptr ? readdir(root.get()) : nullptr) {
        const std::string name = entry->d_name;
        const unsigned long long key = is_number(name) ? strtoull(name.c_str(), nullptr, 10) : UINT64_MAX;
        // Names with zeros in front are nobody's.
        if (key <= UINT32_MAX && std::to_string(key) == name) {
            files.push_back(look_at_semaphore(static_cast<uint32_t>(key)));
        }
    }
    std::sort(files.begin(), files.end(), [](const auto& a, const auto& b) { return a.key < b.key; });
    return files;
}

}  // namespace tavo::tool

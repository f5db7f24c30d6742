#include "ipc/descriptors.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

namespace tavo::test {

bool is_open(int descriptor) { return fcntl(descriptor, F_GETFD) >= 0; }

ino_t file_of(int descriptor) {
    struct stat status = {};
    return fstat(descriptor, &status) == 0 ? status.st_ino : 0;
}

size_t count_pipe_ends(ino_t pipe, pid_t pid) {
    const std::string path = "/proc/" + (pid == 0 ? std::string("self") : std::to_string(pid)) + "/fd/";
    const std::string wanted = "pipe:[" + std::to_string(pipe) + "]";
    DIR* directory = opendir(path.c_str());
    if (directory == nullptr) return 0;
    size_t count = 0;
    while (const dirent* entry = readdir(directory)) {
        char target[64] = {};
        const std::string link = path + entry->d_name;
        count += readlink(link.c_str(), target, sizeof target - 1) > 0 && target == wanted;
    }
    closedir(directory);
    return count;
}

DescriptorLimit::DescriptorLimit(unsigned more) {
    getrlimit(RLIMIT_NOFILE, &saved_);
    // The limit is on the numbers, which are given from the lowest free one on.
    rlimit limited = {0, saved_.rlim_max};
    for (unsigned free = 0; free < more; ++limited.rlim_cur) {
        free += is_open(static_cast<int>(limited.rlim_cur)) ? 0 : 1;
    }
    setrlimit(RLIMIT_NOFILE, &limited);
}

DescriptorLimit::~DescriptorLimit() { setrlimit(RLIMIT_NOFILE, &saved_); }

NoInput::NoInput() : saved_(fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 3)) { close(STDIN_FILENO); }

NoInput::~NoInput() {
    dup2(saved_, STDIN_FILENO);
    close(saved_);
}

}  // namespace tavo::test

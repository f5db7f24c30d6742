#include "RuntimeDirectory.h"

#include <android/log.h>
#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <thread>

#include "Frame.h"

namespace android::socket_driver {
namespace {

constexpr char kLogTag[] = "BinderSocket";
constexpr size_t kMaxNameSize = 255;
constexpr int kBacklog = 128;
constexpr size_t kTemporaryLength = 17;
constexpr int kAttempts = 1000;
constexpr std::chrono::milliseconds kPause{1};

// A path that everybody on the machine can create must be checked to be this user's before it is used.
struct Place {
    std::string path;
    bool shared;
};

Place choosePlace() {
    const char* chosen = getenv("BINDER_RUNTIME_DIR");
    if (chosen != nullptr && *chosen != '\0') return {chosen, false};
    const char* session = getenv("XDG_RUNTIME_DIR");
    if (session != nullptr && *session != '\0') return {std::string(session) + "/binder", false};
    return {"/tmp/binder-" + std::to_string(geteuid()), true};
}

// Paths of what is open already are short, however long the directory's own path is.
std::string pathOf(int fd) { return "/proc/self/fd/" + std::to_string(fd); }

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    return address;
}

bool connectTo(int socket, int path) {
    const sockaddr_un address = addressOf(pathOf(path));
    int result = -1;
    do {
        result = connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    } while (result != 0 && errno == EINTR);
    return result == 0;
}

}  // namespace

status_t RuntimeDirectory::open(RuntimeDirectory& directory) {
    const Place place = choosePlace();
    const auto fail = [&place](const char* what) {
        const int error = errno;
        __android_log_print(ANDROID_LOG_ERROR, kLogTag, "cannot %s %s: %s", what, place.path.c_str(), strerror(error));
        return -error;
    };
    if (mkdir(place.path.c_str(), 0700) != 0 && errno != EEXIST) return fail("make");
    UniqueFd fd(::open(place.path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC | (place.shared ? O_NOFOLLOW : 0)));
    struct stat status {};
    if (!fd.valid() || fstat(fd.get(), &status) != 0) return fail("open");
    if (place.shared && (status.st_uid != geteuid() || (status.st_mode & 077) != 0)) {
        __android_log_print(ANDROID_LOG_ERROR, kLogTag, "%s is open to other users: not used", place.path.c_str());
        return PERMISSION_DENIED;
    }
    directory.directory_ = std::move(fd);
    return OK;
}

bool RuntimeDirectory::isValidName(const std::string& name) {
    return !name.empty() && name.size() <= kMaxNameSize && name[0] != '.' && name.find('/') == std::string::npos &&
           name.find('\0') == std::string::npos;
}

// Everybody who is about to publish holds a shared lock on the directory, which ends with the process at the latest.
// Whoever is alone in it removes what others that were killed there have left. Where the directory cannot be locked, or
// somebody stands still while he has it to himself, publishing goes on without: names matter more than tidiness.
UniqueFd RuntimeDirectory::takePart() const {
    UniqueFd part(openat(directory_.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!part.valid()) return part;
    if (flock(part.get(), LOCK_EX | LOCK_NB) == 0) removeAbandoned();
    for (int i = 0; i < kAttempts && flock(part.get(), LOCK_SH | LOCK_NB) != 0; ++i) {
        std::this_thread::sleep_for(kPause);
    }
    return part;
}

void RuntimeDirectory::removeAbandoned() const {
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(opendir(pathOf(directory_.get()).c_str()), closedir);
    if (entries == nullptr) return;
    while (const dirent* entry = readdir(entries.get())) {
        FileId id;
        const std::string name = entry->d_name;
        const bool isTemporary = name.size() == kTemporaryLength && name[0] == '.' &&
                                 name.find_first_not_of("0123456789abcdef", 1) == std::string::npos;
        if (isTemporary && identify(name, id)) unlinkat(directory_.get(), name.c_str(), 0);
    }
}

status_t RuntimeDirectory::listen(Unnamed& unnamed) const {
    unnamed.presence = takePart();
    unsigned long long random = 0;
    if (getrandom(&random, sizeof random, 0) != sizeof random) return -errno;
    char temporary[32];
    snprintf(temporary, sizeof temporary, ".%016llx", random);

    const sockaddr_un address = addressOf(pathOf(directory_.get()) + "/" + temporary);
    UniqueFd fd(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!fd.valid()) return -errno;
    if (bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) return -errno;
    unnamed.temporary = temporary;

    // Who may reach the service is decided by the directory's permissions, not by this process's file mask.
    const bool ready = fchmodat(directory_.get(), temporary, 0666, 0) == 0 && ::listen(fd.get(), kBacklog) == 0 &&
                       identify(temporary, unnamed.file);
    if (!ready) {
        const status_t error = -errno;
        discard(unnamed);
        return error;
    }
    unnamed.socket = std::move(fd);
    return OK;
}

status_t RuntimeDirectory::give(const Unnamed& unnamed, const std::string& name) const {
    const int directory = directory_.get();
    return renameat(directory, unnamed.temporary.c_str(), directory, name.c_str()) == 0 ? OK : -errno;
}

void RuntimeDirectory::discard(const Unnamed& unnamed) const {
    unlinkat(directory_.get(), unnamed.temporary.c_str(), 0);
}

status_t RuntimeDirectory::connect(const std::string& name, Found& found) const {
    // By way of a descriptor: a name may be longer than an address holds.
    found.path.reset(openat(directory_.get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    if (!found.path.valid()) return errno == ENOENT ? NAME_NOT_FOUND : -errno;
    struct stat status {};
    if (fstat(found.path.get(), &status) != 0) return -errno;
    found.file = {status.st_dev, status.st_ino};
    UniqueFd fd(socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    if (!fd.valid()) return -errno;
    limitWaits(fd.get());
    if (!connectTo(fd.get(), found.path.get())) return errno == ECONNREFUSED ? NAME_NOT_FOUND : -errno;
    found.connection = std::move(fd);
    return OK;
}

bool RuntimeDirectory::identify(const std::string& name, FileId& id) const {
    struct stat status {};
    if (fstatat(directory_.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 || !S_ISSOCK(status.st_mode)) {
        return false;
    }
    id = {status.st_dev, status.st_ino};
    return true;
}

std::vector<std::string> RuntimeDirectory::list() const {
    std::vector<std::string> names;
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(opendir(pathOf(directory_.get()).c_str()), closedir);
    if (entries == nullptr) return names;
    while (const dirent* entry = readdir(entries.get())) {
        FileId id;
        if (isValidName(entry->d_name) && identify(entry->d_name, id) && isListenedTo(entry->d_name)) {
            names.emplace_back(entry->d_name);
        }
    }
    std::sort(names.begin(), names.end());
    return names;
}

// Asks for a connection of the wrong kind, which disturbs nobody: there is another answer to it where nobody listens.
bool RuntimeDirectory::isListenedTo(const char* name) const {
    const UniqueFd path(openat(directory_.get(), name, O_PATH | O_NOFOLLOW | O_CLOEXEC));
    const UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    return path.valid() && fd.valid() && !connectTo(fd.get(), path.get()) && errno == EPROTOTYPE;
}

}  // namespace android::socket_driver

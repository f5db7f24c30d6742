// Redirects the calls of the library that take a path. tests/testing/check_path_calls.sh sees to it that none is left
// out.
#include "tavo_osal/testing/private_storage.hpp"

#include <fcntl.h>
#include <sys/ipc.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <list>
#include <mutex>

#include "tavo_osal/testing/platform_hook.hpp"

namespace tavo::test {
namespace {

constexpr char kRoot[] = TAVO_STORAGE_ROOT;
constexpr size_t kRootLength = sizeof kRoot - 1;

std::mutex g_mutex;
std::string* g_directory = nullptr;  // null while nothing is redirected

// A path, in the private directory if it is one of the storage.
class Redirected {
public:
    explicit Redirected(const char* path) : given_(path) {
        const std::lock_guard<std::mutex> lock(g_mutex);
        if (path == nullptr || g_directory == nullptr || strncmp(path, kRoot, kRootLength) != 0) return;
        if (path[kRootLength] != '/' && path[kRootLength] != '\0') return;
        inside_ = *g_directory + (path + kRootLength);
        given_ = nullptr;
    }
    operator const char*() const { return given_ != nullptr || inside_.empty() ? given_ : inside_.c_str(); }

private:
    const char* given_;
    std::string inside_;
};

int hooked_access(const char* path, int mode) { return access(Redirected(path), mode); }
int hooked_chmod(const char* path, mode_t mode) { return chmod(Redirected(path), mode); }
FILE* hooked_fopen(const char* path, const char* mode) { return fopen(Redirected(path), mode); }
key_t hooked_ftok(const char* path, int project) { return ftok(Redirected(path), project); }
int hooked_mkdir(const char* path, mode_t mode) { return mkdir(Redirected(path), mode); }
int hooked_stat(const char* path, struct stat* result) { return stat(Redirected(path), result); }
int hooked_unlink(const char* path) { return unlink(Redirected(path)); }

// The mode is passed whenever there may be one.
int hooked_open(const char* path, int flags, ...) {
    mode_t mode = 0;
    if ((flags & O_CREAT) != 0) {
        va_list values;
        va_start(values, flags);
        mode = static_cast<mode_t>(va_arg(values, int));
        va_end(values);
    }
    return open(Redirected(path), flags, mode);
}
int hooked_open_2(const char* path, int flags) { return open(Redirected(path), flags); }

template <typename Function>
void* address(Function* function) {
    return reinterpret_cast<void*>(function);
}

struct Redirection {
    const char* function;
    void* replacement;
};

void redirect_to(const std::string* directory) {
    static std::list<PlatformHook>& hooks = *new std::list<PlatformHook>;
    if (hooks.empty()) {
        // By the names that the C library's headers make of them as well, with 64-bit files or with checks.
        // Not a global: a program's constructors may come here before this file's.
        const Redirection redirections[] = {
            {"access", address(hooked_access)},   {"chmod", address(hooked_chmod)},
            {"fopen", address(hooked_fopen)},     {"fopen64", address(hooked_fopen)},
            {"ftok", address(hooked_ftok)},       {"mkdir", address(hooked_mkdir)},
            {"open", address(hooked_open)},       {"open64", address(hooked_open)},
            {"__open_2", address(hooked_open_2)}, {"__open64_2", address(hooked_open_2)},
            {"stat", address(hooked_stat)},       {"unlink", address(hooked_unlink)},
        };
        for (const Redirection& each : redirections) {
            hooks.emplace_back(object_named("libtavoosal.so"), each.function, each.replacement);
        }
    }
    const std::lock_guard<std::mutex> lock(g_mutex);
    delete g_directory;
    g_directory = directory != nullptr ? new std::string(*directory) : nullptr;
}

std::string made_directory(const char* kind) {
    const char* base = getenv("TMPDIR");
    std::string path = std::string(base != nullptr && *base != '\0' ? base : "/tmp") + "/tavo-" + kind + "-XXXXXX";
    if (mkdtemp(path.data()) == nullptr) {
        fprintf(stderr, "no private storage: %s: %s\n", path.c_str(), strerror(errno));
        abort();
    }
    return path;
}

void remove_directory(const std::string& path) {
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
}

// Where services are published is decided once in a process.
class RuntimeDirectory {
public:
    RuntimeDirectory() : path_(made_directory("services")), owner_(getpid()) {
        setenv("BINDER_RUNTIME_DIR", path_.c_str(), 1);
    }
    ~RuntimeDirectory() {
        if (getpid() == owner_) remove_directory(path_);
    }
    RuntimeDirectory(const RuntimeDirectory&) = delete;
    RuntimeDirectory& operator=(const RuntimeDirectory&) = delete;

private:
    std::string path_;
    pid_t owner_;
};

}  // namespace

PrivateStorage::PrivateStorage() : path_(made_directory("storage")) {
    static const RuntimeDirectory services;
    redirect_to(&path_);
}

PrivateStorage::~PrivateStorage() {
    redirect_to(nullptr);
    remove_directory(path_);
}

const char* PrivateStorage::storage_root() { return kRoot; }

void redirect_storage(const std::string& directory) { redirect_to(&directory); }

}  // namespace tavo::test

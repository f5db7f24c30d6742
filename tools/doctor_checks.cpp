#include "tools/doctor_checks.h"

#include <dirent.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>

#include "tools/command.h"
#include "tools/numbers.h"
#include "tools/semaphore_files.h"
#include "tools/service.h"

namespace tavo::tool {
namespace {

constexpr uint64_t kLittleSpace = 1 << 20;
constexpr unsigned long kFewDescriptors = 256;
constexpr long kLargestPipe = 1 << 20;

std::string counted(size_t count, const char* what) {
    return std::to_string(count) + " " + what + (count == 1 ? "" : "s");
}

std::string mode_of(const struct stat& status) {
    char text[16];
    snprintf(text, sizeof text, "%04o", status.st_mode & 07777U);
    return text;
}

std::string value_of(const char* variable) {
    const char* value = getenv(variable);
    return value != nullptr ? value : "";
}

// The number in a file of /proc/sys; -1 where there is none.
long setting_of(const char* path) {
    std::ifstream file(path);
    long number = -1;
    return file >> number ? number : -1;
}

}  // namespace

void check_storage_root(Findings& findings) {
    const std::string root = storage_root();
    struct stat status = {};
    if (stat(root.c_str(), &status) != 0) {
        findings.push_back({Health::kProblem, "storage", root + ": " + strerror(errno),
                            "make this directory: marker, keys and semaphores live in it"});
        return;
    }
    if (!S_ISDIR(status.st_mode)) {
        findings.push_back({Health::kProblem, "storage", root + " is no directory", "make it one"});
        return;
    }
    const std::string described = root + ", mode " + mode_of(status) + ", owner " + std::to_string(status.st_uid);
    if (access(root.c_str(), R_OK | W_OK | X_OK) != 0) {
        findings.push_back({Health::kProblem, "storage", described + ": not readable and writable for this user",
                            "give user " + std::to_string(geteuid()) + " access to it"});
        return;
    }
    struct statvfs space = {};
    const bool known = statvfs(root.c_str(), &space) == 0;
    const uint64_t left = known ? uint64_t{space.f_bavail} * space.f_frsize : UINT64_MAX;
    if (left < kLittleSpace) {
        findings.push_back({Health::kProblem, "storage", described + ": " + std::to_string(left) + " bytes are left",
                            "make room: keys and semaphores cannot be written on a full disk"});
        return;
    }
    findings.push_back({Health::kGood, "storage", described, ""});
}

void check_service(Findings& findings) {
    const std::string marker = marker_path();
    const bool has_marker = access(marker.c_str(), F_OK) == 0;
    if (has_marker && access(marker.c_str(), R_OK) != 0) {
        findings.push_back({Health::kProblem, "marker", marker + " cannot be read by this user",
                            "chmod 0777 it, as the service does: clients look for it"});
    }
    Binder service;
    try {
        service = look_up_service();
    } catch (const Failure& failure) {
        findings.push_back({Health::kProblem, "service", failure.what(), "end its process and start it anew"});
        return;
    }
    if (service == nullptr && has_marker) {
        findings.push_back({Health::kProblem, "marker", marker + " is there, but no service answers",
                            "start the service ('tavo serve'), or remove the marker: as long as it is there, clients "
                            "wait five seconds before they fail"});
        return;
    }
    if (service == nullptr) {
        findings.push_back({Health::kNote, "service", "not running, nor has it been", "'tavo serve' starts it"});
        return;
    }
    if (!has_marker) {
        findings.push_back({Health::kProblem, "marker", marker + " is missing, although the service runs",
                            "start the service anew, which makes it: clients do not find the service without it"});
    }
    try {
        const ServiceFigures figures = figures_of(service);
        const std::string process = "process " + std::to_string(figures.process);
        if (figures.has_queue_table && figures.has_block_list) {
            findings.push_back({Health::kGood, "service",
                                process + " answers, with " + counted(figures.queues.size(), "queue") + " and " +
                                    counted(figures.blocks.size(), "block"),
                                ""});
        } else {
            findings.push_back({Health::kProblem, "service", process + " could not initialise its tables",
                                "start it anew, with limits that are not 0, where it can write " + storage_root()});
        }
    } catch (const Failure& failure) {
        findings.push_back({Health::kProblem, "service", failure.what(), "end its process and start it anew"});
    }
}

namespace {

// Whether this process, which has looked the service up by now, has the kernel's driver open.
bool uses_kernel_driver() {
    const std::unique_ptr<DIR, int (*)(DIR*)> descriptors(opendir("/proc/self/fd"), closedir);
    while (const dirent* entry = descriptors != nullptr ? readdir(descriptors.get()) : nullptr) {
        char target[256] = {};
        const std::string link = std::string("/proc/self/fd/") + entry->d_name;
        if (readlink(link.c_str(), target, sizeof target - 1) > 0 && strncmp(target, "/dev/", 5) == 0 &&
            strstr(target, "binder") != nullptr) {
            return true;
        }
    }
    return false;
}

std::string runtime_directory() {
    if (std::string chosen = value_of("BINDER_RUNTIME_DIR"); !chosen.empty()) return chosen;
    if (const std::string session = value_of("XDG_RUNTIME_DIR"); !session.empty()) return session + "/binder";
    return "/tmp/binder-" + std::to_string(geteuid());
}

}  // namespace

void check_driver(Findings& findings) {
    const std::string named = value_of("BINDER_DRIVER");
    if (uses_kernel_driver()) {
        findings.push_back({Health::kGood, "driver", "the kernel's", ""});
        return;
    }
    if (!named.empty() && named != "socket") {
        findings.push_back({Health::kProblem, "driver",
                            "BINDER_DRIVER names '" + named + "', which could not be opened",
                            "unset BINDER_DRIVER, or name a driver that is there, such as socket"});
        return;
    }
    const std::string directory = runtime_directory();
    struct stat status = {};
    if (stat(directory.c_str(), &status) != 0) {
        findings.push_back({Health::kProblem, "driver", "sockets in " + directory + ": " + strerror(errno),
                            "make the directory, or name another in BINDER_RUNTIME_DIR"});
    } else if (!S_ISDIR(status.st_mode) || access(directory.c_str(), R_OK | W_OK | X_OK) != 0) {
        findings.push_back({Health::kProblem, "driver",
                            "sockets in " + directory + ", mode " + mode_of(status) + ", which this user may not use",
                            "give user " + std::to_string(geteuid()) +
                                " access to it, or name another directory in "
                                "BINDER_RUNTIME_DIR"});
    } else {
        findings.push_back(
            {Health::kGood, "driver",
             "sockets in " + directory + ", mode " + mode_of(status) + ", owner " + std::to_string(status.st_uid), ""});
    }
}

namespace {

Finding finding_on(const SemaphoreFile& file) {
    const std::string key = std::to_string(file.key);
    const std::string subject = "semaphore " + key;
    switch (file.state) {
        case SemaphoreState::kForeign:
            return {Health::kProblem, subject, file.path + " holds no semaphore of this machine's word size",
                    "remove the file, or leave key " + key + " alone"};
        case SemaphoreState::kUnreadable:
            return {Health::kProblem, subject, file.path + " cannot be read by this user", "give it access"};
        case SemaphoreState::kUnfinished:
            return {Health::kNote, subject, "was not finished by whoever made it", "the next user finishes it"};
        default: break;
    }
    const std::string count = "count " + std::to_string(file.count);
    if (!file.users.empty()) {
        return {Health::kGood, subject, count + ", used by " + std::to_string(file.users.size()) + " processes", ""};
    }
    const std::string unused =
        count + (file.sees_all_users ? ", used by no process" : ", used by no process that this user may look into");
    if (file.count == 0) {
        return {Health::kProblem, subject, unused + ": whoever held it is gone, and the next to wait waits for ever",
                "'tavo sem post " + key + "' releases it, 'tavo sem destroy " + key + "' removes it"};
    }
    if (file.count > 1) {
        return {Health::kProblem, subject, unused + ": it was released more often than taken, and lets several in",
                "'tavo sem destroy " + key + "' removes it, and the next user makes it anew"};
    }
    return {Health::kNote, subject, unused, "'tavo sem destroy " + key + "' removes it, if it is not needed any more"};
}

}  // namespace

void check_semaphores(Findings& findings) {
    const std::vector<SemaphoreFile> files = look_at_semaphores();
    for (const SemaphoreFile& file : files) findings.push_back(finding_on(file));
    if (files.empty()) findings.push_back({Health::kGood, "semaphores", "none", ""});
}

void check_key_files(Findings& findings) {
    const std::string index = storage_root() + "/shm_key_index_file.txt";
    const std::string generator = storage_root() + "/shm_key_gen_file.txt";
    struct stat status = {};
    if (stat(index.c_str(), &status) != 0) {
        findings.push_back({Health::kNote, "keys of blocks", index + " is missing",
                            "the service makes it; without it every key that is made is 0xffffffff"});
    } else if (access(index.c_str(), R_OK | W_OK) != 0) {
        findings.push_back({Health::kProblem, "keys of blocks", index + " is not readable and writable for this user",
                            "chmod 0777 it: without it every key that is made is 0xffffffff"});
    } else if (status.st_size != sizeof(int32_t)) {
        findings.push_back({Health::kProblem, "keys of blocks",
                            index + " has " + std::to_string(status.st_size) + " bytes instead of 4",
                            "start the service anew, which sets it back"});
    } else {
        int32_t number = 0;
        std::ifstream(index, std::ios::binary).read(reinterpret_cast<char*>(&number), sizeof number);
        findings.push_back(
            {Health::kGood, "keys of blocks", index + " has counted up to " + std::to_string(number), ""});
    }
    if (access(generator.c_str(), F_OK) != 0) {
        findings.push_back({Health::kNote, "keys of blocks", generator + " is missing",
                            "make an empty file of this name if you want keys to be made for you: without it each is "
                            "0xffffffff"});
    }
}

void check_limits(Findings& findings) {
    rlimit descriptors = {};
    getrlimit(RLIMIT_NOFILE, &descriptors);
    const std::string limit = "this user's processes may have " + std::to_string(descriptors.rlim_cur) + " descriptors";
    if (descriptors.rlim_cur < kFewDescriptors) {
        findings.push_back({Health::kProblem, "limits", limit, "raise it ('ulimit -n'): every queue takes two"});
    } else {
        findings.push_back({Health::kGood, "limits", limit, ""});
    }
    const long pages = setting_of("/proc/sys/fs/pipe-user-pages-soft");
    const long page = sysconf(_SC_PAGESIZE);
    if (pages > 0) {
        const std::string room =
            "pipes of one user share " + short_number(static_cast<double>(pages * page)) + " bytes";
        findings.push_back({pages < 1024 ? Health::kProblem : Health::kGood, "limits", room,
                            pages < 1024 ? "raise fs.pipe-user-pages-soft: new queues will hold next to nothing" : ""});
    }
    const long largest = setting_of("/proc/sys/fs/pipe-max-size");
    if (largest >= 0) {
        const bool small = largest < kLargestPipe;
        findings.push_back({small ? Health::kNote : Health::kGood, "limits",
                            "a pipe may have " + std::to_string(largest) + " bytes",
                            small ? "raise fs.pipe-max-size to 1048576 if large messages are to go fast" : ""});
    }
}

}  // namespace tavo::tool

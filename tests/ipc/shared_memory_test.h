// Blocks as tests use them, where processes hold them, and what the family logs.
#pragma once

#include <dirent.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <vector>

#include "ipc/log_lines.h"
#include "support/log_capture.h"
#include "support/process.h"
#include "tavo_osal/shared_memory.h"

namespace tavo::test {

constexpr char kSharedMemoryTag[] = "TAVO_OSAL_SHARED_MEM";

inline TavoShmHandle* make_handle(uint32_t key, uint32_t size) {
    TavoShmHandle* handle = nullptr;
    EXPECT_EQ(tavo_shm_init(key, &handle, size), TAVO_SUCCESS);
    return handle;
}

// The address; null, and a failure of the test, when it could not be acquired.
inline void* acquire(uint32_t key, uint32_t size) {
    TavoShmHandle* handle = make_handle(key, size);
    void* address = nullptr;
    EXPECT_EQ(tavo_shm_acquire(handle, &address), TAVO_SUCCESS);
    free(handle);  // what tavo_shm_delete() would do, without the service
    return address;
}

// One acquisition, released at the end of its scope. The service's count of uses is left alone.
class Block {
public:
    Block(uint32_t key, uint32_t size) : address_(acquire(key, size)) {}
    ~Block() { tavo_shm_release(address_); }
    Block(const Block&) = delete;
    Block& operator=(const Block&) = delete;

    void* address() const { return address_; }
    unsigned char* bytes() const { return static_cast<unsigned char*>(address_); }

private:
    void* const address_;
};

// How often a process, 0 for this one, has the block of a key mapped: by its name, whose end the kernel shows escaped.
inline size_t count_blocks(uint32_t key, pid_t pid = 0) {
    return count_mappings(pid, "/memfd:SharedMemory_" + std::to_string(static_cast<int32_t>(key)) + "\\012");
}

// The descriptors of memory files whose name begins like this that a process holds.
inline size_t count_memory_files(pid_t pid = 0, const std::string& name = "SharedMemory_") {
    const std::string path = "/proc/" + (pid == 0 ? std::string("self") : std::to_string(pid)) + "/fd";
    DIR* directory = opendir(path.c_str());
    if (directory == nullptr) return 0;
    const std::string target = "/memfd:" + name;
    size_t count = 0;
    while (const dirent* entry = readdir(directory)) {
        char link[256] = {};
        if (readlinkat(dirfd(directory), entry->d_name, link, sizeof link - 1) < 0) continue;
        count += target.compare(0, target.size(), link, target.size()) == 0;
    }
    closedir(directory);
    return count;
}

// What the table's count is logged with: "++" or "--".
inline std::string count_text(const std::string& which, int count) {
    return "uiCnt" + which + " = " + std::to_string(count) + " pid = " + std::to_string(getpid()) + " \n";
}

inline std::vector<LogLine> shared_memory_lines(const LogCapture& log) {
    return library_lines(log, {kSharedMemoryTag, kHeapCountTag});
}

}  // namespace tavo::test

// Blocks as tests use them, and where processes hold them.
#pragma once

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include "support/process.h"
#include "tavo_osal/shared_memory.h"

namespace tavo::test {

inline TavoShmHandle* make_handle(uint32_t key, uint32_t size) {
    TavoShmHandle* handle = nullptr;
    EXPECT_EQ(tavo_shm_init(key, &handle, size), TAVO_SUCCESS);
    return handle;
}

// The address; null, and a failure of the test, when it could not be acquired.
void* acquire(uint32_t key, uint32_t size);

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
size_t count_memory_files(pid_t pid = 0, const std::string& name = "SharedMemory_");

}  // namespace tavo::test

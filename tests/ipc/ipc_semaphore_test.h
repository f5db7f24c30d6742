// One semaphore, its file, and its count.
#pragma once

#include <gtest/gtest.h>
#include <semaphore.h>
#include <sys/stat.h>

#include <cstdint>

#include "tavo_osal/ipc_semaphore.h"

namespace tavo::test {

constexpr char kSemaphoreTag[] = "TAVO_OSAL";
constexpr uint32_t kSemaphoreKey = 4660;
constexpr char kSemaphoreFile[] = "/sdcard/4660";

inline TAVO_INT64 open_semaphore(uint32_t key = kSemaphoreKey) {
    TAVO_INT64 handle = 0;
    EXPECT_EQ(tavo_semaphore_init(key, &handle), TAVO_SUCCESS);
    return handle;
}

inline sem_t* semaphore_of(TAVO_INT64 handle) { return reinterpret_cast<sem_t*>(static_cast<intptr_t>(handle)); }

inline int count_of(TAVO_INT64 handle) {
    int count = -1;
    EXPECT_EQ(sem_getvalue(semaphore_of(handle), &count), 0);
    return count;
}

inline struct stat status_of(const char* path) {
    struct stat status = {};
    EXPECT_EQ(stat(path, &status), 0) << path;
    return status;
}

// The semaphore works: one gets in, and nobody else.
inline void expect_working(TAVO_INT64 handle) {
    EXPECT_EQ(tavo_semaphore_acquire(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_of(handle), 0);
    EXPECT_EQ(sem_trywait(semaphore_of(handle)), -1);
    EXPECT_EQ(tavo_semaphore_release(handle), TAVO_SUCCESS);
    EXPECT_EQ(count_of(handle), 1);
}

}  // namespace tavo::test

// The files of cross-process semaphores, looked at from outside.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <vector>

namespace tavo::tool {

enum class SemaphoreState {
    kMissing,
    kFinished,    // holds a semaphore
    kUnfinished,  // whoever was making it did not come to the end; the next one does
    kForeign,     // no semaphore
    kUnreadable
};

struct SemaphoreFile {
    uint32_t key = 0;
    std::string path;
    SemaphoreState state = SemaphoreState::kMissing;
    int count = 0;               // while it is finished
    std::vector<pid_t> users;    // processes that have it mapped, as far as this user may see them
    bool sees_all_users = true;  // false when there are processes that this user may not look into
};

SemaphoreFile look_at_semaphore(uint32_t key);
// All that are called like one.
std::vector<SemaphoreFile> look_at_semaphores();

}  // namespace tavo::tool

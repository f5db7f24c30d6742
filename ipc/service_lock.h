// The lock of the service's tables, shared by the files that implement it.
#pragma once

#include <mutex>

namespace tavo {

// Serialises the service's operations and guards the process's table of heaps, which all service objects share.
std::mutex& service_lock();

}  // namespace tavo

// The driver that needs neither a daemon nor a kernel module: Unix-domain sockets between the processes.
#pragma once

#include <memory>

#include "Driver.h"

namespace android {

// Null when the runtime directory cannot be used.
std::unique_ptr<Driver> openSocketDriver(Driver::Process& process);

}  // namespace android

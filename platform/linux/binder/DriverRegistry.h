// The drivers that $BINDER_DRIVER can name.
#pragma once

#include <memory>

#include "Driver.h"

namespace android {

using DriverFactory = std::unique_ptr<Driver> (*)(Driver::Process& process);

// Adds a driver that is not libbinder's own, or replaces one that is. Has to happen before ProcessState opens; the
// name is not copied.
LIBBINDER_EXPORT void registerDriver(const char* name, DriverFactory factory);

}  // namespace android

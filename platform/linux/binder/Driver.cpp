// Which driver a process opens.
#include "Driver.h"

#include <android/log.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "DriverRegistry.h"
#include "kernel/KernelDriver.h"
#include "socket/SocketDriver.h"

namespace android {
namespace {

constexpr char kTag[] = "ProcessState";

struct NamedDriver {
    const char* name;
    DriverFactory factory;
    // Whether it is of use on this machine when none is named.
    bool (*suits)();
};

// The best comes first.
std::vector<NamedDriver>& drivers() {
    static std::vector<NamedDriver>& table = *new std::vector<NamedDriver>{
        {"kernel", openKernelDriver, isKernelDriverThere},
        {"socket", openSocketDriver, [] { return true; }},
    };
    return table;
}

std::vector<NamedDriver>::iterator find(const char* name) {
    return std::find_if(drivers().begin(), drivers().end(),
                        [name](const NamedDriver& driver) { return strcmp(driver.name, name) == 0; });
}

}  // namespace

void registerDriver(const char* name, DriverFactory factory) {
    const auto known = find(name);
    if (known != drivers().end()) {
        known->factory = factory;
    } else {
        drivers().push_back({name, factory, [] { return false; }});
    }
}

status_t Driver::becomeContextManager(const sp<BBinder>&) { return INVALID_OPERATION; }

std::unique_ptr<Driver> Driver::open(Process& process) {
    const char* name = getenv("BINDER_DRIVER");
    const bool isNamed = name != nullptr && *name != '\0';
    const auto driver =
        isNamed ? find(name) : std::find_if(drivers().begin(), drivers().end(), [](auto& one) { return one.suits(); });
    if (driver == drivers().end()) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "BINDER_DRIVER names no driver: %s", name);
        return nullptr;
    }
    return driver->factory(process);
}

}  // namespace android

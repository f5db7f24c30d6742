#include "socket/SocketDriver.h"

namespace android {

std::unique_ptr<Driver> openSocketDriver(Driver::Process&) { return nullptr; }

}  // namespace android

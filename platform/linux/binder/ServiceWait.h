// How long getService waits, whatever the driver.
#pragma once

#include <binder/IBinder.h>

#include <functional>

namespace android {

// Asks for a service until it is there, for five seconds at most. check finds the service, or nothing, and
// returns a failure when asking again makes no sense.
sp<IBinder> waitForService(const String16& name, const std::function<status_t(sp<IBinder>* service)>& check);

}  // namespace android

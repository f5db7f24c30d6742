// Where the service is found: its name, and the marker file that says there is one.
#pragma once

#include <cstdio>

namespace tavo {

// What the service is called at the service manager. Its interface descriptor is another text on purpose: see
// ITavoBinder.
inline constexpr char kServiceName[] = "android.tavo.osal";

inline constexpr char kServiceDirectory[] = TAVO_STORAGE_ROOT "/com.zorla.qirserver";

// The marker is made by the process that publishes the service, and never removed.
struct MarkerPath {
    MarkerPath() { snprintf(text, sizeof text, "%s/%s", kServiceDirectory, kServiceName); }
    char text[255];
};

}  // namespace tavo

// Telling the supervisor that started this process how it is.
#pragma once

#include <string>

namespace tavo::tool {

// Sends the state to the socket that NOTIFY_SOCKET names, as systemd's services do; without one it does nothing. Who
// was started without a supervisor cannot be helped by a message that did not arrive, so failures are ignored.
void notify_supervisor(const std::string& state);

}  // namespace tavo::tool

// What the library itself wrote to the log, in a form that can be written down: without the platform's own lines, and
// with every address as PTR.
#pragma once

#include <string>
#include <vector>

#include "support/log_capture.h"

namespace tavo::test {

constexpr char kBinderTag[] = "BINDER_IFACE";
constexpr char kServiceTag[] = "MSGQUEUE_BINDER";
constexpr char kQueueTag[] = "MSGQUEUE";
constexpr char kHeapCountTag[] = "OSAL_SHM";

// Lines so far, oldest first; only those of some tags when any are named.
std::vector<LogLine> library_lines(const LogCapture& log, const std::vector<std::string>& tags = {});

// The address in the first line that begins so; null when there is none.
void* logged_address(const LogCapture& log, const std::string& beginning);

// How often this message was logged.
size_t times_logged(const LogCapture& log, const std::string& message);

}  // namespace tavo::test

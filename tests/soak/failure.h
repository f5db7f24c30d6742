// Failures that a client, or the coordinator itself, finds: one line each, on the pipe that the coordinator reads. A
// line is written in one piece, so that a kill leaves all of it or nothing.
#pragma once

#include <string>

#include "tavo_osal/status.h"

namespace tavo::soak {

// Who says so; once, at the start.
void set_name(const std::string& name);
// What the calling thread is doing, for its failures.
void set_operation(const char* name);
const char* current_operation();

void fail(const std::string& what);
bool expect(bool holds, const char* what);
bool expect_status(TAVO_Status status, TAVO_Status expected, const char* call);
// The same for TAVO_SUCCESS.
bool succeeds(TAVO_Status status, const char* call);

}  // namespace tavo::soak

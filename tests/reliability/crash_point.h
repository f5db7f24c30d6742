// Ends or stops a process exactly at one of the platform calls that a library makes.
//
// A point is a text, so that a test can send it to another process:
//
//     OBJECT FUNCTION before|after|NUMBER N kill|stop own|any
//
// It is reached in front of, or behind, the N-th call of the function from the object, of the calling thread's (own)
// or of any thread's (any). Of write, a NUMBER is how many bytes of the call's go out before the point is reached. What
// is called for a reply does not end in front of recvmsg before the reply is there to be received.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>

#include "support/platform_fault.h"

namespace tavo::test {

class CrashPoint {
public:
    // One at a time in a process.
    explicit CrashPoint(const std::string& text);

private:
    std::unique_ptr<PlatformHook> hook_;
};

// Waits until the process has stopped itself. False when it has ended instead.
bool has_stopped(pid_t pid);

}  // namespace tavo::test

// The service, as the command sees it from outside.
#pragma once

#include <binder/IBinder.h>

#include <chrono>
#include <functional>
#include <string>
#include <vector>

#include "ipc/ITavoBinder.h"
#include "ipc/service_figures.h"

namespace tavo::tool {

using Binder = android::sp<android::IBinder>;

// Runs a call that waits for another process, and throws Failure when it has not come back in time: the call is given
// up and left running, so that what it uses must be its own.
void within(std::chrono::milliseconds patience, const char* what, std::function<void()> call);
bool calls_were_given_up();

// The service, without waiting for one that is not there; null when there is none.
Binder look_up_service();
// The service; throws Failure that says why there is none, and what to do.
Binder find_service();
android::sp<android::ITavoBinder> interface_of(const Binder& service);

// What the service writes for these arguments of the dump call. Throws Failure.
std::string dump_of(const Binder& service, const std::vector<std::string>& arguments);
ServiceFigures figures_of(const Binder& service);

const QueueFigures* find_queue(const ServiceFigures& figures, int key);
const BlockFigures* find_block(const ServiceFigures& figures, int key);

// Where the marker is that a service leaves, and the directory that stands for shared storage.
std::string marker_path();
std::string storage_root();

// The name of a status code and what it means, for messages.
std::string describe_status(int status);

}  // namespace tavo::tool

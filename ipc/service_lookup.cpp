#include "ipc/service_lookup.h"

#include <binder/IServiceManager.h>
#include <unistd.h>

#include <new>

#include "ipc/service_location.h"
#include "log/module_log.h"

using android::ITavoBinder;
using android::sp;

namespace {

// Named in the message whichever family looks the service up.
constexpr char kSignature[] = "android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR*)";

// Waits as long as the platform does. No memory for a proxy is no service.
sp<ITavoBinder> ask_service_manager(const tavo::LookupLog& log) {
    try {
        const sp<android::IServiceManager> manager = android::defaultServiceManager();
        if (log.tells_progress) TAVO_LOG(log.tag, TAVO_LOG_ERROR, " got defaultservice %s\n", tavo::kServiceName);
        return ITavoBinder::asInterface(manager->getService(android::String16(tavo::kServiceName)));
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

}  // namespace

namespace tavo {

sp<ITavoBinder> find_service(const LookupLog& log) {
    TAVO_LOG(log.tag, log.trace_level, "++Entered\n");
    const MarkerPath marker;
    // The progress lines are at the highest level, and users' log filters rely on seeing them.
    if (log.tells_progress) {
        TAVO_LOG(log.tag, TAVO_LOG_ERROR, "++Test Point 2\n");
        TAVO_LOG(log.tag, TAVO_LOG_ERROR, "acMqFile %s\n", marker.text);
        TAVO_LOG(log.tag, TAVO_LOG_ERROR, "service name %s\n", kServiceName);
    }
    // Without the marker no service was ever published, so there is none to wait for.
    if (access(marker.text, R_OK) != 0) {
        TAVO_LOG(log.tag, TAVO_LOG_ERROR, "Service is not available\n");
        return nullptr;
    }
    const sp<ITavoBinder> service = ask_service_manager(log);
    if (service == nullptr) {
        TAVO_LOG(log.tag, TAVO_LOG_ERROR, " %s () Failed to get service (%s) \n", kSignature, kServiceName);
        return nullptr;
    }
    TAVO_LOG(log.tag, log.trace_level, "--Exiting\n");
    return service;
}

}  // namespace tavo

sp<ITavoBinder> tavo_osal_get_service(TAVO_CHAR*) { return tavo::find_service(tavo::kQueueLookup); }

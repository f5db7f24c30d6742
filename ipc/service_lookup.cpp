#include "ipc/service_lookup.h"

#include <binder/IServiceManager.h>
#include <unistd.h>

#include "ipc/service_location.h"
#include "log/module_log.h"

namespace {

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kSignature[] = "android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR*)";

}  // namespace

android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR*) {
    // The progress lines are at the highest level, and users' log filters rely on seeing them.
    TAVO_LOG(kTag, TAVO_LOG_INFO, "++Entered\n");
    const tavo::MarkerPath marker;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "++Test Point 2\n");
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "acMqFile %s\n", marker.text);
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "service name %s\n", tavo::kServiceName);
    // Without the marker no service was ever published, so there is none to wait for.
    if (access(marker.text, R_OK) != 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Service is not available\n");
        return nullptr;
    }
    const android::sp<android::IServiceManager> manager = android::defaultServiceManager();
    TAVO_LOG(kTag, TAVO_LOG_ERROR, " got defaultservice %s\n", tavo::kServiceName);
    const android::sp<android::IBinder> binder = manager->getService(android::String16(tavo::kServiceName));
    const android::sp<android::ITavoBinder> service = android::ITavoBinder::asInterface(binder);
    if (service == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, " %s () Failed to get service (%s) \n", kSignature, tavo::kServiceName);
        return nullptr;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "--Exiting\n");
    return service;
}

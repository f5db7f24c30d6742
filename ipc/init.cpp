#include "tavo_osal/init.h"

#include <binder/IServiceManager.h>
#include <binder/ProcessState.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <new>

#include "ipc/TavoOsalService.h"
#include "ipc/service_location.h"
#include "log/module_log.h"

using android::sp;
using android::TavoOsalService;

namespace {

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kLogPreference[] = "OSAL_LOG -s -a -l3";
constexpr mode_t kOpenToAll = 0777;

// The marker is for processes of other users as well, whatever this one's file mask is.
bool leave_marker(const char* path) {
    if (access(path, R_OK) == 0) {
        // Starting another server is allowed: the later one takes the name over.
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Overriding the android osal  service ( %s )!!\n", tavo::kServiceName);
        return true;
    }
    const int marker = open(path, O_RDWR | O_CREAT | O_CLOEXEC, kOpenToAll);
    if (marker < 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Failed to create file at %s \n", path);
        return false;
    }
    close(marker);
    chmod(path, kOpenToAll);
    return true;
}

// Published whether its tables could be built or not: clients are answered with its failures.
void publish(unsigned int max_queues, unsigned int max_blocks) {
    const sp<TavoOsalService> service = new TavoOsalService;
    service->TavoOsalServiceInit(max_queues, max_blocks);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Starting the service\n");
    android::defaultServiceManager()->addService(android::String16(tavo::kServiceName), service, false);
    android::ProcessState::self()->startThreadPool();
}

}  // namespace

TAVO_Status tavo_osal_init(unsigned int uiMaxNumMsgQueues, unsigned int uiMaxNumSharedMemBlocks) {
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "++Entered\n");
    tavo_set_log_preference(kLogPreference, nullptr, nullptr);
    mkdir(tavo::kServiceDirectory, kOpenToAll);  // usually exists already

    const tavo::MarkerPath marker;
    TAVO_LOG(kTag, TAVO_LOG_DEBUG, "creating service file  %s \n", marker.text);
    if (!leave_marker(marker.text)) return TAVO_FAILURE;

    try {
        publish(uiMaxNumMsgQueues, uiMaxNumSharedMemBlocks);
    } catch (const std::bad_alloc&) {
        return TAVO_NO_MEMORY;
    }
    TAVO_LOG(kTag, TAVO_LOG_TRACE, "--Exiting\n");
    return TAVO_SUCCESS;
}

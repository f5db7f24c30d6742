// Becoming the server from a clean state, and going back to it.
#pragma once

#include <binder/IServiceManager.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "ipc/server.h"
#include "log/log_state.h"

namespace tavo::test {

class OsalInit : public LogState {
protected:
    OsalInit() { std::filesystem::remove_all(kMarkerDirectory); }
    ~OsalInit() override { unsetenv("LOG_PREF"); }

    static android::sp<android::IBinder> published() {
        return android::defaultServiceManager()->checkService(android::String16("android.tavo.osal"));
    }
    // Has the preference that is applied first let everything through to the capture.
    static void log_everything() {
        g_uiEnvValueRead = 0;
        setenv("LOG_PREF", "OSAL_LOG -s -a -l6", 1);
    }
};

}  // namespace tavo::test

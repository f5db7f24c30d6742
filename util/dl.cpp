#include "tavo_osal/dl.h"

#include <dlfcn.h>

#include <cstdint>
#include <cstdio>

#include "log/cancel_shield.h"
#include "log/module_log.h"

using tavo::CancelShield;

namespace {

constexpr char kTag[] = "OSAL_DL";
// As long as the platform's log makes a line.
constexpr size_t kErrorSize = 1024;

// The shape of a failed load or look-up: what failed, and then the platform's own words, if it has any. They are
// copied first, because a log sink that looks symbols up itself takes them away.
TAVO_Status failed(TAVO_Status code, const char* what, const char* name, const char* error,
                   int line = __builtin_LINE()) {
    char words[kErrorSize];
    snprintf(words, sizeof words, "%s", error != nullptr ? error : "");
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "%s%s\n", what, name);
    if (error != nullptr) TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "%s\n", words);
    return code;
}

TAVO_Status null_arguments(int line = __builtin_LINE()) {
    TAVO_LOG_AT(line, kTag, TAVO_LOG_ERROR, "NULL arguments passed \n");
    return TAVO_INVALID_PARAM;
}

// A handle as text, for the message that takes one.
struct HandleText {
    explicit HandleText(const void* handle) { snprintf(text, sizeof text, "%p", handle); }
    char text[sizeof "0x" + 2 * sizeof(void*)];
};

}  // namespace

// The shields: a thread that ended within the loader would keep its locks from the rest of the process.

TAVO_Status tavo_osal_dlopen(const char* pcFileName, int iFlags, void** ppvHandle) {
    const CancelShield shield;
    if (pcFileName == nullptr || ppvHandle == nullptr) return null_arguments();
    void* handle = dlopen(pcFileName, iFlags);
    if (handle == nullptr) return failed(TAVO_DL_OPEN_FAILED, "Failed to open ", pcFileName, dlerror());
    *ppvHandle = handle;
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Successfully opened %s\n", pcFileName);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_dlsym(void* pvHandle, const char* pcSymbol, void** ppvAddress) {
    const CancelShield shield;
    if (pvHandle == nullptr || pcSymbol == nullptr || ppvAddress == nullptr) return null_arguments();
    // A symbol's value may be null, so only an error that was not there before tells of a failure.
    dlerror();
    *ppvAddress = dlsym(pvHandle, pcSymbol);
    const char* error = dlerror();
    if (error != nullptr) return failed(TAVO_DL_SYMBOL_FAILED, "Failed to find symbol  ", pcSymbol, error);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_osal_dlclose(void* pvHandle) {
    const CancelShield shield;
    if (pvHandle == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "NULL argument passed \n");
        return TAVO_INVALID_PARAM;
    }
    if (dlclose(pvHandle) != 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Failed to unload the shared object with handle : %x\n",
                 static_cast<unsigned int>(reinterpret_cast<uintptr_t>(pvHandle)));
        return TAVO_DL_CLOSE_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Successfully closed %s\n", HandleText(pvHandle).text);
    return TAVO_SUCCESS;
}

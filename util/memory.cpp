#include "tavo_osal/memory.h"

#include <cstdlib>
#include <cstring>

#include "log/cancel_shield.h"
#include "log/module_log.h"

using tavo::CancelShield;

namespace {

constexpr char kTag[] = "OSAL_MEM";

}  // namespace

// The shields: a thread that ended within the allocator would keep its lock from the rest of the process.

void* tavo_osal_mem_malloc(unsigned int uiSize) {
    const CancelShield shield;
    void* block = malloc(uiSize);
    if (block == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Memory not allocated. Size Requested: %d.\n", static_cast<int>(uiSize));
    }
    return block;
}

void* tavo_osal_mem_realloc(void* pvMem, unsigned int uiSize) {
    const CancelShield shield;
    void* block = realloc(pvMem, uiSize);
    if (block == nullptr) TAVO_LOG(kTag, TAVO_LOG_ERROR, "Memory not allocated\n");
    return block;
}

void* tavo_osal_mem_calloc(unsigned int uiCount, unsigned int uiSize) {
    const CancelShield shield;
    void* block = calloc(uiCount, uiSize);
    if (block == nullptr) TAVO_LOG(kTag, TAVO_LOG_ERROR, "Memory not allocated\n");
    return block;
}

void tavo_osal_mem_free(void* pvMem) {
    const CancelShield shield;
    free(pvMem);
}

void* tavo_osal_memset(void* pvDst, int iValue, unsigned int uiLen) { return memset(pvDst, iValue, uiLen); }

void* tavo_osal_memcpy(void* pvDst, const void* pvSrc, unsigned int uiLen) { return memcpy(pvDst, pvSrc, uiLen); }

int tavo_osal_memcmp(const void* pvA, const void* pvB, unsigned int uiLen) { return memcmp(pvA, pvB, uiLen); }

void* tavo_osal_memmove(void* pvDst, const void* pvSrc, unsigned int uiLen) { return memmove(pvDst, pvSrc, uiLen); }

#include <sys/ipc.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <memory>

#include "log/module_log.h"
#include "tavo_osal/shared_memory.h"

namespace {

constexpr char kTag[] = "TAVO_OSAL_SHARED_MEM";
constexpr char kIndexFile[] = TAVO_STORAGE_ROOT "/shm_key_index_file.txt";
constexpr char kKeyFile[] = TAVO_STORAGE_ROOT "/shm_key_gen_file.txt";
// The newline is part of the path, so the file never exists and the key is ftok's failure value. Callers know
// the fallback by that value.
constexpr char kFallbackKeyFile[] = "/system/lib/libdevmgr_interface.so\n";
constexpr mode_t kOpenToAll = 0777;

struct FileClose {
    void operator()(FILE* file) const { fclose(file); }
};
using File = std::unique_ptr<FILE, FileClose>;

// A file that does not hold a whole number leaves the index as it is.
bool read_index(int32_t& index) {
    const File file(fopen(kIndexFile, "re"));
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Opening file in read mode, fp = %p.\n", static_cast<void*>(file.get()));
    if (file == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Opening file in read mode failed with errno =%d\n", errno);
        return false;
    }
    int32_t stored = 0;
    const auto count = static_cast<int>(fread(&stored, sizeof stored, 1, file.get()));
    if (count == 1) index = stored;
    TAVO_LOG(kTag, TAVO_LOG_INFO, "After reading, iRet = %d, index = %d.\n", count, index);
    return true;
}

// Whether it was really written is only logged: callers rely on a key of the index in any case.
bool write_index(int32_t index) {
    File file(fopen(kIndexFile, "we"));
    if (file == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Opening file in write mode failed with errno =%d\n", errno);
        return false;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Opening file in write mode, fp = %p.\n", static_cast<void*>(file.get()));
    const auto count = static_cast<int>(fwrite(&index, sizeof index, 1, file.get()));
    TAVO_LOG(kTag, TAVO_LOG_INFO, "After Writing, iRet = %d, index = %d.\n", count, index);
    file.reset();
    chmod(kIndexFile, kOpenToAll);
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Closed the file\n");
    TAVO_LOG(kTag, TAVO_LOG_INFO, "boFileBased = TRUE\n");
    return true;
}

int32_t next(int32_t index) { return static_cast<int32_t>(static_cast<uint32_t>(index) + 1); }

}  // namespace

TAVO_Status tavo_osal_shared_memory_key_create(uint32_t* puiKey) {
    TAVO_TRACE_SCOPE(kTag);
    if (puiKey == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameters \n");
        return TAVO_INVALID_PARAM;
    }
    TAVO_LOG(kTag, TAVO_LOG_VERBOSE, " key  = %#x\n", *puiKey);
    int32_t index = 1;
    bool is_file_based = read_index(index);
    if (is_file_based) {
        index = next(index);
        is_file_based = write_index(index);
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "boFileBased = %d\n", static_cast<int>(is_file_based));
    if (is_file_based) {
        TAVO_LOG(kTag, TAVO_LOG_INFO, "File based\n");
    } else {
        TAVO_LOG(kTag, TAVO_LOG_INFO, "Older way\n");
    }
    // No way fails: what ftok answers on failure is a key as well.
    *puiKey = static_cast<uint32_t>(ftok(is_file_based ? kKeyFile : kFallbackKeyFile, index));
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Key = %u\n", *puiKey);
    return TAVO_SUCCESS;
}

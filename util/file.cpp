#include "tavo_osal/file.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdarg>

#include "log/module_log.h"

namespace {

constexpr char kTag[] = "OSAL_FILE";

// The queries are destructive: each clears both indicators, and callers depend on it to read on.
int query_and_clear(int (*query)(FILE*), FILE* stream) {
    const int set = query(stream);
    clearerr(stream);
    return set;
}

}  // namespace

FILE* tavo_osal_fopen(const char* pcPath, const char* pcMode) { return fopen(pcPath, pcMode); }

char* tavo_osal_fgets(char* pcBuffer, int iSize, FILE* pStream) { return fgets(pcBuffer, iSize, pStream); }

int tavo_osal_fclose(FILE* pStream) { return fclose(pStream); }

unsigned int tavo_osal_fread(void* pvBuffer, unsigned int uiSize, unsigned int uiCount, FILE* pStream) {
    return static_cast<unsigned int>(fread(pvBuffer, uiSize, uiCount, pStream));
}

unsigned int tavo_osal_fwrite(const void* pvBuffer, unsigned int uiSize, unsigned int uiCount, FILE* pStream) {
    return static_cast<unsigned int>(fwrite(pvBuffer, uiSize, uiCount, pStream));
}

int tavo_osal_fprintf(FILE* pStream, const char* pcFormat, ...) {
    va_list values;
    va_start(values, pcFormat);
    const int length = vfprintf(pStream, pcFormat, values);
    va_end(values);
    return length;
}

int tavo_osal_fscanf(FILE* pStream, const char* pcFormat, ...) {
    va_list targets;
    va_start(targets, pcFormat);
    const int stored = vfscanf(pStream, pcFormat, targets);
    va_end(targets);
    return stored;
}

int tavo_osal_feof(FILE* pStream) { return query_and_clear(feof, pStream); }

int tavo_osal_ferror(FILE* pStream) { return query_and_clear(ferror, pStream); }

int tavo_osal_file_check_existence(const char* pcPath) {
    struct stat status = {};
    if (pcPath != nullptr && stat(pcPath, &status) == 0) return 1;
    TAVO_LOG(kTag, TAVO_LOG_ERROR, "File %s does not exist.\n", pcPath != nullptr ? pcPath : "(null)");
    return 0;
}

TAVO_INT64 tavo_osal_get_file_size(const char* pcPath) {
    if (pcPath == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid file path\n");
        return -1;
    }
    // Close-on-exec: a program that another thread starts meanwhile must not inherit the file.
    FILE* stream = fopen(pcPath, "re");
    if (stream == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Unable to open the file\n");
        return -1;
    }
    TAVO_INT64 size = -1;
    if (fseek(stream, 0, SEEK_END) == -1) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Unable to seek end-of-file.\n");
    } else {
        size = ftell(stream);
        if (size < 0) TAVO_LOG(kTag, TAVO_LOG_ERROR, "Error in getting file size. Errno = %d\n", errno);
    }
    tavo_osal_fclose(stream);
    return size;
}

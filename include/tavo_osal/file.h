/**
 * @file
 * Files: the C library's streams, a test for existence and a query for the size.
 *
 * The stream functions check and log nothing, return what the C library returns, and leave errno for the caller.
 * Streams belong to the caller. Every function may be called from any thread.
 */
#ifndef TAVO_OSAL_FILE_H
#define TAVO_OSAL_FILE_H

#include <stdio.h>

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/** fopen(). @return the stream, which the caller closes with tavo_osal_fclose(), or null */
TAVO_CHECK_RESULT TAVO_API FILE* tavo_osal_fopen(const char* pcPath, const char* pcMode);

/** fgets(): one line, end of line included, cut to iSize - 1 characters. @return pcBuffer, or null at the end of
 *  the file or on an error */
TAVO_API char* tavo_osal_fgets(char* pcBuffer, int iSize, FILE* pStream);

/** fclose(). @return 0, or EOF on an error; the stream is gone either way */
TAVO_API int tavo_osal_fclose(FILE* pStream);

/** fread(): uiCount elements of uiSize bytes. @return whole elements read */
TAVO_API unsigned int tavo_osal_fread(void* pvBuffer, unsigned int uiSize, unsigned int uiCount, FILE* pStream);

/** fwrite(): uiCount elements of uiSize bytes. @return whole elements written */
TAVO_API unsigned int tavo_osal_fwrite(const void* pvBuffer, unsigned int uiSize, unsigned int uiCount, FILE* pStream);

/** vfprintf(). @return characters written, or a negative number */
TAVO_API int tavo_osal_fprintf(FILE* pStream, const char* pcFormat, ...) TAVO_PRINTF(2, 3);

/** vfscanf(). @return targets stored, or EOF when the file ends before the first */
TAVO_API int tavo_osal_fscanf(FILE* pStream, const char* pcFormat, ...) TAVO_SCANF(2, 3);

/** feof(), and then clears the stream's end-of-file and error indicators: a second call returns 0.
 *  @return non-zero when the end-of-file indicator was set */
TAVO_API int tavo_osal_feof(FILE* pStream);

/** ferror(), and then clears the stream's end-of-file and error indicators: a second call returns 0.
 *  @return non-zero when the error indicator was set */
TAVO_API int tavo_osal_ferror(FILE* pStream);

/** @return 1 when stat() finds the path; else 0, logged as "File %s does not exist.\n" */
TAVO_API int tavo_osal_file_check_existence(const char* pcPath);

/**
 * Opens a file for reading to find its end. A path that cannot be opened without waiting, such as a pipe's that has
 * no writer, makes this wait, too.
 * @return the size in bytes; -1, logged, when the path is null, the file cannot be opened, or has no position; what
 *         ftell() answered, logged, when that is negative, as for sizes beyond a long's range
 */
TAVO_API TAVO_INT64 tavo_osal_get_file_size(const char* pcPath);

TAVO_END_DECLS

#endif

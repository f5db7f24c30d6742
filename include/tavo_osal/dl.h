/**
 * @file
 * Dynamic loading: shared objects and their symbols, with the platform's own words logged on failure.
 *
 * Every function may be called from any thread.
 */
#ifndef TAVO_OSAL_DL_H
#define TAVO_OSAL_DL_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * dlopen(): loads a shared object.
 * @param pcFileName the object's path, or its name to be searched for
 * @param iFlags     flags of dlopen(), such as RTLD_NOW
 * @param ppvHandle  receives the handle, which the caller closes with tavo_osal_dlclose(); left alone on failure
 * @retval TAVO_SUCCESS        loaded
 * @retval TAVO_INVALID_PARAM  a pointer is null
 * @retval TAVO_DL_OPEN_FAILED dlopen() failed
 */
TAVO_API TAVO_Status tavo_osal_dlopen(const char* pcFileName, int iFlags, void** ppvHandle);

/**
 * dlsym(): looks a symbol up.
 * @param pvHandle    a handle from tavo_osal_dlopen()
 * @param pcSymbol    the symbol's name
 * @param ppvAddress  receives its address, which may be null for a symbol that was found; null when it was not
 * @retval TAVO_SUCCESS          found
 * @retval TAVO_INVALID_PARAM    a pointer is null; nothing is stored
 * @retval TAVO_DL_SYMBOL_FAILED not found
 */
TAVO_API TAVO_Status tavo_osal_dlsym(void* pvHandle, const char* pcSymbol, void** ppvAddress);

/**
 * dlclose(): gives a handle back.
 * @param pvHandle a handle from tavo_osal_dlopen(); not to be used afterwards
 * @retval TAVO_SUCCESS         closed
 * @retval TAVO_INVALID_PARAM   the handle is null
 * @retval TAVO_DL_CLOSE_FAILED dlclose() failed
 */
TAVO_API TAVO_Status tavo_osal_dlclose(void* pvHandle);

TAVO_END_DECLS

#endif

/**
 * @file
 * Processes: a program started apart from the caller, a shell command, a sleep; and a rounding helper.
 *
 * Every function may be called from any thread.
 */
#ifndef TAVO_OSAL_PROCESS_H
#define TAVO_OSAL_PROCESS_H

#include "tavo_osal/export.h"
#include "tavo_osal/status.h"

TAVO_BEGIN_DECLS

/**
 * Starts a program that the caller neither waits for nor is told of: a grandchild, which the system adopts. It leaves
 * no zombie. It gets the caller's environment, signal mask, and those descriptors that are not close-on-exec.
 *
 * Prints "Here is 83" on standard output, and flushes it. When the program cannot be run, the grandchild prints
 * "execl failed. so exiting the child" there; the caller is not told.
 *
 * When the system refuses the second of the two processes this takes, the function returns twice: with
 * #TAVO_SUCCESS in the caller, and with #TAVO_FAILURE in a child of the caller's, which is a copy of the whole
 * process and goes on with the caller's program. The caller does not return from here before that child has ended.
 *
 * @param pcPath the program's path, not searched for
 * @param ...    its arguments, each a char*, the program's own name first, and a null pointer at the end; any number
 * @retval TAVO_SUCCESS the caller's part is done, whether the program could be run or not
 * @retval TAVO_FAILURE the path or the first argument is null, memory is short, or a process could not be made
 */
TAVO_API TAVO_Status tavo_osal_exec(const char* pcPath, ...) TAVO_SENTINEL;

/** sleep(). @param iSec seconds @return the seconds left when a signal cut it short, else 0; -1, logged, when iSec
 *  is negative */
TAVO_API int tavo_osal_wait(int iSec);

/** system(). @param pcCmd the shell command @return as system(); -1, logged, when pcCmd is null */
TAVO_API int tavo_osal_system_call(const char* pcCmd);

/** ceil(): rounds up. @return the result; what an unsigned 32-bit number cannot hold is cut to 0 or its maximum, and
 *  0 stands for what is not a number */
TAVO_API unsigned int tavo_osal_misc_math_ceil(float fValue);

TAVO_END_DECLS

#endif

/* A component's own messages, with its tag, its module number and a level; and the preference that filters them. */
#include <stdio.h>
#include <tavo_osal.h>

#define MODULE_CAMERA (1U << 0) /* module 1 */
#define LOG(level, ...) tavo_print_log((level), MODULE_CAMERA, __LINE__, "CAMERA", __VA_ARGS__)

int main(void) {
    tavo_set_log_preference("CAMERA -s -a -l3", NULL, NULL); /* prints its progress on standard output */
    LOG(TAVO_LOG_INFO, "%d lenses found\n", 2);              /* to the log, which is standard error on Linux */
    LOG(TAVO_LOG_DEBUG, "filtered out\n");
    printf("\nlevels up to %u are written, of modules %#x\n", g_uiMxEnabledLogLevel, g_uiEnabledModuleMask);
    return 0;
}

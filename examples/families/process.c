/* A shell command, and a rounding helper; for tavo_osal_exec() see its own documentation. */
#include <stdio.h>
#include <sys/wait.h>
#include <tavo_osal.h>

int main(void) {
    const int status = tavo_osal_system_call("exit 3");
    printf("the command ended with %d\n", WEXITSTATUS(status));
    printf("2.1 rounds up to %u\n", tavo_osal_misc_math_ceil(2.1F));
    printf("a negative wait is refused: %d\n", tavo_osal_wait(-1));
    return 0;
}

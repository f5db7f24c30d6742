/* Publishes the service and stays alive. Messages do not pass through here: the service only hands out the queue. */
#include <stdio.h>
#include <unistd.h>

#include "tavo_osal.h"

int main(void) {
    const TAVO_Status status = tavo_osal_init(16, 16);
    if (status != TAVO_SUCCESS) {
        fprintf(stderr, "tavo_osal_init failed with 0x%x\n", (unsigned)status);
        return 1;
    }
    printf("\nready\n");
    fflush(stdout);
    for (;;) pause();
}

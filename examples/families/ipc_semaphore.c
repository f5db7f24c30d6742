/* Two processes take turns by a semaphore in a file; no service is needed. */
#include <stdio.h>
#include <sys/wait.h>
#include <tavo_osal.h>
#include <unistd.h>

enum { KEY = 4660 };

int main(void) {
    TAVO_INT64 semaphore = 0;
    if (tavo_semaphore_init(KEY, &semaphore) != TAVO_SUCCESS) return 1;
    if (tavo_semaphore_acquire(semaphore) != TAVO_SUCCESS) return 1;
    const pid_t other = fork();
    if (other == 0) {
        TAVO_INT64 mine = 0; /* each process maps it for itself */
        if (tavo_semaphore_init(KEY, &mine) != TAVO_SUCCESS) _exit(1);
        if (tavo_semaphore_acquire(mine) != TAVO_SUCCESS) _exit(1); /* waits for the first one's release */
        dprintf(STDOUT_FILENO, "then the second process\n");
        tavo_semaphore_release(mine);
        _exit(0);
    }
    printf("first the first process\n");
    fflush(stdout);
    tavo_semaphore_release(semaphore);
    int status = -1;
    waitpid(other, &status, 0);
    tavo_semaphore_delete(semaphore); /* unmaps it; the file stays */
    return status;
}

/* A block that every process with the key would see. */
#include <stdio.h>
#include <string.h>
#include <tavo_osal.h>

int main(void) {
    TavoShmHandle* block = NULL;
    void* first = NULL;
    void* second = NULL;
    if (tavo_osal_init(16, 16) != TAVO_SUCCESS) return 1;
    if (tavo_shm_init(9, &block, 65536) != TAVO_SUCCESS) return 1;
    if (tavo_shm_acquire(block, &first) != TAVO_SUCCESS) return 1;
    strcpy(first, "shared");
    if (tavo_shm_acquire(block, &second) != TAVO_SUCCESS) return 1; /* counts a second use */
    printf("\nread: %s, at the same address: %s\n", (const char*)second, first == second ? "yes" : "no");
    tavo_shm_release(second);
    tavo_shm_release(first);
    /* One delete for each acquire: the first takes back a use, the last the block, and each frees its handle. */
    TavoShmHandle* same = NULL;
    if (tavo_shm_init(9, &same, 65536) != TAVO_SUCCESS) return 1;
    return tavo_shm_delete(same) == TAVO_SUCCESS && tavo_shm_delete(block) == TAVO_SUCCESS ? 0 : 1;
}

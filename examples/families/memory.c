/* Memory: failures are logged, and everything is released with the one function. */
#include <stdio.h>
#include <tavo_osal.h>

int main(void) {
    unsigned char* block = tavo_osal_mem_calloc(4, 2);
    if (block == NULL) return 1;
    tavo_osal_memset(block, 'a', 4);
    unsigned char* larger = tavo_osal_mem_realloc(block, 16);
    if (larger == NULL) {
        tavo_osal_mem_free(block); /* a failure leaves the old block as it was */
        return 1;
    }
    tavo_osal_memcpy(larger + 8, larger, 8);
    tavo_osal_memmove(larger + 1, larger, 4);
    printf("%.5s, and the copy is %s\n", (char*)larger, tavo_osal_memcmp(larger, larger + 8, 4) == 0 ? "equal" : "not");
    tavo_osal_mem_free(larger);
    return 0;
}

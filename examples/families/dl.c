/* A shared object and a function of it, by name. */
#include <dlfcn.h>
#include <stdio.h>
#include <string.h>
#include <tavo_osal.h>

int main(void) {
    void* library = NULL;
    void* address = NULL;
    double (*cosine)(double) = NULL;
    if (tavo_osal_dlopen("libm.so.6", RTLD_NOW, &library) != TAVO_SUCCESS) return 1;
    if (tavo_osal_dlsym(library, "cos", &address) != TAVO_SUCCESS) return 1;
    memcpy(&cosine, &address, sizeof cosine); /* ISO C has no cast from data to functions */
    printf("cos(0) = %.1f\n", cosine(0));
    printf("no such symbol: %#x\n", (unsigned int)tavo_osal_dlsym(library, "no_such_symbol", &address));
    return tavo_osal_dlclose(library) == TAVO_SUCCESS ? 0 : 1;
}

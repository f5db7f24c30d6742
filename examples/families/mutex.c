/* A count that two threads raise. */
#include <stdio.h>
#include <tavo_osal.h>

static TAVO_Mutex* mutex;
static int count;

static void* raise_it(void* argument) {
    (void)argument;
    for (int i = 0; i < 10000; ++i) {
        tavo_osal_mutex_lock(mutex);
        ++count;
        tavo_osal_mutex_unlock(mutex);
    }
    return NULL;
}

int main(void) {
    pthread_t threads[2];
    if (tavo_osal_mutex_create(&mutex) != TAVO_SUCCESS) return 1;
    for (int i = 0; i < 2; ++i) {
        if (tavo_osal_thread_create(&threads[i], raise_it, NULL) != TAVO_SUCCESS) return 1;
    }
    for (int i = 0; i < 2; ++i) tavo_osal_thread_join(threads[i]);
    printf("%d\n", count);
    return tavo_osal_mutex_destroy(&mutex) == TAVO_SUCCESS ? 0 : 1;
}

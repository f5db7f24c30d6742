/* Every operation answers with a status: 0, or a code of its family's. */
#include <stdio.h>
#include <tavo_osal.h>

static const char* name_of(TAVO_Status status) {
    switch (status) {
        case TAVO_SUCCESS: return "success";
        case TAVO_INVALID_PARAM: return "invalid parameter";
        case TAVO_BUSY: return "busy";
        default: return "another failure";
    }
}

int main(void) {
    TAVO_Mutex* mutex = NULL;
    printf("create: %s\n", name_of(tavo_osal_mutex_create(&mutex)));
    printf("lock nothing: %s\n", name_of(tavo_osal_mutex_lock(NULL)));
    printf("lock: %s\n", name_of(tavo_osal_mutex_lock(mutex)));
    printf("try to lock again: %s\n", name_of(tavo_osal_mutex_try_lock(mutex)));
    printf("unlock: %s\n", name_of(tavo_osal_mutex_unlock(mutex)));
    printf("destroy: %s\n", name_of(tavo_osal_mutex_destroy(&mutex)));
    return 0;
}

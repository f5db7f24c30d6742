#include "tavo_osal/msg_queue_key.h"

#include <fcntl.h>
#include <sys/ipc.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "log/module_log.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/string.h"

namespace {

constexpr char kTag[] = "OSAL_MSG_QUEUE";
constexpr char kKeyFile[] = TAVO_STORAGE_ROOT "/key_gen_file.txt";
constexpr mode_t kReadableAndWritable = 0666;

// The contents do not matter: the file lends its identity to the key.
void make_key_file() {
    const int file = open(kKeyFile, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, kReadableAndWritable);
    if (file < 0) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Keygen file %s could not be opened in write mode.\n", kKeyFile);
        return;
    }
    close(file);
}

}  // namespace

TAVO_Status tavo_msg_queue_key_create(int32_t* piKey, int iProjId) {
    if (piKey == nullptr) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "Invalid parameter\n");
        return TAVO_INVALID_PARAM;
    }
    umask(0);  // not put back: callers rely on the files they make afterwards being open to all
    make_key_file();
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Generating an IPC key with args %s and %d.\n", kKeyFile, iProjId);
    const key_t key = ftok(kKeyFile, iProjId);
    if (key == -1) {
        TAVO_LOG(kTag, TAVO_LOG_ERROR, "IPC key generation failed. errno=%d.\n", errno);
        return TAVO_MQ_KEY_FAILED;
    }
    TAVO_LOG(kTag, TAVO_LOG_INFO, "IPC key generation succeeded.\n");
    *piKey = key;
    TAVO_LOG(kTag, TAVO_LOG_INFO, "Msg queue key obtained is %d.\n", key);
    return TAVO_SUCCESS;
}

TAVO_Status tavo_msg_queue_init(int iKey, TAVO_INT64* piMqId) {
    TAVO_CHAR text[12];  // "-2147483648"
    tavo_osal_sprintf(text, "%d", iKey);
    return tavo_msg_queue_sender_init(text, piMqId);
}

TAVO_Status tavo_msg_queue_init_with_flags(int iKey, int, TAVO_INT64* piMqId) {
    return tavo_msg_queue_init(iKey, piMqId);
}

TAVO_Status tavo_msg_queue_sendmessage(TAVO_INT64 iMqId, unsigned int uiSize, unsigned char* pbMsg) {
    return tavo_msg_queue_put(iMqId, pbMsg, uiSize);
}

TAVO_Status tavo_msg_queue_receivemessage(TAVO_INT64 iMqId, unsigned int* puiSize, unsigned char* pbMsg) {
    return tavo_msg_queue_get(iMqId, pbMsg, puiSize);
}

TAVO_Status tavo_msg_queue_close(TAVO_INT64 iMqId) { return tavo_msg_queue_destroy(iMqId); }

// Makes keys from index and key files of any contents.
#include <sys/ipc.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <vector>

#include "fuzz/script.h"
#include "ipc/TavoOsalService.h"
#include "tavo_osal/log.h"
#include "tavo_osal/msg_queue_key.h"
#include "tavo_osal/shared_memory.h"

namespace {

using tavo::fuzz::require;
using tavo::fuzz::Script;

using ByteString = std::vector<uint8_t>;

constexpr char kIndexFile[] = TAVO_STORAGE_ROOT "/shm_key_index_file.txt";
constexpr char kBlockKeyFile[] = TAVO_STORAGE_ROOT "/shm_key_gen_file.txt";
constexpr char kQueueKeyFile[] = TAVO_STORAGE_ROOT "/key_gen_file.txt";

void write_file(const char* path, const ByteString& bytes) {
    FILE* file = fopen(path, "we");
    require(file != nullptr, "the files can be made");
    if (!bytes.empty()) fwrite(bytes.data(), 1, bytes.size(), file);
    fclose(file);
}

ByteString read_file(const char* path) {
    ByteString bytes(64);
    FILE* file = fopen(path, "re");
    require(file != nullptr, "the files are there");
    bytes.resize(fread(bytes.data(), 1, bytes.size(), file));
    fclose(file);
    return bytes;
}

ByteString bytes_of(uint32_t index) {
    ByteString bytes(sizeof index);
    memcpy(bytes.data(), &index, sizeof index);
    return bytes;
}

// An index file with fewer than four bytes counts as one that says 1.
uint32_t index_in(const ByteString& bytes) {
    uint32_t index = 1;
    if (bytes.size() >= sizeof index) memcpy(&index, bytes.data(), sizeof index);
    return index;
}

void make_block_key(uint32_t index) {
    uint32_t key = 0;
    require(tavo_osal_shared_memory_key_create(&key) == TAVO_SUCCESS, "a block's key can always be made");
    require(read_file(kIndexFile) == bytes_of(index + 1), "the file holds the next index and nothing else");
    const auto expected = static_cast<uint32_t>(ftok(kBlockKeyFile, static_cast<int>(index + 1)));
    require(key == expected, "the key is that of the next index");
}

void make_queue_key(int project) {
    int32_t key = 4711;
    require(tavo_msg_queue_key_create(&key, project) == TAVO_SUCCESS, "a queue's key can always be made");
    require(key == ftok(kQueueKeyFile, project), "the key is that of the file");
    require(read_file(kQueueKeyFile).empty(), "the file is empty");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    g_uiMxEnabledLogLevel = TAVO_LOG_TRACE;
    Script script(data, size);
    const auto kind = script.take<uint8_t>();
    const auto project = script.take<int32_t>();
    const ByteString contents = script.rest();

    if ((kind & 1) != 0) {
        unlink(kIndexFile);
        uint32_t key = 0;
        require(tavo_osal_shared_memory_key_create(&key) == TAVO_SUCCESS, "a block's key needs no file");
        require(key == UINT32_MAX, "the key of no file");
        require(access(kIndexFile, F_OK) != 0, "and makes none");
    }
    if ((kind & 2) != 0) {
        write_file(kBlockKeyFile, contents);
    } else {
        unlink(kBlockKeyFile);
    }
    write_file(kIndexFile, contents);
    const uint32_t index = index_in(contents);
    make_block_key(index);
    make_block_key(index + 1);
    if ((kind & 4) != 0) {
        const android::sp<android::TavoOsalService> service = new android::TavoOsalService;
        require(service->TavoOsalServiceInit(1, 1) == TAVO_SUCCESS, "a service can always be made");
        require(read_file(kIndexFile) == bytes_of(1), "a new service starts from 1");
        make_block_key(1);
    }

    if ((kind & 8) != 0) write_file(kQueueKeyFile, contents);
    make_queue_key(project);
    return 0;
}

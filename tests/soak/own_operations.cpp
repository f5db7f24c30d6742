#include <unistd.h>

#include <cstring>

#include "soak/failure.h"
#include "soak/message.h"
#include "soak/operations.h"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"
#include "tavo_osal/shared_memory.h"
#include "tavo_osal/thread.h"

namespace tavo::soak {
namespace {

constexpr char kStorage[] = TAVO_STORAGE_ROOT;

uint32_t some_own_key(Client& client) {
    return own_key(client.number, client.incarnation, client.random.below(kOwnKeys));
}

// Puts some messages and gets them again. What a queue holds at least is put before anything is got.
void put_and_get(Client& client, TAVO_INT64 out, TAVO_INT64 in) {
    const unsigned count = client.random.between(1, 10);
    unsigned sizes[10];
    for (unsigned i = 0; i < count; ++i) {
        sizes[i] = client.random.below(4000);
        Bytes bytes(sizes[i] + 1);
        fill(i, bytes.data(), sizes[i]);
        succeeds(tavo_msg_queue_put(out, bytes.data(), sizes[i]), "tavo_msg_queue_put");
    }
    Bytes bytes(4096);
    for (unsigned i = 0; i < count; ++i) {
        unsigned size = 0;
        succeeds(tavo_msg_queue_get(in, bytes.data(), &size), "tavo_msg_queue_get");
        expect(size == sizes[i] && first_difference(i, bytes.data(), size) == size,
               "an own queue's message is damaged");
    }
}

struct Turn {
    TAVO_INT64 semaphore = 0;
    unsigned count = 0;
};

void* take_turns(void* shared) {
    auto& turn = *static_cast<Turn*>(shared);
    for (int i = 0; i < 20; ++i) {
        if (tavo_semaphore_acquire(turn.semaphore) != TAVO_SUCCESS) return nullptr;
        ++turn.count;
        tavo_semaphore_release(turn.semaphore);
    }
    return nullptr;
}

}  // namespace

void use_own_queue(Client& client) {
    const auto key = static_cast<int>(some_own_key(client));
    TAVO_INT64 first = 0, second = 0;
    if (!succeeds(tavo_msg_queue_init(key, &first), "tavo_msg_queue_init")) return;
    if (succeeds(tavo_msg_queue_sender_init(std::to_string(key).data(), &second), "tavo_msg_queue_sender_init")) {
        put_and_get(client, first, second);
        put_and_get(client, second, first);
        succeeds(tavo_msg_queue_close(second), "tavo_msg_queue_close");
    }
    succeeds(tavo_msg_queue_destroy(first), "tavo_msg_queue_destroy");
}

// It cannot be given back, so there is one.
void use_local_queue(Client& client) {
    static TAVO_INT64 queue = 0;
    if (queue == 0 && !succeeds(tavo_android_msg_queue_init(&queue), "tavo_android_msg_queue_init")) return;
    put_and_get(client, queue, queue);
}

void use_own_block(Client& client) {
    const uint32_t key = some_own_key(client);
    const uint32_t size = client.random.between(1, 300000);
    const uint64_t seed = client.random.next();
    TavoShmHandle *first = nullptr, *second = nullptr;
    void *address = nullptr, *again = nullptr;
    if (!succeeds(tavo_shm_init(key, &first, size), "tavo_shm_init")) return;
    if (!succeeds(tavo_shm_acquire(first, &address), "tavo_shm_acquire")) {
        tavo_osal_mem_free(first);
        return;
    }
    auto* bytes = static_cast<unsigned char*>(address);
    expect(bytes[0] == 0 && memcmp(bytes, bytes + 1, size - 1) == 0, "a new block is not zeroed");
    fill(seed, bytes, size);
    if (succeeds(tavo_shm_init(key, &second, 1), "tavo_shm_init")) {
        if (succeeds(tavo_shm_acquire(second, &again), "acquiring a block again")) {
            expect(again == address, "a block was mapped twice");
            succeeds(tavo_shm_release(again), "tavo_shm_release");
            succeeds(tavo_shm_delete(second), "tavo_shm_delete");
        } else {
            tavo_osal_mem_free(second);
        }
    }
    succeeds(tavo_shm_delete(first), "tavo_shm_delete");
    expect(first_difference(seed, bytes, size) == size, "a block is damaged");
    succeeds(tavo_shm_release(address), "tavo_shm_release");
}

void use_own_semaphore(Client& client) {
    const uint32_t key = some_own_key(client);
    Turn turn;
    TAVO_INT64 other = 0;
    succeeds(tavo_semaphore_key_create(), "tavo_semaphore_key_create");
    if (!succeeds(tavo_semaphore_init(key, &turn.semaphore), "tavo_semaphore_init")) return;
    pthread_t threads[2];
    unsigned started = 0;
    while (started < 2 &&
           succeeds(tavo_osal_thread_create(&threads[started], take_turns, &turn), "starting a thread")) {
        ++started;
    }
    for (unsigned i = 0; i < started; ++i) succeeds(tavo_osal_thread_join(threads[i]), "tavo_osal_thread_join");
    expect(turn.count == 20 * started, "a count under a file semaphore was lost");
    if (succeeds(tavo_semaphore_init(key, &other), "tavo_semaphore_init")) {
        succeeds(tavo_semaphore_acquire(turn.semaphore), "tavo_semaphore_acquire");
        succeeds(tavo_semaphore_release(other), "tavo_semaphore_release");
        succeeds(tavo_semaphore_delete(other), "tavo_semaphore_delete");
    }
    succeeds(tavo_semaphore_delete(turn.semaphore), "tavo_semaphore_delete");
    unlink((std::string(kStorage) + "/" + std::to_string(key)).c_str());
}

void make_keys(Client& client) {
    const auto project = static_cast<int>(client.random.between(1, 255));
    int32_t first = 0, second = 0;
    succeeds(tavo_msg_queue_key_create(&first, project), "tavo_msg_queue_key_create");
    succeeds(tavo_msg_queue_key_create(&second, project), "tavo_msg_queue_key_create");
    expect(first == second && first != 0, "two keys of one number differ");
    uint32_t key = 0;
    succeeds(tavo_osal_shared_memory_key_create(&key), "tavo_osal_shared_memory_key_create");
    expect(key != 0, "a key of 0 was made");
}

}  // namespace tavo::soak

#include "soak/blocks.h"

#include "soak/failure.h"
#include "soak/message.h"
#include "soak/operations.h"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/thread.h"

namespace tavo::soak {
namespace {

bool must_leave(const Guard& guard, uint32_t serial) {
    return guard.state != ChannelState::kOpen || guard.serial != serial;
}

void write_block(Client& client, const Guard& guard, unsigned char* bytes, uint64_t generation) {
    const BlockHeader header = {generation, client.number, client.incarnation, client.random.next()};
    tavo_osal_memcpy(bytes, &header, sizeof header);
    // So that a kill may come here, too.
    if (client.random.one_in(20)) tavo_osal_thread_msleep(1);
    fill(header.seed, bytes + sizeof header, guard.size - sizeof header);
    if (client.breaks("damage-block") && generation % 3 == 0) bytes[guard.size - 1] ^= 1;
}

}  // namespace

bool block_is_right(const Guard& guard, const unsigned char* bytes, std::string& wrong) {
    const uint64_t generation = guard.done;
    BlockHeader header;
    tavo_osal_memcpy(&header, bytes, sizeof header);
    if (header.generation != generation) {
        wrong = "a block has generation " + std::to_string(header.generation) + ", but " + std::to_string(generation) +
                " was written last";
        return false;
    }
    const size_t size = guard.size - sizeof header;
    const size_t same = generation == 0 ? size : first_difference(header.seed, bytes + sizeof header, size);
    if (same == size) return true;
    wrong = "generation " + std::to_string(generation) + " of a block, which client " + std::to_string(header.slot) +
            "." + std::to_string(header.incarnation) + " wrote, is damaged at byte " +
            std::to_string(same + sizeof header);
    return false;
}

bool Blocks::come(Client& client, unsigned which) {
    Guard& guard = client.board.guards[which];
    Held& held = held_[which];
    if (held.bytes != nullptr || guard.state != ChannelState::kOpen) return held.bytes != nullptr;
    const uint32_t serial = guard.serial;
    client.slot.uses_guard[which] = serial;
    void* address = nullptr;
    if (!must_leave(guard, serial) && succeeds(tavo_semaphore_init(guard.semaphore_key, &held.semaphore), "init") &&
        succeeds(tavo_shm_init(guard.block_key, &held.handle, guard.size), "tavo_shm_init")) {
        if (succeeds(tavo_shm_acquire(held.handle, &address), "tavo_shm_acquire")) {
            held.bytes = static_cast<unsigned char*>(address);
            held.serial = serial;
            return true;
        }
        tavo_osal_mem_free(held.handle);
    }
    if (held.semaphore != 0) tavo_semaphore_delete(held.semaphore);
    held = {};
    client.slot.uses_guard[which] = 0;
    return false;
}

void Blocks::leave(Client& client, unsigned which) {
    Held& held = held_[which];
    if (held.bytes == nullptr) return;
    succeeds(client.random.one_in(2) ? tavo_shm_release(held.bytes)
                                     : tavo_shm_release_by_size(held.handle->uiSize, held.bytes),
             "tavo_shm_release");
    succeeds(tavo_shm_delete(held.handle), "tavo_shm_delete");
    succeeds(tavo_semaphore_delete(held.semaphore), "tavo_semaphore_delete");
    held = {};
    client.slot.uses_guard[which] = 0;
}

void Blocks::take_a_turn(Client& client, Guard& guard, unsigned char* bytes) {
    if (guard.inside.fetch_add(1) != 0) fail("two hold one semaphore");
    std::string wrong;
    if (!block_is_right(guard, bytes, wrong)) fail(wrong);
    if (client.random.one_in(2)) {
        const uint64_t generation = guard.done + 1;
        guard.intent = generation;
        write_block(client, guard, bytes, generation);
        guard.done = generation;
    }
    guard.inside.fetch_sub(1);
}

void Blocks::use(Client& client) {
    const unsigned which = client.random.below(kGuards);
    if (!come(client, which)) return;
    Guard& guard = client.board.guards[which];
    Held& held = held_[which];
    client.slot.at_guard[which] = true;
    if (succeeds(tavo_semaphore_acquire(held.semaphore), "tavo_semaphore_acquire")) {
        // When somebody was killed here the coordinator lets everybody in, to leave.
        if (!must_leave(guard, held.serial)) take_a_turn(client, guard, held.bytes);
        succeeds(tavo_semaphore_release(held.semaphore), "tavo_semaphore_release");
    }
    client.slot.at_guard[which] = false;
    if (must_leave(guard, held.serial)) leave(client, which);
}

void Blocks::leave_one(Client& client) { leave(client, client.random.below(kGuards)); }

void Blocks::leave_where_told(Client& client) {
    for (unsigned i = 0; i < kGuards; ++i) {
        if (held_[i].bytes != nullptr && must_leave(client.board.guards[i], held_[i].serial)) leave(client, i);
    }
}

void Blocks::leave_all(Client& client) {
    for (unsigned i = 0; i < kGuards; ++i) leave(client, i);
}

void use_shared_block(Client& client) { client.blocks.use(client); }
void leave_a_block(Client& client) { client.blocks.leave_one(client); }

}  // namespace tavo::soak

#include "soak/guards.h"

#include <unistd.h>

#include <algorithm>
#include <string>

#include "soak/blocks.h"
#include "soak/failure.h"
#include "soak/service_uses.h"
#include "tavo_osal/ipc_semaphore.h"

namespace tavo::soak {

Guards::Guards(Board& board, uint64_t seed) : board_(board), random_(seed) {}

bool Guards::open(unsigned which) {
    Guard& guard = board_.guards[which];
    Local local;
    const uint32_t serial = ++serial_;
    const uint32_t size = random_.between(sizeof(BlockHeader), random_.one_in(3) ? 300000 : 5000);
    void* address = nullptr;
    if (!succeeds(tavo_semaphore_init(semaphore_key(serial), &local.semaphore), "tavo_semaphore_init") ||
        !succeeds(tavo_shm_init(block_key(serial), &local.handle, size), "tavo_shm_init") ||
        !succeeds(tavo_shm_acquire(local.handle, &address), "tavo_shm_acquire")) {
        return false;
    }
    local.bytes = static_cast<unsigned char*>(address);
    local_[which] = local;
    guard.serial = serial;
    guard.block_key = block_key(serial);
    guard.semaphore_key = semaphore_key(serial);
    guard.size = size;
    guard.intent = guard.done = 0;
    guard.inside = 0;
    guard.state = ChannelState::kOpen;
    return true;
}

void Guards::open_all() {
    for (unsigned i = 0; i < kGuards; ++i) {
        if (board_.guards[i].state == ChannelState::kClosed && !open(i)) return;
    }
}

void Guards::account_for_death(unsigned slot) {
    Slot& dead = board_.slots[slot];
    for (unsigned i = 0; i < kGuards; ++i) {
        dead.uses_guard[i] = 0;
        // Whether it had the semaphore when it was killed, nobody can tell.
        if (!dead.at_guard[i].exchange(false)) continue;
        local_[i].a_client_died = true;
        if (board_.guards[i].state == ChannelState::kOpen) board_.guards[i].state = ChannelState::kRetired;
    }
}

bool Guards::have_all_left(unsigned which) const {
    return std::all_of(board_.slots, board_.slots + kClients,
                       [which](const Slot& slot) { return slot.uses_guard[which] == 0; });
}

void Guards::go_on() {
    set_operation("accounting for blocks");
    for (unsigned i = 0; i < kGuards; ++i) {
        if (board_.guards[i].state != ChannelState::kRetired) continue;
        // Those who wait for one who is dead are let in, one by one, to find that they have to leave.
        if (!have_all_left(i)) {
            if (local_[i].a_client_died)
                succeeds(tavo_semaphore_release(local_[i].semaphore), "tavo_semaphore_release");
            continue;
        }
        close(i);
    }
}

void Guards::change_one() {
    Guard& guard = board_.guards[random_.below(kGuards)];
    if (guard.state == ChannelState::kOpen) guard.state = ChannelState::kRetired;
}

void Guards::close(unsigned which) {
    Guard& guard = board_.guards[which];
    Local& local = local_[which];
    std::string wrong;
    const bool may_be_half_written = local.a_client_died && guard.intent == guard.done + 1;
    if (!may_be_half_written && !block_is_right(guard, local.bytes, wrong)) fail(wrong);
    if (guard.intent != guard.done && !may_be_half_written) fail("a block was left while it was written");
    given_up_ += local.a_client_died ? 1 : 0;
    half_written_ += may_be_half_written ? 1 : 0;
    succeeds(tavo_shm_release(local.bytes), "tavo_shm_release");
    succeeds(tavo_shm_delete(local.handle), "tavo_shm_delete");
    succeeds(tavo_semaphore_delete(local.semaphore), "tavo_semaphore_delete");
    unlink((std::string(TAVO_STORAGE_ROOT "/") + std::to_string(guard.semaphore_key)).c_str());
    guard.block_key = 0;
    guard.state = ChannelState::kClosed;
}

void Guards::close_all() {
    set_operation("closing blocks");
    for (unsigned i = 0; i < kGuards; ++i) {
        if (board_.guards[i].state == ChannelState::kClosed) continue;
        if (!have_all_left(i)) fail("a client that ended in good order still has a block");
        close(i);
    }
}

bool Guards::knows_key(uint32_t key) const {
    return std::any_of(board_.guards, board_.guards + kGuards,
                       [key](const Guard& guard) { return guard.block_key == key; });
}

}  // namespace tavo::soak

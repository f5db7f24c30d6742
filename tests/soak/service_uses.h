// What the service has counted, as the coordinator asks for it and takes it back.
#pragma once

#include <cstdint>
#include <map>

namespace tavo::soak {

struct ServiceUses {
    std::map<uint32_t, int> queues, blocks;  // by key
};

// False when the service does not tell.
bool read_uses(ServiceUses& uses);
// A use each. Of a queue: false when there was none left.
bool take_queue_use(int32_t key);
void take_block_use(uint32_t key);
// The read end of a queue's pipe, which is the caller's; -1 for none.
int read_end_of(int32_t key);

}  // namespace tavo::soak

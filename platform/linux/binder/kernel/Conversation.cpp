#include "Conversation.h"

#include <algorithm>
#include <cerrno>

namespace android::kernel_driver {

int Conversation::next(Device& device, Command& command) {
    for (;;) {
        switch (reader.next(command)) {
            case CommandReader::Result::kCommand: return 0;
            case CommandReader::Result::kBroken: return EPROTO;
            case CommandReader::Result::kEnd: break;
        }
        const int error = talk(device, true);
        if (error != 0) return error;
    }
}

int Conversation::flush(Device& device) { return queue.empty() ? 0 : talk(device, false); }

int Conversation::talk(Device& device, bool listens) {
    binder_write_read request = {};
    request.write_size = queue.size();
    request.write_buffer = reinterpret_cast<uintptr_t>(queue.data());
    if (listens) {
        request.read_size = received.size();
        request.read_buffer = reinterpret_cast<uintptr_t>(received.data());
    }
    const int error = device.writeRead(request);
    queue.consume(static_cast<size_t>(std::min<binder_size_t>(request.write_consumed, queue.size())));
    if (error == 0 && listens) {
        const auto size = std::min<binder_size_t>(request.read_consumed, received.size());
        reader = CommandReader(received.data(), static_cast<size_t>(size));
    }
    return error;
}

}  // namespace android::kernel_driver

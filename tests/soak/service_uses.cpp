#include "soak/service_uses.h"

#include <fcntl.h>
#include <unistd.h>

#include <nlohmann/json.hpp>
#include <string>
#include <thread>

#include "ipc/ITavoBinder.h"
#include "ipc/service_lookup.h"

namespace tavo::soak {
namespace {

using android::sp;

sp<android::ITavoBinder> service() { return tavo_osal_get_service(nullptr); }

std::string read_to_end(int fd) {
    std::string text;
    char piece[4096];
    for (ssize_t count = 1; count > 0;) {
        count = read(fd, piece, sizeof piece);
        if (count > 0) text.append(piece, static_cast<size_t>(count));
    }
    return text;
}

}  // namespace

bool read_uses(ServiceUses& uses) {
    const sp<android::ITavoBinder> found = service();
    int ends[2];
    if (found == nullptr || pipe2(ends, O_CLOEXEC) != 0) return false;
    std::string text;
    std::thread reader([&text, end = ends[0]] { text = read_to_end(end); });
    android::Vector<android::String16> arguments;
    arguments.add(android::String16("--json"));
    const android::status_t status = android::IInterface::asBinder(found)->dump(ends[1], arguments);
    close(ends[1]);
    reader.join();
    close(ends[0]);
    const auto json = nlohmann::json::parse(text, nullptr, false);
    if (status != android::NO_ERROR || json.is_discarded()) return false;
    for (const auto& queue : json["queues"])
        uses.queues[static_cast<uint32_t>(queue["key"].get<int>())] = queue["uses"];
    for (const auto& block : json["blocks"])
        uses.blocks[static_cast<uint32_t>(block["key"].get<int>())] = block["uses"];
    return true;
}

bool take_queue_use(int32_t key) {
    const sp<android::ITavoBinder> found = service();
    return found != nullptr && found->delete_message_queue(key) == 0;
}

void take_block_use(uint32_t key) {
    const sp<android::ITavoBinder> found = service();
    if (found != nullptr) found->delete_shared_mem(static_cast<int>(key));
}

int read_end_of(int32_t key) {
    const sp<android::ITavoBinder> found = service();
    return found != nullptr ? found->get_fd(key) : -1;
}

}  // namespace tavo::soak

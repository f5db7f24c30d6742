// Takes any bytes apart into the commands of the kernel's driver, and compares them with a model.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

#include "fuzz/script.h"
#include "platform/linux/binder/kernel/CommandReader.h"

namespace {

using namespace android::kernel_driver;
using tavo::fuzz::require;

// By the bits of a command's number, as the kernel lays them out on all machines that have binder: the command, its
// family, the size of what comes with it, the direction.
constexpr uint32_t family_of(uint32_t code) { return code >> 8 & 0xFF; }
constexpr size_t size_of(uint32_t code) { return code >> 16 & 0x3FFF; }

struct Payload {
    uint8_t bytes[Command::kMaxPayload];
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // A block of exactly the input's size, beside which nothing may be read.
    const std::vector<uint8_t> bytes(data, data + size);
    CommandReader reader(bytes.data(), bytes.size());
    Command command;
    size_t at = 0;
    for (;;) {
        require(reader.atEnd() == (at == size), "the end is where the bytes end");
        const CommandReader::Result result = reader.next(command);
        if (at == size) {
            require(result == CommandReader::Result::kEnd, "nothing comes behind the end");
            return 0;
        }
        uint32_t code = 0;
        if (size - at >= sizeof code) memcpy(&code, bytes.data() + at, sizeof code);
        const bool fits = size - at >= sizeof code && size - at - sizeof code >= size_of(code);
        if (!fits || family_of(code) != 'r') {
            require(result == CommandReader::Result::kBroken, "what is no command is refused");
            require(reader.next(command) == CommandReader::Result::kEnd, "and nothing is taken from behind it");
            return 0;
        }
        require(result == CommandReader::Result::kCommand, "a command is taken");
        require(command.code() == code, "it is the one that is there");
        at += sizeof code;
        const auto payload = command.payload<Payload>();
        if (size_of(code) <= sizeof payload) {
            require(memcmp(payload.bytes, bytes.data() + at, size_of(code)) == 0, "with what comes with it");
        }
        at += size_of(code);
    }
}

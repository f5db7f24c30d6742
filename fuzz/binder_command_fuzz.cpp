// Reads what the kernel's driver might say, whatever it is.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "platform/linux/binder/kernel/CommandReader.h"

using android::kernel_driver::Command;
using android::kernel_driver::CommandReader;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    CommandReader reader(data, size);
    size_t seen = 0;
    for (;;) {
        Command command;
        const CommandReader::Result result = reader.next(command);
        if (result == CommandReader::Result::kEnd) break;
        if (result == CommandReader::Result::kBroken && !reader.atEnd()) abort();
        if (result == CommandReader::Result::kCommand) seen += sizeof(uint32_t) + _IOC_SIZE(command.code());
        if (command.payload<binder_transaction_data>().data_size == 0 && seen > size) abort();
    }
    if (seen > size) abort();
    return 0;
}

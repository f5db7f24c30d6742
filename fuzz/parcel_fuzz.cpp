// Reads received parcels of any contents, with objects at any offsets, in any order of operations.
//
// The input is a script: a count of objects; for each its offset, its type and its number; a count of
// operations and their codes; the rest are the parcel's bytes.
#include <binder/Binder.h>
#include <binder/Parcel.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "fuzz/received_parcel.h"
#include "fuzz/script.h"

namespace {

using namespace android;
using tavo::fuzz::ObjectPlan;
using tavo::fuzz::Script;

// Touches every byte of a block, so that a sanitizer sees where it ends.
void use(const void* block, size_t size) {
    [[maybe_unused]] static volatile uint8_t sink;
    if (block == nullptr) return;
    for (size_t i = 0; i < size; ++i) sink = static_cast<const uint8_t*>(block)[i];
}

void use(const String16& text) { use(text.string(), (text.size() + 1) * sizeof(char16_t)); }

void read_string16(const Parcel& parcel) {
    size_t length = 0;
    const char16_t* text = parcel.readString16Inplace(&length);
    if (text != nullptr) use(text, (length + 1) * sizeof *text);
}

void operate(Parcel& parcel, uint8_t code, uint32_t value, const sp<BBinder>& local) {
    // The last few write, which makes the parcel the writer's own. Sizes are kept small: memory is not what is tested.
    if (code % 24 >= 19 && parcel.dataPosition() > 65536) return;
    switch (code % 24) {
        case 0: parcel.readInt32(); break;
        case 1: parcel.readInt64(); break;
        case 2: parcel.readDouble(); break;
        case 3: parcel.readByte(); break;
        case 4: parcel.readBool(); break;
        case 5: use(parcel.readString16()); break;
        case 6: read_string16(parcel); break;
        case 7: parcel.readString8(); break;
        case 8: {
            const char* text = parcel.readCString();
            if (text != nullptr) use(text, strlen(text) + 1);
            break;
        }
        case 9: use(parcel.readInplace(value), value); break;
        case 10: {
            std::vector<uint8_t> block(value % 4096);
            parcel.read(block.data(), block.size());
            break;
        }
        case 11:
            if (parcel.readStrongBinder() == local) parcel.checkInterface(local.get());
            break;
        case 12: parcel.readFileDescriptor(); break;
        case 13: parcel.readExceptionCode(); break;
        case 14: parcel.enforceInterface(String16("fuzz.interface")); break;
        case 15: parcel.hasFileDescriptors(); break;
        case 16: parcel.setDataPosition(value); break;
        case 17: parcel.setDataPosition(value % 256); break;
        case 18: {
            Parcel copy;
            copy.appendFrom(&parcel, value % 64, parcel.dataSize() / 2);
            break;
        }
        case 19: parcel.writeInt32(static_cast<int32_t>(value)); break;
        case 20: parcel.writeStrongBinder(value % 2 != 0 ? local : nullptr); break;
        case 21: parcel.setDataSize(value % 65536); break;
        case 22: parcel.appendFrom(&parcel, value % 64, parcel.dataSize() / 2); break;
        case 23: parcel.writeInplace(value % 1024); break;
        default: break;
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // Handles lead to no proxies, because there is no driver: everything stays in this parcel.
    static const bool no_driver = setenv("BINDER_DRIVER", "none", 1) == 0;
    static_cast<void>(no_driver);
    static const sp<BBinder>& local = *new sp<BBinder>(new BBinder);

    Script script(data, size);
    const std::vector<ObjectPlan> plans = tavo::fuzz::take_objects(script);
    struct Operation {
        uint8_t code;
        uint32_t value;
    };
    std::vector<Operation> operations;
    for (int count = script.take<uint8_t>() % 64; count > 0; --count) {
        operations.push_back({script.take<uint8_t>(), script.take<uint32_t>()});
    }
    Parcel parcel;
    tavo::fuzz::receive(parcel, script.rest(), plans, local);
    for (const Operation& operation : operations) {
        operate(parcel, operation.code, operation.value, local);
        if (parcel.dataAvail() > parcel.dataSize()) abort();
        if (parcel.errorCheck() == NO_ERROR && parcel.dataSize() > 1 << 24) parcel.freeData();
    }
    return 0;
}

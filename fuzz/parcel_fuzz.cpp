// Reads received parcels of any contents, with objects at any offsets, in any order of operations.
//
// The input is a script: a count of objects; for each its offset, its type and its number; a count of
// operations and their codes; the rest are the parcel's bytes. Objects are put in as a driver would, so that only
// binders of this process come with an address, and what a driver could never hand over is taken off the list.
#include <binder/Binder.h>
#include <binder/Parcel.h>
#include <linux/android/binder.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

using namespace android;

class Script {
public:
    Script(const uint8_t* data, size_t size) : next_(data), end_(data + size) {}

    template <typename T>
    T take() {
        T value{};
        const size_t left = static_cast<size_t>(end_ - next_);
        const size_t size = left < sizeof value ? left : sizeof value;
        if (size != 0) memcpy(&value, next_, size);
        next_ += size;
        return value;
    }

    std::vector<uint8_t> rest() {
        std::vector<uint8_t> bytes(next_, end_);
        next_ = end_;
        return bytes;
    }

private:
    const uint8_t* next_;
    const uint8_t* end_;
};

struct ObjectPlan {
    binder_size_t offset;
    uint8_t type;
    uint32_t number;
};

// A received parcel's memory, which the parcel gives back.
struct Buffer {
    std::vector<uint8_t> bytes;
    std::vector<binder_size_t> offsets;
};

bool fits(const Buffer& buffer, binder_size_t offset) {
    return offset <= buffer.bytes.size() && buffer.bytes.size() - offset >= sizeof(flat_binder_object);
}

flat_binder_object make_object(const ObjectPlan& plan, const sp<BBinder>& local) {
    constexpr uint32_t kTypes[] = {BINDER_TYPE_BINDER, BINDER_TYPE_HANDLE, BINDER_TYPE_FD, BINDER_TYPE_WEAK_BINDER, 0};
    flat_binder_object object = {};
    object.hdr.type = kTypes[plan.type % (sizeof kTypes / sizeof kTypes[0])];
    object.handle = plan.number;
    if (object.hdr.type == BINDER_TYPE_BINDER) {
        object.binder = reinterpret_cast<uintptr_t>(local->getWeakRefs());
        object.cookie = reinterpret_cast<uintptr_t>(local.get());
    } else if (object.hdr.type == BINDER_TYPE_FD) {
        object.handle = plan.number % 4 == 0 ? UINT32_MAX : plan.number % 4;
    }
    return object;
}

void receive(Parcel& parcel, std::vector<uint8_t> bytes, const std::vector<ObjectPlan>& plans,
             const sp<BBinder>& local) {
    auto* buffer = new Buffer{std::move(bytes), {}};
    for (const ObjectPlan& plan : plans) {
        if (!fits(*buffer, plan.offset)) continue;
        const flat_binder_object object = make_object(plan, local);
        memcpy(buffer->bytes.data() + plan.offset, &object, sizeof object);
    }
    for (const ObjectPlan& plan : plans) {
        if (fits(*buffer, plan.offset)) {
            // An object that overlaps another one may have come to claim an address that no driver would.
            flat_binder_object object;
            memcpy(&object, buffer->bytes.data() + plan.offset, sizeof object);
            const auto address = reinterpret_cast<uintptr_t>(local.get());
            if (object.hdr.type == BINDER_TYPE_BINDER && object.cookie != address) continue;
        }
        buffer->offsets.push_back(plan.offset);
    }
    parcel.ipcSetDataReference(
        buffer->bytes.data(), buffer->bytes.size(), buffer->offsets.data(), buffer->offsets.size(),
        [](Parcel*, const uint8_t*, size_t, const binder_size_t*, size_t, void* cookie) {
            delete static_cast<Buffer*>(cookie);
        },
        buffer);
}

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
    std::vector<ObjectPlan> plans;
    for (int count = script.take<uint8_t>() % 8; count > 0; --count) {
        const auto offset = script.take<uint16_t>();
        // Mostly near the beginning, where the bytes are, but sometimes anywhere at all.
        const binder_size_t anywhere = offset % 16 == 15 ? ~binder_size_t{0} - offset / 16 : offset % 256;
        plans.push_back({anywhere, script.take<uint8_t>(), script.take<uint32_t>()});
    }
    struct Operation {
        uint8_t code;
        uint32_t value;
    };
    std::vector<Operation> operations;
    for (int count = script.take<uint8_t>() % 64; count > 0; --count) {
        operations.push_back({script.take<uint8_t>(), script.take<uint32_t>()});
    }
    Parcel parcel;
    receive(parcel, script.rest(), plans, local);
    for (const Operation& operation : operations) {
        operate(parcel, operation.code, operation.value, local);
        if (parcel.dataAvail() > parcel.dataSize()) abort();
        if (parcel.errorCheck() == NO_ERROR && parcel.dataSize() > 1 << 24) parcel.freeData();
    }
    return 0;
}

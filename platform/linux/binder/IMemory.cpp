#include <binder/IMemory.h>
#include <binder/Parcel.h>

#include <cstdint>
#include <memory>
#include <utility>

#include "RemoteHeap.h"

namespace android {

class BpMemoryHeap : public BpInterface<IMemoryHeap> {
public:
    // What can fail for want of memory comes first: a RefBase whose construction goes on to fail leaks.
    explicit BpMemoryHeap(const sp<IBinder>& remote) : BpMemoryHeap(remote, RemoteHeap::of(remote)) {}

    int getHeapID() const override { return mHeap->mapping().fd; }
    void* getBase() const override { return mHeap->mapping().base; }
    size_t getSize() const override { return mHeap->mapping().size; }
    uint32_t getFlags() const override { return mHeap->mapping().flags; }
    uint32_t getOffset() const override { return mHeap->mapping().offset; }

private:
    BpMemoryHeap(const sp<IBinder>& remote, std::shared_ptr<RemoteHeap> heap)
        : BpInterface<IMemoryHeap>(remote), mHeap(std::move(heap)) {}

    const std::shared_ptr<RemoteHeap> mHeap;
};

IMPLEMENT_META_INTERFACE(MemoryHeap, "android.utils.IMemoryHeap")

BnMemoryHeap::BnMemoryHeap() = default;
BnMemoryHeap::~BnMemoryHeap() = default;

status_t BnMemoryHeap::onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags) {
    if (code != HEAP_ID) return BBinder::onTransact(code, data, reply, flags);
    CHECK_INTERFACE(IMemoryHeap, data, reply);
    const auto size = static_cast<uint32_t>(getSize());
    if (size != getSize()) return BAD_VALUE;
    reply->writeFileDescriptor(getHeapID());
    reply->writeUint32(size);
    reply->writeUint32(getFlags());
    return reply->writeUint32(getOffset());
}

}  // namespace android

// Memory that several processes share.
#pragma once

#include <binder/IInterface.h>
#include <sys/types.h>

#include <cstddef>
#include <cstdint>

namespace android {

class LIBBINDER_EXPORT IMemoryHeap : public IInterface {
public:
    DECLARE_META_INTERFACE(MemoryHeap)

    enum { HEAP_ID = IBinder::FIRST_CALL_TRANSACTION };

    // Flags.
    enum {
        READ_ONLY = 0x00000001  // other processes may only read
    };

    // The heap's descriptor, which stays the heap's; -1 when it has none.
    virtual int getHeapID() const = 0;
    // Where this process sees the heap, MAP_FAILED when it does not. A heap of another process is mapped by the first
    // of these calls, once for all its references, and stays where it is until the last of them goes.
    virtual void* getBase() const = 0;
    virtual size_t getSize() const = 0;
    virtual uint32_t getFlags() const = 0;
    // Where in the descriptor's file the heap begins.
    virtual uint32_t getOffset() const = 0;

    int32_t heapID() const { return getHeapID(); }
    void* base() const { return getBase(); }
    size_t virtualSize() const { return getSize(); }
};

class LIBBINDER_EXPORT BnMemoryHeap : public BnInterface<IMemoryHeap> {
public:
    BnMemoryHeap();
    status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply, uint32_t flags = 0) override;

protected:
    ~BnMemoryHeap() override;
};

}  // namespace android

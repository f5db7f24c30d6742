// A heap that this process makes and others may map: an anonymous memory file.
#pragma once

#include <binder/IMemory.h>
#include <sys/mman.h>

#include <cstddef>
#include <cstdint>

namespace android {

class LIBBINDER_EXPORT MemoryHeapBase : public virtual BnMemoryHeap {
public:
    // Beside IMemoryHeap's flags.
    enum {
        READ_ONLY = IMemoryHeap::READ_ONLY,
        DONT_MAP_LOCALLY = 0x00000100  // getBase() is null here
    };

    // A new heap, zeroed, its size rounded up to whole pages. Nobody can change its size afterwards. The name
    // shows in /proc/PID/maps and is cut to what the kernel takes. When anything fails, that is logged and the heap
    // has no descriptor and no base.
    explicit MemoryHeapBase(size_t size, uint32_t flags = 0, const char* name = nullptr);
    // A heap on a part of a file; the descriptor is duplicated. Size 0 means up to the file's end. Other processes
    // accept only memory files that are sealed against shrinking.
    MemoryHeapBase(int fd, size_t size, uint32_t flags = 0, uint32_t offset = 0);
    ~MemoryHeapBase() override;

    int getHeapID() const override { return mFD; }
    void* getBase() const override { return mBase; }
    size_t getSize() const override { return mSize; }
    uint32_t getFlags() const override { return mFlags; }
    uint32_t getOffset() const override { return mOffset; }

    // Gives mapping and descriptor up before the last reference goes. Other processes keep their mappings.
    void dispose();

private:
    bool map(size_t size, uint32_t offset);

    int mFD = -1;
    size_t mSize = 0;
    void* mBase = MAP_FAILED;
    uint32_t mFlags;
    uint32_t mOffset = 0;
    bool mMapped = false;
};

}  // namespace android

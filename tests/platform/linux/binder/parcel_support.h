// What the parcel tests look at parcels with.
#pragma once

#include <binder/Binder.h>
#include <binder/Parcel.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <cstdint>
#include <vector>

namespace tavo::test {

using Bytes = std::vector<uint8_t>;

inline Bytes bytes_of(const android::Parcel& parcel) { return Bytes(parcel.data(), parcel.data() + parcel.dataSize()); }

inline std::vector<binder_size_t> offsets_of(const android::Parcel& parcel) {
    const auto* offsets = reinterpret_cast<const binder_size_t*>(parcel.ipcObjects());
    return {offsets, offsets + parcel.ipcObjectsCount()};
}

// A binder that says when it is destroyed.
class Counted : public android::BBinder {
public:
    explicit Counted(int& alive) : alive_(alive) { ++alive_; }
    ~Counted() override { --alive_; }

private:
    int& alive_;
};

inline int open_null() { return open("/dev/null", O_RDWR | O_CLOEXEC); }
inline bool is_open(int fd) { return fcntl(fd, F_GETFD) >= 0; }
inline bool is_close_on_exec(int fd) { return (fcntl(fd, F_GETFD) & FD_CLOEXEC) != 0; }

inline bool is_same_file(int a, int b) {
    struct stat first = {}, second = {};
    return fstat(a, &first) == 0 && fstat(b, &second) == 0 && first.st_dev == second.st_dev &&
           first.st_ino == second.st_ino;
}

}  // namespace tavo::test

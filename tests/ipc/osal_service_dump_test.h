// What a binder object writes when it is asked to dump.
#pragma once

#include <binder/IBinder.h>
#include <fcntl.h>
#include <unistd.h>

#include <string>
#include <thread>
#include <vector>

namespace tavo::test {

struct Dump {
    android::status_t status;
    std::string text;
};

inline android::Vector<android::String16> dump_arguments(const std::vector<const char*>& texts) {
    android::Vector<android::String16> arguments;
    for (const char* text : texts) arguments.add(android::String16(text));
    return arguments;
}

inline std::string read_to_end(int fd) {
    std::string text;
    char piece[4096];
    for (ssize_t count; (count = read(fd, piece, sizeof piece)) > 0;) text.append(piece, static_cast<size_t>(count));
    return text;
}

// Reads while the object writes, as dumpsys does: what is written may be more than a pipe holds.
inline Dump dump_of(const android::sp<android::IBinder>& object, const std::vector<const char*>& texts = {}) {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) return {-1, ""};
    Dump dump = {};
    std::thread reader([&] { dump.text = read_to_end(ends[0]); });
    dump.status = object->dump(ends[1], dump_arguments(texts));
    close(ends[1]);
    reader.join();
    close(ends[0]);
    return dump;
}

}  // namespace tavo::test

// Whole files in, whole pieces out.
#pragma once

#include <cstddef>
#include <string>

namespace tavo::tool {

// A file, or standard input for "-", read in pieces or lines.
class Input {
public:
    // Throws Failure.
    explicit Input(const std::string& path);
    ~Input();
    Input(const Input&) = delete;
    Input& operator=(const Input&) = delete;

    // All of it, but no more than limit bytes. Throws Failure.
    std::string read_up_to(size_t limit);
    // The next line without its end; false at the end of the input. No more than limit bytes of it, which then is
    // longer. Throws Failure, and stops at a signal (StopSignals).
    bool read_line(std::string& line, size_t limit);
    const std::string& name() const { return name_; }

private:
    bool fill();

    std::string name_;
    int fd_;
    std::string buffer_;
    size_t used_ = 0;
};

// All of the bytes, whatever it takes. False, and errno, when they could not be written.
bool write_all(int fd, const void* data, size_t size);

}  // namespace tavo::tool

// What is different when people look on: colours and progress.
#pragma once

#include <chrono>
#include <string>

namespace tavo::tool {

// Colours for what is written to a descriptor; none unless it is a terminal, or they were asked for.
class Style {
public:
    explicit Style(int fd);
    bool coloured() const { return coloured_; }
    std::string good(const std::string& text) const { return wrap("32", text); }
    std::string fair(const std::string& text) const { return wrap("33", text); }
    std::string bad(const std::string& text) const { return wrap("31", text); }
    std::string dim(const std::string& text) const { return wrap("2", text); }
    std::string strong(const std::string& text) const { return wrap("1", text); }
    // With the number of a colour as terminals know it.
    std::string wrap(const char* colour, const std::string& text) const;

private:
    bool coloured_;
};

// A line on standard error that tells how far things are, where that is a terminal. Rewritten a few times a second, and
// gone with the object.
class Progress {
public:
    // Not where the command's own output appears on the same terminal, if that is what output is.
    explicit Progress(bool wanted = true);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    void show(const std::string& line);

private:
    bool shown_ = false;
    const bool enabled_;
    std::chrono::steady_clock::time_point next_;
};

}  // namespace tavo::tool

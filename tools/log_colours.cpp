#include "tools/log_colours.h"

#include <cstring>

namespace tavo::tool {
namespace {

constexpr char kPriorities[] = "VDIWEF";

// Whether the text has the shape there: 0 stands for a digit, everything else for itself.
bool looks_like(const std::string& text, size_t at, const char* shape) {
    for (; *shape != '\0'; ++shape, ++at) {
        if (at >= text.size()) return false;
        const bool fits = *shape == '0' ? text[at] >= '0' && text[at] <= '9' : text[at] == *shape;
        if (!fits) return false;
    }
    return true;
}

bool is_priority(char c) { return c != '\0' && strchr(kPriorities, c) != nullptr; }

}  // namespace

char priority_in(const std::string& line) {
    // "TAG P MM-DD hh:mm:ss PID TID text"
    for (size_t at = line.find(' '); at != std::string::npos; at = line.find(' ', at + 1)) {
        if (at + 1 < line.size() && is_priority(line[at + 1]) && looks_like(line, at + 2, " 00-00 00:00:00 ")) {
            return line[at + 1];
        }
    }
    // "MM-DD hh:mm:ss.mmm PID TID P TAG: text"
    if (!looks_like(line, 0, "00-00 00:00:00.000 ")) return 0;
    const size_t at = line.find_first_not_of(" 0123456789", sizeof "00-00 00:00:00.000" - 1);
    const bool stands_alone = at != std::string::npos && line[at - 1] == ' ' && looks_like(line, at + 1, " ");
    return stands_alone && is_priority(line[at]) ? line[at] : '\0';
}

std::string LogColours::coloured(const std::string& line) {
    const char priority = priority_in(line);
    const bool drop = after_log_line_ && line.empty();
    after_log_line_ = priority != 0;
    switch (priority) {
        case 'F':
        case 'E': return style_.bad(line) + "\n";
        case 'W': return style_.fair(line) + "\n";
        case 'I': return style_.good(line) + "\n";
        case 'D': return style_.wrap("36", line) + "\n";
        case 'V': return style_.dim(line) + "\n";
        default: return drop ? "" : line + "\n";
    }
}

std::string LogColours::take(const std::string& bytes) {
    if (!style_.coloured()) return bytes;
    std::string output;
    for (const char c : bytes) {
        if (c == '\n') {
            output += coloured(line_);
            line_.clear();
        } else {
            line_ += c;
        }
    }
    return output;
}

std::string LogColours::rest() {
    std::string rest;
    rest.swap(line_);
    return rest;
}

}  // namespace tavo::tool

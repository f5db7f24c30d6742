#include "ipc/log_lines.h"

#include <algorithm>
#include <cstdlib>
#include <regex>

namespace tavo::test {

std::vector<LogLine> library_lines(const LogCapture& log, const std::vector<std::string>& tags) {
    static const std::regex address("0x[0-9a-f]{6,}");
    std::vector<LogLine> lines = log.lines();
    const auto unwanted = [&](const LogLine& line) {
        const bool other_tag = !tags.empty() && std::find(tags.begin(), tags.end(), line.tag) == tags.end();
        return line.by_print || other_tag;
    };
    lines.erase(std::remove_if(lines.begin(), lines.end(), unwanted), lines.end());
    for (LogLine& line : lines) line.text = std::regex_replace(line.text, address, "PTR");
    return lines;
}

void* logged_address(const LogCapture& log, const std::string& beginning) {
    for (const LogLine& line : log.lines()) {
        const std::string message = line.message();
        if (message.compare(0, beginning.size(), beginning) != 0) continue;
        return reinterpret_cast<void*>(strtoull(message.c_str() + beginning.size(), nullptr, 16));
    }
    return nullptr;
}

size_t times_logged(const LogCapture& log, const std::string& message) {
    const std::vector<LogLine> lines = log.lines();
    return static_cast<size_t>(
        std::count_if(lines.begin(), lines.end(), [&](const LogLine& line) { return line.message() == message; }));
}

}  // namespace tavo::test

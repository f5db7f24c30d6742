#include "tools/terminal.h"

#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "tools/command.h"

namespace tavo::tool {
namespace {

bool is_set(const char* variable) {
    const char* value = getenv(variable);
    return value != nullptr && *value != '\0';
}

bool understands_colours(int fd) {
    const char* terminal = getenv("TERM");
    return isatty(fd) == 1 && !is_set("NO_COLOR") && terminal != nullptr && strcmp(terminal, "dumb") != 0;
}

}  // namespace

Style::Style(int fd)
    : coloured_(settings().colour == "always" || (settings().colour == "auto" && understands_colours(fd))) {}

std::string Style::wrap(const char* colour, const std::string& text) const {
    return coloured_ ? std::string("\033[") + colour + "m" + text + "\033[0m" : text;
}

Progress::Progress(bool wanted) : enabled_(wanted && isatty(STDERR_FILENO) == 1) {}

Progress::~Progress() {
    if (shown_) fputs("\r\033[K", stderr);
}

void Progress::show(const std::string& line) {
    const auto now = std::chrono::steady_clock::now();
    if (!enabled_ || now < next_) return;
    next_ = now + std::chrono::milliseconds(200);
    shown_ = true;
    fprintf(stderr, "\r\033[K%s", line.c_str());
}

}  // namespace tavo::tool

#include "soak/failure.h"

#include <limits.h>
#include <unistd.h>

#include <cstdio>

#include "soak/board.h"

namespace tavo::soak {
namespace {

std::string& name() {
    static std::string& text = *new std::string("coordinator");
    return text;
}

thread_local const char* g_operation = "start";

}  // namespace

void set_name(const std::string& text) { name() = text; }
void set_operation(const char* text) { g_operation = text; }
const char* current_operation() { return g_operation; }

void fail(const std::string& what) {
    std::string line = name() + " (pid " + std::to_string(getpid()) + "), " + g_operation + ": " + what;
    for (char& c : line) {
        if (c == '\n') c = ' ';
    }
    line.resize(std::min<size_t>(line.size(), PIPE_BUF - 1));
    line += '\n';
    if (write(kFailureFd, line.data(), line.size()) < 0) perror(line.c_str());
}

bool expect(bool holds, const char* what) {
    if (!holds) fail(what);
    return holds;
}

bool expect_status(TAVO_Status status, TAVO_Status expected, const char* call) {
    if (status == expected) return true;
    char text[200];
    snprintf(text, sizeof text, "%s answered %#x, not %#x", call, static_cast<unsigned>(status),
             static_cast<unsigned>(expected));
    fail(text);
    return false;
}

bool succeeds(TAVO_Status status, const char* call) { return expect_status(status, TAVO_SUCCESS, call); }

}  // namespace tavo::soak

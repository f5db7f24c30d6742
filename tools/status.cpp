// tavo status: what a status code is called and what it means.
#include "tavo_osal/status.h"

#include <strings.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <nlohmann/json.hpp>
#include <vector>

#include "tools/command.h"
#include "tools/service.h"
#include "tools/terminal.h"

namespace tavo::tool {
namespace {

struct Code {
    int value;
    const char* name;
    const char* meaning;
};

#define TAVO_CODE(name) name, #name
constexpr Code kCodes[] = {
    {TAVO_CODE(TAVO_SUCCESS), "the operation succeeded"},
    {TAVO_CODE(TAVO_FAILURE), "a wrapped platform call failed, or the service is unreachable"},
    {TAVO_CODE(TAVO_INVALID_PARAM), "null pointer, null handle or argument out of range"},
    {TAVO_CODE(TAVO_NO_MEMORY), "an allocation failed"},
    {TAVO_CODE(TAVO_DESTROY_FAILED), "an event's parts could not be destroyed; the event is freed all the same"},
    {TAVO_CODE(TAVO_NOT_SUPPORTED), "the operation does not exist on this platform"},
    {TAVO_CODE(TAVO_BUSY), "the mutex is held"},
    {TAVO_CODE(TAVO_OUT_OF_RANGE), "the number does not fit in 32 bits"},
    {TAVO_CODE(TAVO_TIMEOUT), "an event wait expired"},
    {TAVO_CODE(TAVO_SOCKET_CREATE_FAILED), "the socket could not be created"},
    {TAVO_CODE(TAVO_SOCKET_CONNECT_FAILED), "connect, bind, netlink bind or accept failed"},
    {TAVO_CODE(TAVO_SOCKET_CLOSE_FAILED), "close, shutdown or linger reset failed"},
    {TAVO_CODE(TAVO_SOCKET_SELECT_TIMEOUT), "a socket wait expired"},
    {TAVO_CODE(TAVO_SOCKET_SELECT_FAILED), "a socket wait failed"},
    {TAVO_CODE(TAVO_SOCKET_SEND_FAILED), "fewer bytes were sent than asked"},
    {TAVO_CODE(TAVO_SOCKET_OPTION_FAILED), "a socket option could not be set"},
    {TAVO_CODE(TAVO_MQ_KEY_FAILED), "no message-queue key could be generated"},
    {TAVO_CODE(TAVO_MQ_INVALID_POINTER), "null handle pointer or null key text"},
    {TAVO_CODE(TAVO_MQ_FAILURE), "no queue object, or a failed receive"},
    {TAVO_CODE(TAVO_MQ_MSG_TOO_LARGE), "the message is larger than a queue carries"},
    {TAVO_CODE(TAVO_MQ_NOT_AVAILABLE), "no write end, no such queue in the service, or a removed queue"},
    {TAVO_CODE(TAVO_CONDITION_TIMEOUT), "a condition-variable wait expired"},
    {TAVO_CODE(TAVO_SEM_DELETE_FAILED), "a cross-process semaphore could not be unmapped"},
    {TAVO_CODE(TAVO_SEMAPHORE_TIMEOUT), "a semaphore wait expired"},
    {TAVO_CODE(TAVO_DL_OPEN_FAILED), "the shared object could not be loaded"},
    {TAVO_CODE(TAVO_DL_SYMBOL_FAILED), "the symbol was not found"},
    {TAVO_CODE(TAVO_DL_CLOSE_FAILED), "the shared object could not be closed"},
};
#undef TAVO_CODE

// Results that some operations have beside the codes.
constexpr Code kPlainResults[] = {
    {1, "1", "attaching to a queue: the service is not reachable; no status code, but what callers know"},
    {-1, "-1", "a queue operation of the service, a put or a get failed"},
    {-19, "-19", "waiting for several queues: the read end of one is not there"},
    {-22, "-22", "waiting for several queues: the first one is missing"},
};

struct Options {
    std::string code;
    bool json = false;
};

bool is_named(const Code& code, const std::string& name) {
    constexpr size_t kPrefix = sizeof "TAVO_" - 1;
    return strcasecmp(code.name, name.c_str()) == 0 || strcasecmp(code.name + kPrefix, name.c_str()) == 0;
}

// A number in decimal, or in hexadecimal with or without 0x where that is what the codes look like.
bool is_number(const Code& code, const std::string& text) {
    const auto matches = [&](int base) {
        char* end = nullptr;
        errno = 0;
        const long long number = strtoll(text.c_str(), &end, base);
        return errno == 0 && end != text.c_str() && *end == '\0' && number == code.value;
    };
    const bool is_hex = text.find_first_of("xX") != std::string::npos;
    return matches(is_hex ? 16 : 10) || (!is_hex && code.value > 0x9000 && matches(16));
}

std::vector<Code> chosen(const std::string& asked) {
    if (asked.empty()) return {std::begin(kCodes), std::end(kCodes)};
    for (const Code& code : kCodes) {
        if (is_named(code, asked) || is_number(code, asked)) return {code};
    }
    for (const Code& code : kPlainResults) {
        if (is_number(code, asked)) return {code};
    }
    throw Failure("no status code is called " + asked + ": 'tavo status' lists them all");
}

int show_status(const Options& options) {
    const std::vector<Code> codes = chosen(options.code);
    if (options.json) {
        auto list = nlohmann::json::array();
        for (const Code& code : codes) {
            list.push_back({{"value", code.value}, {"name", code.name}, {"meaning", code.meaning}});
        }
        puts((options.code.empty() ? list : list[0]).dump().c_str());
        return kDone;
    }
    const Style style(STDOUT_FILENO);
    for (const Code& code : codes) {
        char number[32];
        snprintf(number, sizeof number, code.value > 1 ? "0x%x %5d" : "%6d %5d", static_cast<unsigned>(code.value),
                 code.value);
        char name[32];
        snprintf(name, sizeof name, "%-27s", code.name);
        printf("%s  %s %s\n", number, style.strong(name).c_str(), code.meaning);
    }
    return kDone;
}

}  // namespace

std::string describe_status(int status) {
    const auto describe = [status](const Code& code) {
        char number[16];
        snprintf(number, sizeof number, status > 1 ? "0x%x" : "%d", static_cast<unsigned>(status));
        const std::string name = code.value > 1 ? std::string(code.name) + ", " : "";
        return std::string(number) + " (" + name + code.meaning + ")";
    };
    for (const Code& code : kCodes) {
        if (code.value == status) return describe(code);
    }
    for (const Code& code : kPlainResults) {
        if (code.value == status) return describe(code);
    }
    return std::to_string(status);
}

void add_status(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options =
        add_command<Options>(app, run, "status", "Tells what a status code means", show_status, command);
    command->add_option("CODE", options->code, "A number, decimal or hexadecimal, or a name; all codes without it");
    command->add_flag("--json", options->json, "JSON instead of a text");
}

}  // namespace tavo::tool

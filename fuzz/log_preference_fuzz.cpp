// Sets logging preferences of any text, as an argument and as LOG_PREF, and compares the settings with a model.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz/script.h"
#include "tavo_osal/log.h"

namespace {

using tavo::fuzz::require;
using tavo::fuzz::Script;

struct Settings {
    uint32_t level = TAVO_LOG_WARNING;
    uint32_t stream = 77;
    uint32_t mask = 0x5A5A5A5A;
    uint32_t performance = 0;
    std::string path = "/tmp/as_before.txt";
    bool callback = false;
};

void callback(void*) {}

// The pieces between separators, without those that are empty.
std::vector<std::string_view> split(std::string_view text, char separator) {
    std::vector<std::string_view> pieces;
    while (!text.empty()) {
        const size_t end = std::min(text.find(separator), text.size());
        if (end != 0) pieces.push_back(text.substr(0, end));
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return pieces;
}

// The number that the whole text is; 0 where it is none. What is above a million is as good as a million.
long number(std::string_view text) {
    while (!text.empty() && (text[0] == ' ' || (text[0] >= '\t' && text[0] <= '\r'))) text.remove_prefix(1);
    bool negative = false;
    if (!text.empty() && (text[0] == '+' || text[0] == '-')) {
        negative = text[0] == '-';
        text.remove_prefix(1);
    }
    long value = 0;
    for (const char digit : text) {
        if (digit < '0' || digit > '9') return 0;
        value = std::min(value * 10 + (digit - '0'), 1000000L);
    }
    return negative ? -value : value;
}

void apply_modules(std::string_view list, Settings& settings, bool& cleared) {
    for (const std::string_view item : split(list, ',')) {
        const long module = number(item);
        if (module < 1 || module > 32) continue;
        if (!cleared) settings.mask = 0;
        cleared = true;
        settings.mask |= 1U << (module - 1);
    }
}

void apply(std::string_view preference, Settings& settings) {
    bool cleared = false;
    for (const std::string_view token : split(preference, ' ')) {
        if (token[0] != '-') {
            settings.path = ("/tmp/" + std::string(token) + ".txt").substr(0, 31);
        } else if (token == "-s") {
            settings.stream = 1;
        } else if (token == "-f") {
            settings.stream = 2;
        } else if (token == "-c") {
            settings.stream = 3;
            settings.callback = true;
        } else if (token == "-a") {
            settings.mask = UINT32_MAX;
        } else if (token == "-t") {
            settings.performance = 1;
        } else if (token.size() == 3 && token[1] == 'l') {
            const long level = number(token.substr(2));
            if (level <= 6) settings.level = static_cast<uint32_t>(level);
        } else if (token.size() > 2 && token[1] == 'm') {
            apply_modules(token.substr(2), settings, cleared);
        }
    }
}

void put_back(const Settings& settings) {
    g_uiMxEnabledLogLevel = settings.level;
    g_uiOutputStreamId = settings.stream;
    g_uiEnabledModuleMask = settings.mask;
    g_uiPerformance = settings.performance;
    g_fpLogCallback = nullptr;
    g_pvCallbackParam = nullptr;
    g_uiEnvValueRead = 0;
    std::fill(std::begin(g_acFilePath), std::end(g_acFilePath), '\0');
    std::copy(settings.path.begin(), settings.path.end(), std::begin(g_acFilePath));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // The preference is repeated on standard output.
    static FILE* const nowhere = freopen("/dev/null", "w", stdout);
    static_cast<void>(nowhere);
    Script script(data, size);
    const bool from_environment = script.take<uint8_t>() % 2 != 0;
    std::vector<char> text = tavo::fuzz::text_of(script.rest());

    Settings expected;
    put_back(expected);
    if (!from_environment) expected.stream = TAVO_LOG_STREAM_CONSOLE;
    apply(text.data(), expected);

    int param = 0;
    if (from_environment) {
        // In the environment itself, where the library splits it in place.
        static constexpr char kName[] = "LOG_PREF=";
        std::vector<char> entry(kName, kName + sizeof kName - 1);
        entry.insert(entry.end(), text.begin(), text.end());
        putenv(entry.data());
        tavo_set_log_preference("-l6 not looked at", callback, &param);
        require(g_uiEnvValueRead == 1, "LOG_PREF was read");
        unsetenv("LOG_PREF");
        tavo_set_log_preference("-l5 -f too late", callback, &param);
    } else {
        const std::vector<char> before = text;
        tavo_set_log_preference(text.data(), callback, &param);
        require(text == before, "the argument is not touched");
        require(g_uiEnvValueRead == 0, "LOG_PREF was not there");
    }
    require(g_uiMxEnabledLogLevel == expected.level, "the level");
    require(g_uiOutputStreamId == expected.stream, "the stream");
    require(g_uiEnabledModuleMask == expected.mask, "the modules");
    require(g_uiPerformance == expected.performance, "the performance messages");
    require(std::string(g_acFilePath, strnlen(g_acFilePath, sizeof g_acFilePath)) == expected.path, "the path");
    require(g_fpLogCallback == (expected.callback ? &callback : nullptr), "the callback");
    require(g_pvCallbackParam == (expected.callback ? &param : nullptr), "the callback's parameter");
    return 0;
}

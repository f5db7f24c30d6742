// tavo top: what the service has, over and over again.
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <optional>
#include <thread>

#include "tools/command.h"
#include "tools/numbers.h"
#include "tools/screen.h"
#include "tools/service.h"
#include "tools/stop_signals.h"
#include "tools/top_view.h"

namespace tavo::tool {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

struct Options {
    unsigned long count = 0;
    double interval = 1;
    bool json = false;
};

milliseconds interval_of(const Options& options) {
    if (!(options.interval >= 0.1)) throw Misuse("--interval must be 0.1 seconds or more");
    return milliseconds_of(options.interval);
}

Look look_at(const Binder& service) { return {figures_of(service), steady_clock::now()}; }

int print_snapshots(const Options& options, const Binder& service) {
    const Style style(STDOUT_FILENO);
    const milliseconds interval = interval_of(options);
    const unsigned long count = std::max(options.count, 1UL);
    std::optional<Look> previous;
    for (unsigned long i = 0; i < count && StopSignals::received() == 0; ++i) {
        if (i > 0) {
            pollfd slot = {StopSignals::descriptor(), POLLIN, 0};
            poll(&slot, 1, static_cast<int>(interval.count()));
            if (StopSignals::received() != 0) break;
        }
        const Look look = look_at(service);
        const Look* before = previous ? &*previous : nullptr;
        if (options.json) {
            fputs(look_as_json(dump_of(service, {"--json"}), look, before).c_str(), stdout);
        } else {
            printf("%s%s", i > 0 ? "\n" : "", show_look(look, before, style).c_str());
        }
        fflush(stdout);
        previous = look;
    }
    return kDone;
}

// A service that went away may come back, so the screen stays.
std::string text_now(Binder& service, std::optional<Look>& now, std::optional<Look>& before, const Style& style) {
    try {
        if (service == nullptr || !service->isBinderAlive()) service = find_service();
        before = now;
        now = look_at(service);
        return show_look(*now, before ? &*before : nullptr, style);
    } catch (const Failure& failure) {
        service = nullptr;
        now = before = std::nullopt;
        return style.bad(failure.what()) + "\n";
    }
}

int show_screens(const Options& options, Binder service) {
    const milliseconds interval = interval_of(options);
    const Style style(STDOUT_FILENO);
    char title[64];
    snprintf(title, sizeof title, "tavo top: every %g s, q ends\n", options.interval);
    const std::string heading = style.dim(std::string(title, strlen(title) - 1)) + "\n";
    std::optional<Look> now, before;
    Screen screen;
    auto next = steady_clock::now();
    for (unsigned long i = 0; options.count == 0 || i < options.count; ++i) {
        const std::string text = heading + text_now(service, now, before, style);
        next = std::max(next + interval, steady_clock::now());
        screen.draw(text);
        Screen::Event event = screen.wait_until(next);
        for (; event == Screen::Event::kResized; event = screen.wait_until(next)) screen.draw(text);
        if (event == Screen::Event::kQuit) break;
    }
    return kDone;
}

int top(const Options& options) {
    const Binder service = find_service();
    const StopSignals signals;
    const bool is_screen = isatty(STDOUT_FILENO) == 1 && !options.json;
    return is_screen ? show_screens(options, service) : print_snapshots(options, service);
}

}  // namespace

void add_top(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options =
        add_command<Options>(app, run, "top", "Shows the service's queues and blocks live", top, command);
    command->add_option("-n,--count", options->count, "Looks; on a terminal until q without, elsewhere one");
    command->add_option("-i,--interval", options->interval, "Seconds between them; 1 without");
    command->add_flag("--json", options->json, "A line of JSON for each look");
}

}  // namespace tavo::tool

// The tavo command: the subcommands' table, and what they have in common.
#include <android/log.h>
#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#include "tavo_osal/log.h"
#include "tools/command.h"
#include "tools/muted_output.h"
#include "tools/service.h"
#include "tools/terminal.h"

namespace tavo::tool {

Settings& settings() {
    static Settings instance;
    return instance;
}

void say(const std::string& line) {
    std::string text = line;
    for (char& c : text) c = c == '\n' ? ' ' : c;
    const Style style(STDERR_FILENO);
    fprintf(stderr, "%s %s\n", style.bad("tavo:").c_str(), text.c_str());
}

namespace {

constexpr void (*kSubcommands[])(CLI::App&, Run&) = {
    add_serve, add_send, add_recv, add_drop,   add_shm,    add_sem,
    add_ping,  add_list, add_top,  add_status, add_doctor, add_log,
};

constexpr char kVersion[] = "tavo " TAVO_VERSION;

// The library calls ordinary steps errors, so a user sees its log only when asking for it: with --verbose, or with the
// preference that every program of the library takes.
void choose_log() {
    if (const char* preference = getenv("LOG_PREF")) {
        const std::string whole = preference;
        const MutedOutput muted;  // setting a preference prints what it found ...
        tavo_set_log_preference(nullptr, nullptr, nullptr);
        setenv("LOG_PREF", whole.c_str(), 1);  // ... and splits it in place
        return;
    }
    g_uiEnvValueRead = 1;  // the level below is to stay
    g_uiMxEnabledLogLevel = settings().verbose ? TAVO_LOG_INFO : 0;
    if (!settings().verbose) __android_log_set_minimum_priority(ANDROID_LOG_SILENT);
}

int run_guarded(const Run& run) {
    try {
        return run();
    } catch (const Misuse& misuse) {
        say(misuse.what());
        return kMisused;
    } catch (const std::exception& failure) {
        say(failure.what());
        return kFailed;
    }
}

int finish(int status) {
    if (fflush(stdout) != 0 || ferror(stdout) != 0) {
        say("standard output cannot be written to: " + std::string(strerror(errno)));
        if (status == kDone) status = kFailed;
    }
    // A call that was given up still runs, and must not meet objects that are being destroyed.
    if (calls_were_given_up()) {
        fflush(nullptr);
        _exit(status);
    }
    return status;
}

// What is wrong with the command line, and where to read how it should be.
std::string describe(const CLI::ParseError& error, const CLI::App& app, int argc, char** argv) {
    const CLI::App* chosen = &app;
    std::string name = "tavo";
    int next = 1;
    for (; !chosen->get_subcommands().empty(); ++next) {
        chosen = chosen->get_subcommands().front();
        name += " " + chosen->get_name();
    }
    const std::string more = " ('" + name + " --help' tells more)";
    // Of a word that is no subcommand, the parser only says that there is no subcommand.
    while (next < argc && argv[next][0] == '-') ++next;
    const bool lacks_subcommand = !chosen->get_subcommands(nullptr).empty();
    if (lacks_subcommand && next < argc) return name + " has no subcommand " + argv[next] + more;
    return error.what() + more;
}

int run_tavo(int argc, char** argv) {
    CLI::App app("Works with message queues, shared memory and semaphores of TAVO OSAL.", "tavo");
    app.require_subcommand(1);
    app.fallthrough();
    app.set_version_flag("--version", kVersion);
    app.add_flag("-v,--verbose", settings().verbose, "Show the library's log, up to level 3, on standard error");
    app.add_option("--color", settings().colour, "Colours: auto (on a terminal), always or never")
        ->check(CLI::IsMember({"auto", "always", "never"}));
    Run run;
    for (const auto add : kSubcommands) add(app, run);
    for (CLI::App* command : app.get_subcommands(nullptr)) command->fallthrough();

    try {
        app.parse(argc, argv);
    } catch (const CLI::Success& asked) {
        return finish(app.exit(asked));
    } catch (const CLI::ParseError& error) {
        say(describe(error, app, argc, argv));
        return kMisused;
    }
    choose_log();
    return finish(run_guarded(run));
}

}  // namespace
}  // namespace tavo::tool

int main(int argc, char** argv) {
    signal(SIGPIPE, SIG_IGN);  // failed writes are told by their calls
    try {
        return tavo::tool::run_tavo(argc, argv);
    } catch (const std::exception& failure) {
        fprintf(stderr, "tavo: %s\n", failure.what());
        return tavo::tool::kFailed;
    }
}

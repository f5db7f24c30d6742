// How subcommands are made and how they fail.
#pragma once

#include <CLI/CLI.hpp>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>

namespace tavo::tool {

enum ExitStatus { kDone = 0, kFailed = 1, kMisused = 2 };

// Something that was asked for could not be done. The text is one line that says what to do about it.
struct Failure : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// It was asked for in a way that cannot be meant.
struct Misuse : std::runtime_error {
    using std::runtime_error::runtime_error;
};

struct Settings {
    bool verbose = false;
    std::string colour = "auto";
};
Settings& settings();

// What the command line came to: the subcommand with its options, to be run when all of it has been parsed.
using Run = std::function<int()>;

// A subcommand whose options live as long as it does.
template <typename Options>
std::shared_ptr<Options> add_command(CLI::App& app, Run& run, const char* name, const char* text,
                                     int (*action)(const Options&), CLI::App*& command) {
    auto options = std::make_shared<Options>();
    command = app.add_subcommand(name, text);
    command->callback([&run, options, action] { run = [options, action] { return action(*options); }; });
    return options;
}

// One line on standard error.
void say(const std::string& line);

// One for each file of subcommands.
void add_serve(CLI::App& app, Run& run);
void add_send(CLI::App& app, Run& run);
void add_recv(CLI::App& app, Run& run);
void add_drop(CLI::App& app, Run& run);
void add_shm(CLI::App& app, Run& run);
void add_sem(CLI::App& app, Run& run);
void add_ping(CLI::App& app, Run& run);
void add_list(CLI::App& app, Run& run);
void add_top(CLI::App& app, Run& run);
void add_log(CLI::App& app, Run& run);
void add_doctor(CLI::App& app, Run& run);
void add_status(CLI::App& app, Run& run);

}  // namespace tavo::tool

// tavo doctor: looks for what keeps the library from working here.
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <nlohmann/json.hpp>

#include "tools/command.h"
#include "tools/doctor_checks.h"
#include "tools/terminal.h"

namespace tavo::tool {
namespace {

struct Options {
    bool json = false;
};

const char* name_of(Health health) {
    switch (health) {
        case Health::kGood: return "good";
        case Health::kNote: return "note";
        default: return "problem";
    }
}

void print_json(const Findings& findings) {
    auto list = nlohmann::json::array();
    for (const Finding& finding : findings) {
        nlohmann::json entry = {
            {"health", name_of(finding.health)}, {"subject", finding.subject}, {"finding", finding.finding}};
        if (!finding.advice.empty()) entry["advice"] = finding.advice;
        list.push_back(entry);
    }
    puts(list.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace).c_str());
}

void print_text(const Findings& findings) {
    const Style style(STDOUT_FILENO);
    for (const Finding& finding : findings) {
        char health[16];
        snprintf(health, sizeof health, "%-8s", name_of(finding.health));
        std::string coloured = health;
        switch (finding.health) {
            case Health::kGood: coloured = style.good(health); break;
            case Health::kNote: coloured = style.fair(health); break;
            default: coloured = style.bad(health);
        }
        printf("%s %s: %s\n", coloured.c_str(), style.strong(finding.subject).c_str(), finding.finding.c_str());
        if (!finding.advice.empty()) printf("         -> %s\n", finding.advice.c_str());
    }
}

int doctor(const Options& options) {
    Findings findings;
    check_storage_root(findings);
    check_service(findings);
    check_driver(findings);
    check_semaphores(findings);
    check_key_files(findings);
    check_limits(findings);
    if (options.json) {
        print_json(findings);
    } else {
        print_text(findings);
    }
    const bool ill = std::any_of(findings.begin(), findings.end(),
                                 [](const Finding& finding) { return finding.health == Health::kProblem; });
    return ill ? kFailed : kDone;
}

}  // namespace

void add_doctor(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options = add_command<Options>(
        app, run, "doctor", "Looks for what keeps queues, blocks and semaphores from working", doctor, command);
    command->add_flag("--json", options->json, "JSON instead of a text");
    command->footer("The exit status is 1 when something has to be done.");
}

}  // namespace tavo::tool

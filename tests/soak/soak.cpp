// Eight processes do random operations of every family and check all contents, while some of them are killed and
// restarted at random. Meant for the tests' sandbox: see './dev soak'.
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <random>

#include "soak/client.h"
#include "soak/coordinator.h"
#include "soak/processes.h"
#include "tavo_osal/init.h"

namespace {

int serve(const std::string& fault) {
    if (tavo_osal_init(25, 25) != TAVO_SUCCESS) return 2;
    if (fault == "crash-server") {
        sleep(2);
        abort();
    }
    for (;;) pause();
}

}  // namespace

int main(int argc, char** argv) {
    tavo::soak::Options options;
    tavo::soak::ClientArguments client;
    std::string role;
    options.seed = std::random_device()();
    CLI::App app("Random operations of every family in eight processes, some of which are killed at random.");
    app.add_option("minutes", options.minutes, "how long, fractions allowed")->check(CLI::Range(0.01, 100000.0));
    app.add_option("--seed", options.seed, "seed of all that is random; printed, to do the same again");
    app.add_option("--output", options.output, "directory for the report")->capture_default_str();
    app.add_option("--patience", options.patience, "seconds without progress that make a failure")
        ->capture_default_str();
    app.add_option("--grace", options.grace, "seconds for all to leave in the end")->capture_default_str();
    app.add_flag("--stop-at-failure", options.stop_at_failure, "end at the first failure");
    app.add_option("--break", options.fault)->group("");
    app.add_option("--role", role)->group("");
    app.add_option("--slot", client.slot)->group("");
    app.add_option("--incarnation", client.incarnation)->group("");
    CLI11_PARSE(app, argc, argv);

    if (!role.empty()) {
        tavo::soak::end_with_parent();
        // A terminal's interrupt is for the coordinator, which lets everybody leave in good order.
        signal(SIGINT, SIG_IGN);
        if (role == "server") return serve(options.fault);
        client.seed = options.seed;
        client.fault = options.fault;
        return tavo::soak::run_client(client);
    }
    mkdir(options.output.c_str(), 0777);
    return tavo::soak::Coordinator(options).run();
}

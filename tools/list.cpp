// tavo list: what the service has.
#include <unistd.h>

#include <cstdio>

#include "tools/command.h"
#include "tools/service.h"
#include "tools/terminal.h"

namespace tavo::tool {
namespace {

struct Options {
    bool json = false;
};

std::string or_unknown(int figure) { return figure >= 0 ? std::to_string(figure) : "?"; }

void print_queues(const ServiceFigures& figures, const Style& style) {
    if (!figures.has_queue_table) puts(style.bad("The service has no table of queues: start it anew.").c_str());
    if (figures.queues.empty()) {
        puts("no queues");
        return;
    }
    char line[128];
    snprintf(line, sizeof line, "%12s %8s %10s %10s %12s", "QUEUE", "USES", "PENDING", "CAPACITY", "DESCRIPTORS");
    puts(style.strong(line).c_str());
    for (const QueueFigures& queue : figures.queues) {
        const std::string ends = std::to_string(queue.read_end) + "," + std::to_string(queue.write_end);
        snprintf(line, sizeof line, "%12d %8u %10s %10s %12s", queue.key, queue.uses, or_unknown(queue.pending).c_str(),
                 or_unknown(queue.capacity).c_str(), ends.c_str());
        puts(line);
    }
}

void print_blocks(const ServiceFigures& figures, const Style& style) {
    if (!figures.has_block_list) puts(style.bad("The service has no list of blocks: start it anew.").c_str());
    if (figures.blocks.empty()) {
        puts("no shared-memory blocks");
        return;
    }
    char line[128];
    snprintf(line, sizeof line, "%12s %8s %10s %10s", "BLOCK", "USES", "SIZE", "REFERENCES");
    puts(style.strong(line).c_str());
    for (const BlockFigures& block : figures.blocks) {
        printf("%12d %8u %10d %10d\n", block.key, block.uses, block.size, block.references);
    }
}

int list(const Options& options) {
    const Binder service = find_service();
    if (options.json) {
        fputs(dump_of(service, {"--json"}).c_str(), stdout);
        return kDone;
    }
    const ServiceFigures figures = figures_of(service);
    const Style style(STDOUT_FILENO);
    printf("service android.tavo.osal, process %d\n", static_cast<int>(figures.process));
    print_queues(figures, style);
    print_blocks(figures, style);
    return kDone;
}

}  // namespace

void add_list(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options = add_command<Options>(app, run, "list", "Lists the service's queues and blocks", list, command);
    command->add_flag("--json", options->json, "The service's own JSON instead of a text");
}

}  // namespace tavo::tool

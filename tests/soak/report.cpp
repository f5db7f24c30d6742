#include "soak/report.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include "soak/coordinator.h"
#include "soak/operations.h"

namespace tavo::soak {
namespace {

template <typename... Values>
std::string formatted(const char* format, Values... values) {
    char text[500];
    snprintf(text, sizeof text, format, values...);
    return text;
}

unsigned long long wide(uint64_t value) { return value; }

const char* word_for(const Verdict& verdict) {
    if (!verdict.is_judged) return "not judged";
    return verdict.is_flat ? "flat" : "**grows**";
}

}  // namespace

std::string Report::result() const {
    const bool all_flat =
        std::all_of(run_.verdicts_.begin(), run_.verdicts_.end(), [](const Verdict& v) { return v.is_flat; });
    return formatted("%zu failures, %s", run_.failure_count_, all_flat ? "flat" : "not flat");
}

std::string Report::summary() const {
    const auto totals = run_.recorder_->totals();
    const double seconds = std::max(run_.recorder_->seconds(), 0.001);
    return formatted("seed %llu, %.1f s, %u clients, %u kills\n", wide(run_.options_.seed), run_.recorder_->seconds(),
                     kClients, run_.clients_->kills()) +
           formatted("%llu operations (%.0f a second), %llu messages received and checked (%.0f a second), %.1f MiB\n",
                     wide(totals.operations), static_cast<double>(totals.operations) / seconds, wide(totals.messages),
                     static_cast<double>(totals.messages) / seconds, static_cast<double>(totals.bytes) / 1048576.0) +
           result() + "\n";
}

std::string Report::page() const {
    std::string text =
        "# Soak\n\n" + summary() + "\n![Messages per second, descriptors and resident memory](report.svg)\n";
    text +=
        "\n## Is it flat?\n\nMedians of the second and of the last quarter of the time, for the processes that "
        "stay.\n\n| process | | second quarter | last quarter | most | |\n|---|---|---|---|---|---|\n";
    for (const Verdict& v : run_.verdicts_) {
        text += formatted("| %s | %s | %ld | %ld | %ld | %s |\n", v.process.c_str(), v.what.c_str(), v.second_quarter,
                          v.last_quarter, v.most, word_for(v));
    }
    const KillCosts& costs = run_.channels_->costs();
    text += "\n## What the kills cost\n\n| what | times |\n|---|---|\n";
    const std::pair<const char*, unsigned> rows[] = {
        {"a sender was killed in a put, and the message came", costs.in_doubt_and_came},
        {"a sender was killed in a put, and the message did not come", costs.in_doubt_and_missing},
        {"a sender was killed in a put, and a part of the message came", costs.torn},
        {"a receiver was killed with a message in hand, which is gone", costs.in_hand},
        {"a client was killed in a semaphore's turn, or waiting for it", run_.guards_->given_up()},
        {"of these: inside a write to the block", run_.guards_->half_written()},
    };
    for (const auto& [what, times] : rows) text += formatted("| %s | %u |\n", what, times);
    text += "\n## Operations\n\n| operation | times |\n|---|---|\n";
    for (unsigned i = 0; i < kOperationCount; ++i) {
        uint64_t count = 0;
        for (const Slot& slot : run_.board_->slots) count += slot.done[i];
        text += formatted("| %s | %llu |\n", kOperations[i].name, wide(count));
    }
    text += "\n## Clients\n\n| client | incarnations | messages received |\n|---|---|---|\n";
    for (unsigned i = 0; i < kClients; ++i) {
        const Slot& slot = run_.board_->slots[i];
        text += formatted("| %u%s | %u | %llu |\n", i, i < kSteadyClients ? ", never killed" : "",
                          static_cast<unsigned>(slot.incarnation), wide(slot.messages));
    }
    if (!run_.failures_.empty()) text += "\n## Failures\n\n";
    for (const std::string& failure : run_.failures_) text += "- " + failure + "\n";
    return text;
}

}  // namespace tavo::soak

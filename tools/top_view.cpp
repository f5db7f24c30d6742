#include "tools/top_view.h"

#include <algorithm>
#include <cstdio>
#include <nlohmann/json.hpp>
#include <optional>

#include "tools/numbers.h"
#include "tools/service.h"

namespace tavo::tool {
namespace {

constexpr int kBarWidth = 20;
constexpr double kHigh = 0.5;
constexpr double kVeryHigh = 0.9;

// Bytes a second by which what waits in a queue grew; nothing where one of the looks did not see it.
std::optional<double> change_of(const QueueFigures& queue, const Look& look, const Look* previous) {
    const QueueFigures* before = previous != nullptr ? find_queue(previous->figures, queue.key) : nullptr;
    if (before == nullptr || before->pending < 0 || queue.pending < 0) return std::nullopt;
    const double seconds = std::chrono::duration<double>(look.when - previous->when).count();
    if (seconds <= 0) return std::nullopt;
    return (queue.pending - before->pending) / seconds;
}

std::string text_of(const std::optional<double>& change) {
    if (!change) return "-";
    return (*change > 0 ? "+" : "") + short_number(*change);
}

std::string bar_of(const QueueFigures& queue, const Style& style) {
    if (queue.pending < 0 || queue.capacity <= 0) return "?";
    const double share = std::min(1.0, static_cast<double>(queue.pending) / queue.capacity);
    // Nothing but an empty pipe looks like one.
    const int marks = queue.pending > 0 ? std::max(1, static_cast<int>(share * kBarWidth)) : 0;
    std::string bar(static_cast<size_t>(marks), '#');
    if (share >= kVeryHigh) {
        bar = style.bad(bar);
    } else if (marks > 0) {
        bar = share >= kHigh ? style.fair(bar) : style.good(bar);
    }
    char percent[16];
    snprintf(percent, sizeof percent, " %3.0f%%", share * 100);
    return "[" + bar + std::string(static_cast<size_t>(kBarWidth - marks), '.') + "]" + percent;
}

}  // namespace

std::string show_look(const Look& look, const Look* previous, const Style& style) {
    const ServiceFigures& figures = look.figures;
    char line[160];
    std::string text = "service android.tavo.osal, process " + std::to_string(figures.process) + "\n";
    snprintf(line, sizeof line, "%12s %8s %10s %10s %10s  %s", "QUEUE", "USES", "PENDING", "CAPACITY", "CHANGE/S",
             "FULL");
    text += figures.queues.empty() ? "no queues\n" : style.strong(line) + "\n";
    for (const QueueFigures& queue : figures.queues) {
        snprintf(line, sizeof line, "%12d %8u %10s %10s %10s  ", queue.key, queue.uses,
                 queue.pending >= 0 ? short_number(queue.pending).c_str() : "?",
                 queue.capacity >= 0 ? short_number(queue.capacity).c_str() : "?",
                 text_of(change_of(queue, look, previous)).c_str());
        text += line + bar_of(queue, style) + "\n";
    }
    snprintf(line, sizeof line, "%12s %8s %10s %10s", "BLOCK", "USES", "SIZE", "REFERENCES");
    text += figures.blocks.empty() ? "no shared-memory blocks\n" : style.strong(line) + "\n";
    for (const BlockFigures& block : figures.blocks) {
        snprintf(line, sizeof line, "%12d %8u %10s %10d\n", block.key, block.uses, short_number(block.size).c_str(),
                 block.references);
        text += line;
    }
    return text;
}

std::string look_as_json(const std::string& service_json, const Look& look, const Look* previous) {
    auto json = nlohmann::json::parse(service_json);
    for (auto& queue : json["queues"]) {
        const QueueFigures* figures = find_queue(look.figures, queue["key"]);
        const auto change = figures != nullptr ? change_of(*figures, look, previous) : std::nullopt;
        queue["change"] = change ? nlohmann::json(*change) : nlohmann::json();
    }
    return json.dump() + "\n";
}

}  // namespace tavo::tool

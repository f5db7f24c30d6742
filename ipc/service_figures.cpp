#include "ipc/service_figures.h"

#include <algorithm>
#include <cinttypes>
#include <cstdarg>
#include <cstdio>

#include "ipc/service_location.h"
#include "tavo_osal/export.h"

namespace tavo {
namespace {

// Unknown figures count as nothing.
struct Totals {
    explicit Totals(const ServiceFigures& figures) {
        for (const QueueFigures& queue : figures.queues) {
            queue_uses += queue.uses;
            capacity += std::max(queue.capacity, 0);
            pending += std::max(queue.pending, 0);
        }
        for (const BlockFigures& block : figures.blocks) {
            block_uses += block.uses;
            size += block.size;
        }
    }
    uint64_t queue_uses = 0, block_uses = 0;
    int64_t capacity = 0, pending = 0, size = 0;
};

class Writer {
public:
    void add(const char* format, ...) TAVO_PRINTF(2, 3) {
        char piece[256];
        va_list values;
        va_start(values, format);
        vsnprintf(piece, sizeof piece, format, values);
        va_end(values);
        text_ += piece;
    }
    std::string take() { return std::move(text_); }

private:
    std::string text_;
};

// A figure that may be unknown, as text or as JSON.
struct Figure {
    Figure(int value, const char* unknown) {
        if (value >= 0) {
            snprintf(text, sizeof text, "%d", value);
        } else {
            snprintf(text, sizeof text, "%s", unknown);
        }
    }
    char text[16];
};

const char* comma_before(size_t index) { return index == 0 ? "" : ","; }

}  // namespace

std::string to_text(const ServiceFigures& figures) {
    const Totals totals(figures);
    Writer out;
    out.add("service %s, process %d\n", kServiceName, static_cast<int>(figures.process));
    if (!figures.has_queue_table) out.add("no table of message queues: the service could not be initialised\n");
    out.add("message queues: %zu, room for %" PRIu32 ", uses: %" PRIu64 ", bytes pending: %" PRId64 " of %" PRId64 "\n",
            figures.queues.size(), figures.queue_room, totals.queue_uses, totals.pending, totals.capacity);
    if (!figures.queues.empty()) {
        out.add("%12s %10s %10s %10s %10s %10s\n", "key", "uses", "read end", "write end", "capacity", "pending");
    }
    for (const QueueFigures& queue : figures.queues) {
        out.add("%12d %10" PRIu32 " %10d %10d %10s %10s\n", queue.key, queue.uses, queue.read_end, queue.write_end,
                Figure(queue.capacity, "?").text, Figure(queue.pending, "?").text);
    }
    if (!figures.has_block_list) out.add("no list of shared-memory blocks: the service could not be initialised\n");
    out.add("shared-memory blocks: %zu, limit %" PRIu32 ", uses: %" PRIu64 ", bytes: %" PRId64 "\n",
            figures.blocks.size(), figures.block_limit, totals.block_uses, totals.size);
    if (!figures.blocks.empty()) out.add("%12s %10s %10s %10s\n", "key", "uses", "size", "references");
    for (const BlockFigures& block : figures.blocks) {
        out.add("%12d %10" PRIu32 " %10d %10" PRId32 "\n", block.key, block.uses, block.size, block.references);
    }
    return out.take();
}

std::string to_json(const ServiceFigures& figures) {
    const Totals totals(figures);
    Writer out;
    out.add("{\"service\":\"%s\",\"process\":%d,\"queue_table\":%s,\"queue_room\":%" PRIu32 ",\"queues\":[",
            kServiceName, static_cast<int>(figures.process), figures.has_queue_table ? "true" : "false",
            figures.queue_room);
    for (size_t i = 0; i < figures.queues.size(); ++i) {
        const QueueFigures& queue = figures.queues[i];
        out.add("%s{\"key\":%d,\"uses\":%" PRIu32 ",\"read_end\":%d,\"write_end\":%d,\"capacity\":%s,\"pending\":%s}",
                comma_before(i), queue.key, queue.uses, queue.read_end, queue.write_end,
                Figure(queue.capacity, "null").text, Figure(queue.pending, "null").text);
    }
    out.add("],\"block_list\":%s,\"block_limit\":%" PRIu32 ",\"blocks\":[", figures.has_block_list ? "true" : "false",
            figures.block_limit);
    for (size_t i = 0; i < figures.blocks.size(); ++i) {
        const BlockFigures& block = figures.blocks[i];
        out.add("%s{\"key\":%d,\"uses\":%" PRIu32 ",\"size\":%d,\"references\":%" PRId32 "}", comma_before(i),
                block.key, block.uses, block.size, block.references);
    }
    out.add("],\"totals\":{\"queues\":%zu,\"queue_uses\":%" PRIu64 ",\"capacity\":%" PRId64 ",\"pending\":%" PRId64
            ",\"blocks\":%zu,\"block_uses\":%" PRIu64 ",\"size\":%" PRId64 "}}\n",
            figures.queues.size(), totals.queue_uses, totals.capacity, totals.pending, figures.blocks.size(),
            totals.block_uses, totals.size);
    return out.take();
}

}  // namespace tavo

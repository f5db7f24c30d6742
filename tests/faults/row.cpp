#include "faults/row.h"

#include <iterator>
#include <utility>

namespace tavo::test::faults {

Outcome Outcome::keeping_blocks(long count, const char* why) const {
    Outcome outcome = *this;
    outcome.blocks = count;
    outcome.reason = why;
    return outcome;
}

Outcome Outcome::keeping_at_most(long count, const char* why) const {
    Outcome outcome = keeping_blocks(count, why);
    outcome.at_most = true;
    return outcome;
}

Outcome Outcome::keeping_mappings(long count, const char* why) const {
    Outcome outcome = *this;
    outcome.mappings = count;
    outcome.reason = why;
    return outcome;
}

Outcome Outcome::keeping_uses(const char* why) const {
    Outcome outcome = *this;
    outcome.uses = true;
    outcome.reason = why;
    return outcome;
}

Outcome Outcome::ever_after(const char* why) const {
    Outcome outcome = *this;
    outcome.for_good = true;
    outcome.reason = why;
    return outcome;
}

Outcome same() { return {}; }

Outcome same_but(std::vector<Line> lines) {
    Outcome outcome;
    outcome.lines = std::move(lines);
    return outcome;
}

Outcome fails(long result, std::vector<Line> lines) {
    Outcome outcome;
    outcome.way = Outcome::kFails;
    outcome.result = result;
    outcome.lines = std::move(lines);
    return outcome;
}

Outcome ends(const char* reason) {
    Outcome outcome;
    outcome.way = Outcome::kEnds;
    outcome.reason = reason;
    return outcome;
}

Expectation on(std::vector<const char*> calls, std::vector<Outcome> outcomes, int nth) {
    return {std::move(calls), nth, std::move(outcomes), nullptr, 0};
}

Expectation on_error(const char* call, int error, std::vector<Outcome> outcomes) {
    return {{call}, 0, std::move(outcomes), nullptr, error};
}

Expectation skip(std::vector<const char*> calls, const char* reason) { return {std::move(calls), 0, {}, reason, 0}; }

const std::vector<Row>& rows() {
    static const std::vector<Row>& all = *new std::vector<Row>([] {
        std::vector<Row> every;
        for (auto* family : {log_rows, memory_rows, string_rows, file_rows, process_rows, thread_rows, lock_rows,
                             timer_rows, socket_rows, queue_object_rows, queue_rows, block_rows, ipc_semaphore_rows,
                             service_rows, binder_rows, data_rows}) {
            std::vector<Row> some = family();
            every.insert(every.end(), std::make_move_iterator(some.begin()), std::make_move_iterator(some.end()));
        }
        return every;
    }());
    return all;
}

}  // namespace tavo::test::faults

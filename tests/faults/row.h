// What the matrix is made of: a row for every exported name, and what each does when a platform call under it fails.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace tavo::test::faults {

struct Line {
    uint32_t level;
    const char* tag;
    std::string text;  // '*' stands for anything
};

// One way for a call to end.
struct Outcome {
    enum Way { kSame, kFails, kEnds };
    Way way = kSame;
    long result = 0;
    std::vector<Line> lines;  // beside lines of the fault-free call's
    bool ends_lines = false;  // none of those
    // What is kept all the same, and why. Null: nothing.
    const char* reason = nullptr;
    long blocks = 0, mappings = 0;
    bool at_most = false;   // so many blocks, or fewer
    bool uses = false;      // of the service's
    bool for_good = false;  // the process cannot do it any more

    Outcome keeping_blocks(long count, const char* why) const;
    Outcome keeping_at_most(long blocks, const char* why) const;
    Outcome keeping_mappings(long count, const char* why) const;
    Outcome keeping_uses(const char* why) const;
    Outcome ever_after(const char* why) const;
};

// As if nothing had happened: the same result, and the same lines in the log.
Outcome same();
// The same result, but the log tells.
Outcome same_but(std::vector<Line> lines);
// This result, these lines in the log, and of others only such as the fault-free call has.
Outcome fails(long result, std::vector<Line> lines = {});
// Ends the process, as documented.
Outcome ends(const char* reason);

struct Expectation {
    std::vector<const char*> calls;  // by name; empty for every call that no other expectation names
    int nth;                         // 0: each
    std::vector<Outcome> outcomes;   // any of these
    const char* skipped = nullptr;   // why the calls are not made to fail here
    int error = 0;                   // only this one
};
Expectation on(std::vector<const char*> calls, std::vector<Outcome> outcomes, int nth = 0);
Expectation on_error(const char* call, int error, std::vector<Outcome> outcomes);
Expectation skip(std::vector<const char*> calls, const char* reason);

enum class Side { kClient, kService };

// A working sequence. It is gone through once with the fault and twice without, each time in whole.
struct Scenario {
    const char* name = "";
    void (*prepare)() = nullptr;
    long (*call)() = nullptr;
    void (*undo)(long result) = nullptr;  // gives back what prepare and call took
    std::vector<Expectation> expectations;
    bool service = false;       // there is one, in another process
    Side side = Side::kClient;  // whose calls fail
    bool every_thread = false;  // not only the caller's
    bool children = false;      // the function's own child processes', too
};

struct Row {
    const char* symbol;                 // as in tests/interface/exported_symbols.txt
    std::vector<Scenario> scenarios;    // empty: a name that is no function
    const char* no_function = nullptr;  // what it is then
};

// One per family of rows.
std::vector<Row> log_rows();
std::vector<Row> memory_rows();
std::vector<Row> string_rows();
std::vector<Row> file_rows();
std::vector<Row> process_rows();
std::vector<Row> thread_rows();
std::vector<Row> lock_rows();
std::vector<Row> timer_rows();
std::vector<Row> socket_rows();
std::vector<Row> queue_object_rows();
std::vector<Row> queue_rows();
std::vector<Row> block_rows();
std::vector<Row> ipc_semaphore_rows();
std::vector<Row> service_rows();
std::vector<Row> binder_rows();
std::vector<Row> data_rows();

const std::vector<Row>& rows();

}  // namespace tavo::test::faults

// What a peer is to the runner, whatever it does: it sets something up, does operations in one process or two, and
// tells what went through.
#pragma once

#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace tavo::peers {

// Where standard error was before the first call, which turns that to /dev/null: the platform's log goes there, too,
// and says much about every attachment.
int console();

// Also in processes that are measured, which must not run what the runner registered for its own end.
[[noreturn]] inline void fail(const char* what, const char* why) {
    dprintf(console(), "%s: %s\n", what, why);
    quick_exit(1);
}
[[noreturn]] inline void fail(const char* what) { fail(what, strerror(errno)); }

// What went in one direction. The checksum depends on the order.
struct Flow {
    uint64_t count = 0;
    uint64_t checksum = 0;

    void add(uint64_t value) {
        ++count;
        checksum = (checksum << 7 | checksum >> 57) ^ value;
    }
};

inline bool operator==(const Flow& a, const Flow& b) { return a.count == b.count && a.checksum == b.checksum; }

// Since the beginning, not since the last round.
struct Tally {
    Flow out;
    Flow in;
};

// What one process does in a contest.
class Party {
public:
    Party() = default;
    virtual ~Party() = default;
    Party(const Party&) = delete;
    Party& operator=(const Party&) = delete;

    virtual void run(size_t operations) = 0;
    // Asked for after each run, and not timed. Waits for what is still under way.
    virtual Tally tally() = 0;
};

// What the processes of a contest stand on: set up before they are started, and torn down by its destructor when they
// have ended.
class Setting {
public:
    Setting() = default;
    virtual ~Setting() = default;
    Setting(const Setting&) = delete;
    Setting& operator=(const Setting&) = delete;

    // Each is called in the process that it is for. The driver is the one that is timed.
    virtual std::unique_ptr<Party> driver() = 0;
    // Called where has_partner() says that there is one.
    virtual std::unique_ptr<Party> partner() { return nullptr; }
    virtual bool has_partner() const { return true; }
};

enum class Role { limit, ours, peer };

struct Peer {
    std::string name;
    Role role;
    std::function<std::unique_ptr<Setting>()> set_up;
    std::string impossible = {};  // why it cannot take part
};

// Peers that do the same thing. One of them is the bare limit, and one is this library.
struct Contest {
    std::string family;
    std::string operation;
    std::optional<size_t> size;  // bytes, where the operation has any
    int cpus;                    // 2: the second process, or thread, has a CPU of its own
    std::vector<Peer> peers;
};

// One CPU to work on for each of the two sides; the same one twice in contests on one.
struct Places {
    int first;
    int second;
};
Places places(int cpus);

std::vector<Contest> queue_contests();
std::vector<Contest> call_contests();
std::vector<Contest> log_contests();
std::vector<Contest> lock_contests();

}  // namespace tavo::peers

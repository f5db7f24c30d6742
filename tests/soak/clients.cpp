#include "soak/clients.h"

#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

#include "soak/failure.h"
#include "soak/operations.h"

namespace tavo::soak {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kMostAim(30);

std::string stands_at(const Slot& slot) {
    if (slot.stage == Stage::kStarting) return "start";
    if (slot.stage != Stage::kRunning) return "leaving";
    return kOperations[slot.operation % kOperationCount].name;
}

}  // namespace

Clients::Clients(Board& board, const Options& options, int board_fd, int failure_fd, Report report)
    : board_(board),
      options_(options),
      board_fd_(board_fd),
      failure_fd_(failure_fd),
      report_(std::move(report)),
      random_(options.seed) {}

std::string Clients::name_of(unsigned slot) const {
    return "client " + std::to_string(slot) + "." + std::to_string(board_.slots[slot].incarnation);
}

void Clients::start(unsigned slot) {
    Slot& shared = board_.slots[slot];
    shared.incarnation = shared.incarnation + 1;
    shared.stage = Stage::kStarting;
    Client& client = clients_[slot];
    client = {};
    client.progressed = Clock::now();
    client.operations = shared.operations;
    std::vector<std::string> arguments = {"--role",        "client",
                                          "--slot",        std::to_string(slot),
                                          "--incarnation", std::to_string(shared.incarnation),
                                          "--seed",        std::to_string(options_.seed)};
    if (!options_.fault.empty() && slot == 0) arguments.insert(arguments.end(), {"--break", options_.fault});
    client.process =
        ChildProcess(arguments, board_fd_, failure_fd_, options_.output + "/client-" + std::to_string(slot) + ".log");
}

void Clients::start_missing(Channels& channels) {
    bool is_there[kClients];
    for (unsigned i = 0; i < kClients; ++i) {
        const Client& client = clients_[i];
        const bool may_start = Clock::now() >= client.restart && channels.are_closed_for(i);
        if (!client.process.is_running() && may_start) start(i);
        is_there[i] = client.process.is_running();
    }
    channels.open_for(is_there);
}

// Files that no operation of the killed client's is going to remove.
void Clients::remove_files_of(unsigned slot) const {
    const uint32_t incarnation = board_.slots[slot].incarnation;
    const std::string root = TAVO_STORAGE_ROOT "/";
    const std::string own = root + "soak-" + std::to_string(slot) + "." + std::to_string(incarnation) + "-";
    for (const char* leaf : {"file", "made", "socket"}) unlink((own + leaf).c_str());
    for (uint32_t i = 0; i < kOwnKeys; ++i) unlink((root + std::to_string(own_key(slot, incarnation, i))).c_str());
}

void Clients::reap(Channels& channels, Guards& guards) {
    std::string how;
    for (unsigned i = 0; i < kClients; ++i) {
        Client& client = clients_[i];
        if (!client.process.has_ended(how)) continue;
        const Slot& shared = board_.slots[i];
        client.ended_in_order = shared.stage == Stage::kGone && how == "exit status 0";
        client.restart = Clock::now() + milliseconds(random_.below(300));
        if (client.ended_in_order) continue;
        if (!client.was_killed) {
            report_(name_of(i) + ", " + stands_at(shared) + ": " + how + ", see client-" + std::to_string(i) + ".log");
        }
        channels.account_for_death(i);
        guards.account_for_death(i);
        remove_files_of(i);
    }
}

// Most moments are in no step that a kill could tear: half of the kills wait a little for one of some kind.
void Clients::await_step(unsigned slot) {
    const Slot& victim = board_.slots[slot];
    const auto is_putting = [&](const Channel& channel) {
        const auto& links = channel.links[slot];
        return std::any_of(links, links + kLinksOfASender,
                           [](const Link& link) { return link.state == LinkState::kUsed && link.intent != link.done; });
    };
    const auto is_writing = [&](unsigned guard) {
        return victim.at_guard[guard] && board_.guards[guard].intent != board_.guards[guard].done;
    };
    const unsigned kind = random_.below(4);
    const auto is_in_one = [&] {
        if (kind == 0) return is_putting(board_.channels[random_.below(kInboxes)]);
        if (kind == 1) return is_putting(board_.channels[stream_of(slot)]);
        const unsigned guard = random_.below(kGuards);
        return kind == 2 ? is_writing(guard) : victim.at_guard[guard].load();
    };
    const auto deadline = Clock::now() + kMostAim;
    while (!is_in_one() && Clock::now() < deadline) {
    }
}

void Clients::kill_one() {
    if (Clock::now() < next_kill_) return;
    next_kill_ = Clock::now() + milliseconds(random_.between(100, 1500));
    const unsigned slot = random_.between(kSteadyClients, kClients - 1);
    Client& client = clients_[slot];
    if (!client.process.is_running() || client.was_killed) return;
    client.was_killed = true;
    if (random_.one_in(2)) await_step(slot);
    client.process.kill(SIGKILL);
    ++kills_;
}

void Clients::end_for(unsigned slot, const std::string& reason) {
    Client& client = clients_[slot];
    report_(name_of(slot) + " (pid " + std::to_string(client.process.pid()) + "), " + stands_at(board_.slots[slot]) +
            ": " + reason);
    client.was_killed = true;
    client.process.kill(SIGKILL);
}

void Clients::watch_progress() {
    for (unsigned i = 0; i < kClients; ++i) {
        Client& client = clients_[i];
        if (!client.process.is_running() || client.was_killed) continue;
        if (client.operations != board_.slots[i].operations) {
            client.operations = board_.slots[i].operations;
            client.progressed = Clock::now();
        } else if (Clock::now() > client.progressed + std::chrono::seconds(options_.patience)) {
            end_for(i, "no progress for " + std::to_string(options_.patience) + " s");
        }
    }
}

bool Clients::are_all_quiet() const {
    for (unsigned i = 0; i < kClients; ++i) {
        const bool is_quiet = !clients_[i].was_killed && board_.slots[i].stage == Stage::kQuiet;
        if (clients_[i].process.is_running() && !is_quiet) return false;
    }
    return true;
}

bool Clients::are_all_gone() const {
    return std::none_of(clients_.begin(), clients_.end(), [](const Client& c) { return c.process.is_running(); });
}

void Clients::end_stragglers() {
    for (unsigned i = 0; i < kClients; ++i) {
        if (clients_[i].process.is_running()) {
            end_for(i, "did not leave within " + std::to_string(options_.grace) + " s");
        }
    }
}

bool Clients::have_own_key(uint32_t key, const char* what) const {
    const unsigned slot = slot_of_key(key);
    if (slot >= kClients || incarnation_of_key(key) != board_.slots[slot].incarnation) return false;
    if (clients_[slot].ended_in_order) fail(name_of(slot) + " ended and left a use of a " + what);
    return clients_[slot].process.is_running();
}

}  // namespace tavo::soak

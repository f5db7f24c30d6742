// Every peer has one process or two of its own, so that the threads and memory of one do not burden another. They wait
// for orders; the runner itself does nothing while a peer is timed.
//
// All peers are measured in every round, one after the other, and each round begins with another one. So a drift of the
// machine's speed meets all of them, and what counts is the ratio to the bare limit within a round. The processes are
// started anew several times, because where memory happens to lie makes one faster than the next.
#include "runner.h"

#include <fcntl.h>
#include <poll.h>

#include <algorithm>
#include <chrono>
#include <thread>

#include "bench/cpus.h"
#include "child.h"

namespace tavo::peers {
namespace {

using std::chrono::steady_clock;

constexpr int kPatienceSeconds = 120;

struct Report {
    double nanoseconds;
    Tally tally;
};

// A process that carries orders out. An order is a number of operations; none means the end.
class Worker {
public:
    template <typename Make>
    Worker(int cpu, const std::string& name, Make make) : name_(name) {
        if (pipe(orders_) != 0 || pipe(reports_) != 0) fail("pipe");
        child_.emplace([&] {
            bench::run_on(cpu);
            const std::unique_ptr<Party> party = make();
            work(*party);
        });
    }
    ~Worker() {
        order(0);
        for (int i = 0; i < 500 && !child_->ended(); ++i) std::this_thread::sleep_for(std::chrono::milliseconds(10));
        child_.reset();
        for (const auto& ends : {orders_, reports_}) {
            close(ends[0]);
            close(ends[1]);
        }
    }
    Worker(const Worker&) = delete;
    Worker& operator=(const Worker&) = delete;

    void order(size_t operations) {
        if (write(orders_[1], &operations, sizeof operations) != sizeof operations) fail("write");
    }

    Report report() {
        for (int second = 0; second < kPatienceSeconds; ++second) {
            pollfd slot = {reports_[0], POLLIN, 0};
            if (poll(&slot, 1, 1000) > 0) {
                Report report;
                if (read(reports_[0], &report, sizeof report) != sizeof report) fail("read");
                return report;
            }
            if (child_->ended()) give_up("it has ended");
        }
        give_up("it hangs");
    }

    [[noreturn]] void give_up(const char* why) const { fail(name_.c_str(), why); }

private:
    void work(Party& party) {
        size_t operations = 0;
        while (read(orders_[0], &operations, sizeof operations) == sizeof operations && operations > 0) {
            const auto start = steady_clock::now();
            party.run(operations);
            const std::chrono::duration<double, std::nano> spent = steady_clock::now() - start;
            const Report report{spent.count(), party.tally()};
            if (write(reports_[1], &report, sizeof report) != sizeof report) fail("write");
        }
    }

    const std::string name_;
    int orders_[2];
    int reports_[2];
    std::optional<Child> child_;
};

// One peer, taking part.
class Contestant {
public:
    Contestant(const Peer& peer, const Places& places) : setting_(peer.set_up()) {
        if (setting_->has_partner()) {
            partner_.emplace(places.second, peer.name + "'s partner", [this] { return setting_->partner(); });
        }
        driver_.emplace(places.first, peer.name, [this] { return setting_->driver(); });
    }
    ~Contestant() {
        // The setting goes last: they stand on it.
        driver_.reset();
        partner_.reset();
    }
    Contestant(const Contestant&) = delete;
    Contestant& operator=(const Contestant&) = delete;

    size_t operations() const { return operations_; }

    // As many operations as fill a round; also warms up. Several tries, as one may be held up by another program.
    void calibrate(double nanoseconds) {
        for (operations_ = 1;; operations_ *= 2) {
            const double best = std::min({round(), round(), round()});
            if (best * static_cast<double>(operations_) >= nanoseconds) return;
        }
    }

    // Nanoseconds for each operation.
    double round() {
        if (partner_) partner_->order(operations_);
        driver_->order(operations_);
        const Report mine = driver_->report();
        const Tally other = partner_ ? partner_->report().tally : mine.tally;
        if (!(mine.tally.out == other.in) || !(mine.tally.in == other.out)) {
            driver_->give_up("it has lost, added or changed something");
        }
        return mine.nanoseconds / static_cast<double>(operations_);
    }

private:
    const std::unique_ptr<Setting> setting_;
    std::optional<Worker> partner_;
    std::optional<Worker> driver_;
    size_t operations_ = 0;
};

// The median between the quartiles.
nlohmann::json spread(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    const auto at = [&values](size_t quarter) { return values[(values.size() - 1) * quarter / 4]; };
    return {{"low", at(1)}, {"median", at(2)}, {"high", at(3)}};
}

std::vector<double> ratios(const std::vector<double>& times, const std::vector<double>& to) {
    std::vector<double> result;
    for (size_t i = 0; i < times.size(); ++i) result.push_back(times[i] / to[i]);
    return result;
}

// The part of the rounds in which these times were the shorter ones.
double share_of_wins(const std::vector<double>& times, const std::vector<double>& to) {
    size_t wins = 0;
    for (size_t i = 0; i < times.size(); ++i) wins += times[i] < to[i] ? 1 : 0;
    return static_cast<double>(wins) / static_cast<double>(times.size());
}

nlohmann::json record(const Peer& peer) {
    static constexpr const char* kRoles[] = {"limit", "ours", "peer"};
    return {{"name", peer.name}, {"role", kRoles[static_cast<size_t>(peer.role)]}};
}

}  // namespace

int console() {
    static const int kept = [] {
        const int copy = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
        // Not by freopen(), which would have the platform's log written in large pieces.
        const int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
        if (copy < 0 || null < 0 || dup2(null, STDERR_FILENO) < 0) exit(1);
        close(null);
        return copy;
    }();
    return kept;
}

Places places(int cpus) {
    static const bench::Cpus usable;
    return {usable.first, cpus == 1 ? usable.first : usable.last};
}

nlohmann::json run(const Contest& contest, const Plan& plan) {
    std::vector<const Peer*> able;
    for (const Peer& peer : contest.peers) {
        if (peer.impossible.empty()) able.push_back(&peer);
    }
    std::vector<std::vector<double>> times(able.size());
    std::vector<size_t> operations(able.size());
    for (size_t start = 0; start < plan.starts; ++start) {
        std::vector<std::unique_ptr<Contestant>> contestants;
        for (size_t i = 0; i < able.size(); ++i) {
            contestants.push_back(std::make_unique<Contestant>(*able[i], places(contest.cpus)));
            contestants[i]->calibrate(plan.round_milliseconds * 1e6);
        }
        for (size_t round = 0; round < plan.rounds; ++round) {
            for (size_t i = 0; i < able.size(); ++i) {
                const size_t turn = (round + i) % able.size();
                times[turn].push_back(contestants[turn]->round());
                operations[turn] += contestants[turn]->operations();
            }
        }
    }

    const auto times_of = [&](Role role) {
        const auto found =
            std::find_if(able.begin(), able.end(), [role](const Peer* one) { return one->role == role; });
        return times[static_cast<size_t>(found - able.begin())];
    };
    nlohmann::json peers = nlohmann::json::array();
    for (const Peer& peer : contest.peers) {
        if (!peer.impossible.empty()) {
            peers.push_back(record(peer));
            peers.back()["impossible"] = peer.impossible;
        }
    }
    for (size_t i = 0; i < able.size(); ++i) {
        peers.push_back(record(*able[i]));
        peers.back()["operations"] = operations[i];
        peers.back()["nanoseconds"] = spread(times[i]);
        peers.back()["to_limit"] = spread(ratios(times[i], times_of(Role::limit)));
        peers.back()["to_ours"] = spread(ratios(times[i], times_of(Role::ours)));
        peers.back()["ahead_of_ours"] = share_of_wins(times[i], times_of(Role::ours));
    }
    nlohmann::json result = {
        {"family", contest.family}, {"operation", contest.operation}, {"cpus", contest.cpus}, {"peers", peers}};
    if (contest.size) result["size"] = *contest.size;
    return result;
}

}  // namespace tavo::peers

#include "soak/coordinator.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <thread>

#include "soak/failure.h"
#include "soak/operations.h"
#include "soak/report.h"
#include "soak/service_uses.h"

namespace tavo::soak {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kStep(10), kMostAim(30);
constexpr size_t kMostFailuresShown = 100;
constexpr int kReportSeconds = 3;

volatile sig_atomic_t g_stop = 0;

// Away from the numbers that children have them under.
int moved_up(int fd) {
    const int moved = fcntl(fd, F_DUPFD_CLOEXEC, 100);
    close(fd);
    return moved;
}

Board* make_board(int& fd) {
    fd = moved_up(memfd_create("soak", MFD_CLOEXEC));
    if (fd < 0 || ftruncate(fd, sizeof(Board)) != 0) return nullptr;
    void* memory = mmap(nullptr, sizeof(Board), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    return memory != MAP_FAILED ? static_cast<Board*>(memory) : nullptr;
}

bool is_sanitized() {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    return true;
#else
    return false;
#endif
}

std::string text_of(unsigned slot, const Slot& shared) {
    return "client " + std::to_string(slot) + "." + std::to_string(shared.incarnation);
}

std::string stands_at(const Slot& slot) {
    if (slot.stage == Stage::kStarting) return "start";
    if (slot.stage != Stage::kRunning) return "leaving";
    return kOperations[slot.operation % kOperationCount].name;
}

// Whatever hangs, this process included, there is an end. The children end with it.
void end_at(Clock::time_point last) {
    std::thread([last] {
        std::this_thread::sleep_until(last);
        static const char kText[] = "FAILURE: the coordinator does not come to its end\n";
        [[maybe_unused]] const ssize_t written = write(STDOUT_FILENO, kText, sizeof kText - 1);
        _exit(1);
    }).detach();
}

}  // namespace

Coordinator::Coordinator(const Options& options)
    : options_(options), random_(options.seed), board_(make_board(board_fd_)) {
    int ends[2] = {-1, -1};
    if (pipe2(ends, O_CLOEXEC | O_NONBLOCK) != 0) perror("pipe2");
    failures_in_ = moved_up(ends[0]);
    failures_out_ = moved_up(ends[1]);
    dup3(failures_out_, kFailureFd, O_CLOEXEC);
    samples_file_.open(options.output + "/samples.csv");
    rates_file_.open(options.output + "/rates.csv");
    samples_file_ << "seconds,process,incarnation,descriptors,resident_kib,threads,mappings\n";
    rates_file_ << "seconds,messages_per_second,operations_per_second,kills\n";
}

double Coordinator::seconds() const { return std::chrono::duration<double>(Clock::now() - start_).count(); }

Coordinator::Totals Coordinator::totals() const {
    Totals totals;
    for (const Slot& slot : board_->slots) {
        totals.messages += slot.messages;
        totals.bytes += slot.bytes;
        for (const auto& count : slot.done) totals.operations += count;
    }
    return totals;
}

void Coordinator::report_failure(const std::string& line) {
    ++failure_count_;
    if (failure_count_ > kMostFailuresShown) return;
    const std::string text = "seed " + std::to_string(options_.seed) + ": " + line;
    failures_.push_back(text);
    printf("FAILURE: %s\n", text.c_str());
    fflush(stdout);
}

void Coordinator::read_failures() {
    char piece[4096];
    for (ssize_t count = 1; count > 0;) {
        count = read(failures_in_, piece, sizeof piece);
        if (count > 0) unread_failures_.append(piece, static_cast<size_t>(count));
    }
    for (size_t end; (end = unread_failures_.find('\n')) != std::string::npos;) {
        report_failure(unread_failures_.substr(0, end));
        unread_failures_.erase(0, end + 1);
    }
}

bool Coordinator::start_server() {
    server_ = ChildProcess({"--role", "server", "--break", options_.fault}, board_fd_, failures_out_,
                           options_.output + "/server.log");
    const auto deadline = Clock::now() + std::chrono::seconds(options_.patience);
    // It is there when it answers.
    for (ServiceUses uses; Clock::now() < deadline; std::this_thread::sleep_for(kStep)) {
        if (access(TAVO_STORAGE_ROOT "/com.zorla.qirserver/android.tavo.osal", R_OK) == 0 && read_uses(uses))
            return true;
    }
    fail("the server does not answer");
    return false;
}

void Coordinator::start_client(unsigned slot) {
    Slot& shared = board_->slots[slot];
    shared.incarnation = shared.incarnation + 1;
    shared.stage = Stage::kStarting;
    ClientProcess& client = clients_[slot];
    client = {};
    client.progressed = Clock::now();
    client.operations = shared.operations;
    std::vector<std::string> arguments = {"--role",        "client",
                                          "--slot",        std::to_string(slot),
                                          "--incarnation", std::to_string(shared.incarnation),
                                          "--seed",        std::to_string(options_.seed)};
    if (!options_.fault.empty() && slot == 0) arguments.insert(arguments.end(), {"--break", options_.fault});
    client.process =
        ChildProcess(arguments, board_fd_, failures_out_, options_.output + "/client-" + std::to_string(slot) + ".log");
}

void Coordinator::restart_the_dead() {
    bool is_there[kClients];
    for (unsigned i = 0; i < kClients; ++i) {
        ClientProcess& client = clients_[i];
        if (!client.process.is_running() && Clock::now() >= client.restart && channels_->are_closed_for(i))
            start_client(i);
        is_there[i] = client.process.is_running();
    }
    channels_->open_for(is_there);
}

// Files that no operation of the killed client's is going to remove.
void Coordinator::clean_up_after(unsigned slot) {
    const uint32_t incarnation = board_->slots[slot].incarnation;
    const std::string root = TAVO_STORAGE_ROOT;
    const std::string own = root + "/soak-" + std::to_string(slot) + "." + std::to_string(incarnation) + "-";
    for (const char* leaf : {"file", "made", "socket"}) unlink((own + leaf).c_str());
    for (uint32_t i = 0; i < kOwnKeys; ++i) {
        unlink((root + "/" + std::to_string(own_key(slot, incarnation, i))).c_str());
    }
}

void Coordinator::reap() {
    std::string how;
    if (server_is_wanted_ && server_.has_ended(how)) {
        server_is_wanted_ = false;
        report_failure("server: " + how + ", see server.log");
    }
    for (unsigned i = 0; i < kClients; ++i) {
        ClientProcess& client = clients_[i];
        if (!client.process.has_ended(how)) continue;
        const Slot& shared = board_->slots[i];
        client.ended_in_order = shared.stage == Stage::kGone && how == "exit status 0";
        if (!client.was_killed && !client.ended_in_order) {
            report_failure(text_of(i, shared) + ", " + stands_at(shared) + ": " + how + ", see client-" +
                           std::to_string(i) + ".log");
        }
        client.restart = Clock::now() + milliseconds(random_.below(300));
        if (client.ended_in_order) continue;
        channels_->account_for_death(i);
        guards_->account_for_death(i);
        clean_up_after(i);
    }
}

// Most moments are in no step that a kill could tear: half of the kills wait a little for one of some kind.
void Coordinator::await_step(unsigned slot) {
    const Slot& victim = board_->slots[slot];
    const auto is_putting = [&](const Channel& channel) {
        const auto& links = channel.links[slot];
        return std::any_of(links, links + kLinksOfASender,
                           [](const Link& link) { return link.state == LinkState::kUsed && link.intent != link.done; });
    };
    const auto is_writing = [&](unsigned guard) {
        return victim.at_guard[guard] && board_->guards[guard].intent != board_->guards[guard].done;
    };
    const unsigned kind = random_.below(4);
    const auto is_in_one = [&] {
        if (kind == 0) return is_putting(board_->channels[random_.below(kInboxes)]);
        if (kind == 1) return is_putting(board_->channels[stream_of(slot)]);
        const unsigned guard = random_.below(kGuards);
        return kind == 2 ? is_writing(guard) : victim.at_guard[guard].load();
    };
    const auto deadline = Clock::now() + kMostAim;
    while (!is_in_one() && Clock::now() < deadline) {
    }
}

void Coordinator::kill_one() {
    if (Clock::now() < next_kill_) return;
    next_kill_ = Clock::now() + milliseconds(random_.between(100, 1500));
    const unsigned slot = random_.between(kSteadyClients, kClients - 1);
    ClientProcess& client = clients_[slot];
    if (!client.process.is_running() || client.was_killed) return;
    client.was_killed = true;
    if (random_.one_in(2)) await_step(slot);
    client.process.kill(SIGKILL);
    ++kills_;
}

void Coordinator::watch_progress() {
    for (unsigned i = 0; i < kClients; ++i) {
        ClientProcess& client = clients_[i];
        const Slot& shared = board_->slots[i];
        if (!client.process.is_running() || client.was_killed) continue;
        if (client.operations != shared.operations) {
            client.operations = shared.operations;
            client.progressed = Clock::now();
        } else if (Clock::now() > client.progressed + std::chrono::seconds(options_.patience)) {
            report_failure(text_of(i, shared) + " (pid " + std::to_string(client.process.pid()) + "), " +
                           stands_at(shared) + ": no progress for " + std::to_string(options_.patience) + " s");
            client.was_killed = true;
            client.process.kill(SIGKILL);
        }
    }
}

// The service keeps the uses that a killed client did not give back, also one that it counted when the client was
// dead already. Nobody uses these keys any more, so they are taken back here.
void Coordinator::take_back_unknown_uses(bool is_the_end) {
    ServiceUses uses;
    if (!expect(read_uses(uses), "the service does not tell its figures")) return;
    const auto is_known = [this](uint32_t key, const char* what) {
        const unsigned slot = slot_of_key(key);
        if (slot >= kClients || incarnation_of_key(key) != board_->slots[slot].incarnation) return false;
        const ClientProcess& client = clients_[slot];
        if (client.ended_in_order) fail(text_of(slot, board_->slots[slot]) + " ended and left a use of a " + what);
        return client.process.is_running();
    };
    for (const auto& [key, count] : uses.queues) {
        const auto number = static_cast<int32_t>(key);
        if (is_known(key, "queue") || channels_->knows_key(number)) continue;
        while (take_queue_use(number)) {
        }
    }
    for (const auto& [key, count] : uses.blocks) {
        if (is_known(key, "block") || guards_->knows_key(key)) continue;
        for (int i = 0; i < count; ++i) take_block_use(key);
    }
    if (!is_the_end) return;
    ServiceUses left;
    expect(read_uses(left) && left.queues.empty() && left.blocks.empty(), "the service is not empty in the end");
}

void Coordinator::sample() {
    const double now = seconds(), passed = now - seconds_at_last_sample_;
    const auto add = [&](const std::string& name, uint32_t incarnation, const ChildProcess& process, Series* series) {
        if (!process.is_running()) return;
        const Holdings h = process.holdings();
        if (h.resident_kib == 0) return;  // it has just been killed
        samples_file_ << now << ',' << name << ',' << incarnation << ',' << h.descriptors << ',' << h.resident_kib
                      << ',' << h.threads << ',' << h.mappings << '\n';
        if (series != nullptr) series->add({now, h});
    };
    add("server", 1, server_, &series_[0]);
    for (unsigned i = 0; i < kClients; ++i) {
        add("client " + std::to_string(i), board_->slots[i].incarnation, clients_[i].process,
            i < kSteadyClients ? &series_[1 + i] : nullptr);
    }
    const Totals all = totals();
    if (passed > 0) {
        messages_per_second_ = static_cast<double>(all.messages - at_last_sample_.messages) / passed;
        rates_file_ << now << ',' << messages_per_second_ << ','
                    << static_cast<double>(all.operations - at_last_sample_.operations) / passed << ',' << kills_
                    << '\n';
    }
    at_last_sample_ = all;
    seconds_at_last_sample_ = now;
    samples_file_.flush();
    rates_file_.flush();
}

void Coordinator::show_progress(bool is_due) {
    static const bool on_terminal = isatty(STDERR_FILENO) == 1;
    if (!is_due && Clock::now() < next_progress_) return;
    next_progress_ = Clock::now() + (on_terminal ? milliseconds(500) : milliseconds(30000));
    const Totals all = totals();
    fprintf(stderr, "%s%.0f of %.0f s: %llu messages, %.0f a second; %u kills, %zu failures%s",
            on_terminal ? "\r\033[K" : "", seconds(), options_.minutes * 60,
            static_cast<unsigned long long>(all.messages), messages_per_second_, kills_, failure_count_,
            on_terminal && !is_due ? "" : "\n");
}

void Coordinator::step() {
    const auto now = Clock::now();
    reap();
    channels_->go_on();
    guards_->go_on();
    watch_progress();
    if (kills_are_wanted_) {
        restart_the_dead();
        guards_->open_all();
        kill_one();
        if (now >= next_change_) {
            next_change_ = now + milliseconds(random_.between(500, 4000));
            guards_->change_one();
        }
    }
    if (now >= next_sweep_) {
        next_sweep_ = now + std::chrono::seconds(1);
        set_operation("taking uses back");
        take_back_unknown_uses(false);
    }
    if (now >= next_sample_) {
        const double interval = std::clamp(options_.minutes * 60 / 300, 0.1, 5.0);
        next_sample_ = now + milliseconds(static_cast<int>(interval * 1000));
        sample();
    }
    read_failures();
    show_progress(false);
}

bool Coordinator::run_until(const std::function<bool()>& is_done, Clock::time_point deadline) {
    while (!is_done()) {
        if (Clock::now() >= deadline || !server_is_wanted_) return false;
        step();
        pollfd slot = {failures_in_, POLLIN, 0};
        poll(&slot, 1, static_cast<int>(kStep.count()));
    }
    return true;
}

// All fall quiet before anybody leaves: what is sent has to be received by somebody.
void Coordinator::end_in_order() {
    kills_are_wanted_ = false;
    board_->phase = Phase::kFallQuiet;
    const auto deadline = Clock::now() + std::chrono::seconds(options_.grace);
    const auto all = [this](const std::function<bool(unsigned)>& holds) {
        for (unsigned i = 0; i < kClients; ++i) {
            if (clients_[i].process.is_running() && !holds(i)) return false;
        }
        return true;
    };
    run_until(
        [&] {
            return all([this](unsigned i) {
                       return !clients_[i].was_killed && board_->slots[i].stage == Stage::kQuiet;
                   }) &&
                   !channels_->are_some_retired();
        },
        deadline);
    board_->phase = Phase::kLeave;
    run_until([&] { return all([](unsigned) { return false; }); }, deadline);
    for (unsigned i = 0; i < kClients; ++i) {
        ClientProcess& client = clients_[i];
        if (!client.process.is_running()) continue;
        report_failure(text_of(i, board_->slots[i]) + " (pid " + std::to_string(client.process.pid()) + "), " +
                       stands_at(board_->slots[i]) + ": did not leave within " + std::to_string(options_.grace) + " s");
        client.was_killed = true;
        client.process.kill(SIGKILL);
    }
    if (!server_is_wanted_) return;
    reap();
    channels_->close_all();
    guards_->close_all();
    take_back_unknown_uses(true);
}

void Coordinator::judge() {
    const bool is_long = seconds() >= 60;
    for (const Series& series : series_) {
        const std::vector<Verdict> verdicts = series.judge(is_long, is_long && !is_sanitized());
        verdicts_.insert(verdicts_.end(), verdicts.begin(), verdicts.end());
    }
    for (const Verdict& v : verdicts_) {
        if (v.is_flat) continue;
        report_failure(v.process + ": its " + v.what + " grow, from " + std::to_string(v.second_quarter) +
                       " in the second quarter to " + std::to_string(v.last_quarter) + " in the last");
    }
}

int Coordinator::run() {
    if (board_ == nullptr || failures_in_ < 0 || !samples_file_) {
        perror("soak");
        return 2;
    }
    for (const int signal : {SIGINT, SIGTERM}) {
        struct sigaction action = {};
        action.sa_handler = [](int) { g_stop = 1; };
        sigaction(signal, &action, nullptr);
    }
    start_ = Clock::now();
    const auto duration = milliseconds(static_cast<int64_t>(options_.minutes * 60000));
    end_at(start_ + duration + std::chrono::seconds(options_.grace + kReportSeconds));
    printf("seed %llu\n", static_cast<unsigned long long>(options_.seed));
    fflush(stdout);
    std::ofstream(TAVO_STORAGE_ROOT "/shm_key_gen_file.txt") << "soak\n";
    channels_ = std::make_unique<Channels>(*board_, options_.fault);
    guards_ = std::make_unique<Guards>(*board_, options_.seed);
    series_.emplace_back("server");
    for (unsigned i = 0; i < kSteadyClients; ++i) series_.emplace_back("client " + std::to_string(i));
    if (start_server()) {
        next_progress_ = Clock::now();
        run_until([this] { return g_stop != 0 || (options_.stop_at_failure && failure_count_ > 0); },
                  start_ + duration);
        judge();
        // Without a server nobody can give anything back.
        if (server_is_wanted_) end_in_order();
    }
    read_failures();
    server_is_wanted_ = false;
    server_.kill(SIGKILL);
    show_progress(true);
    const Report report(*this);
    std::ofstream(options_.output + "/report.md") << report.page();
    if (g_stop != 0) printf("interrupted\n");
    printf("%s", report.summary().c_str());
    return failure_count_ == 0 ? 0 : 1;
}

}  // namespace tavo::soak

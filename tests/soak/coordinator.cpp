#include "soak/coordinator.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <thread>

#include "soak/failure.h"
#include "soak/report.h"
#include "soak/service_uses.h"

namespace tavo::soak {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kStep(10);
constexpr std::chrono::seconds kReportTime(3), kKilledStragglersTime(2);
constexpr size_t kMostFailuresShown = 100;

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

void stop_when_interrupted() {
    struct sigaction action = {};
    action.sa_handler = [](int) { g_stop = 1; };
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
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

bool is_on_terminal() {
    static const bool answer = isatty(STDERR_FILENO) == 1;
    return answer;
}

// A line that the next one is written over.
constexpr char kOverwrite[] = "\r\033[K";

}  // namespace

Coordinator::Coordinator(const Options& options)
    : options_(options), random_(options.seed), board_(make_board(board_fd_)) {
    int ends[2] = {-1, -1};
    // Without waiting: somebody who cannot tell a failure because of many others is not to stand still.
    if (pipe2(ends, O_CLOEXEC | O_NONBLOCK) != 0) perror("pipe2");
    failures_in_ = moved_up(ends[0]);
    failures_out_ = moved_up(ends[1]);
    dup3(failures_out_, kFailureFd, O_CLOEXEC);
}

void Coordinator::report_failure(const std::string& line) {
    ++failure_count_;
    if (failure_count_ > kMostFailuresShown) return;
    failures_.push_back("seed " + std::to_string(options_.seed) + ": " + line);
    if (is_on_terminal()) fputs(kOverwrite, stderr);
    printf("FAILURE: %s\n", failures_.back().c_str());
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
    const char* const marker = TAVO_STORAGE_ROOT "/com.zorla.qirserver/android.tavo.osal";
    const auto deadline = Clock::now() + std::chrono::seconds(options_.patience);
    // It is there when it answers.
    for (ServiceUses uses; Clock::now() < deadline; std::this_thread::sleep_for(kStep)) {
        if (access(marker, R_OK) == 0 && read_uses(uses)) return server_is_there_ = true;
    }
    fail("the server does not answer");
    return false;
}

void Coordinator::watch_server() {
    std::string how;
    if (!server_is_there_ || !server_.has_ended(how)) return;
    server_is_there_ = false;
    report_failure("server: " + how + ", see server.log");
}

// The service keeps the uses that a killed client did not give back, also one that it counted when the client was
// dead already. Nobody uses these keys any more, so they are taken back here.
void Coordinator::take_back_unknown_uses(bool is_the_end) {
    set_operation("taking uses back");
    ServiceUses uses;
    if (!expect(read_uses(uses), "the service does not tell its figures")) return;
    for (const auto& [key, count] : uses.queues) {
        const auto number = static_cast<int32_t>(key);
        if (clients_->have_own_key(key, "queue") || channels_->knows_key(number)) continue;
        while (take_queue_use(number)) {
        }
    }
    for (const auto& [key, count] : uses.blocks) {
        if (clients_->have_own_key(key, "block") || guards_->knows_key(key)) continue;
        for (int i = 0; i < count; ++i) take_block_use(key);
    }
    if (!is_the_end) return;
    ServiceUses left;
    expect(read_uses(left) && left.queues.empty() && left.blocks.empty(), "the service is not empty in the end");
}

void Coordinator::show_progress(bool is_the_end) {
    if (!is_the_end && Clock::now() < next_progress_) return;
    next_progress_ = Clock::now() + (is_on_terminal() ? milliseconds(500) : milliseconds(30000));
    fprintf(stderr, "%s%.0f of %.0f s: %llu messages, %.0f a second; %u kills, %zu failures%s",
            is_on_terminal() ? kOverwrite : "", recorder_->seconds(), options_.minutes * 60,
            static_cast<unsigned long long>(recorder_->totals().messages), recorder_->messages_per_second(),
            clients_->kills(), failure_count_, is_on_terminal() && !is_the_end ? "" : "\n");
}

void Coordinator::step() {
    const auto now = Clock::now();
    watch_server();
    if (!server_is_there_) return;  // whoever asks it waits for long
    clients_->reap(*channels_, *guards_);
    channels_->go_on();
    guards_->go_on();
    clients_->watch_progress();
    if (is_running_) {
        clients_->start_missing(*channels_);
        guards_->open_all();
        clients_->kill_one();
    }
    if (is_running_ && now >= next_change_) {
        next_change_ = now + milliseconds(random_.between(500, 4000));
        guards_->change_one();
    }
    if (now >= next_sweep_) {
        next_sweep_ = now + std::chrono::seconds(1);
        take_back_unknown_uses(false);
    }
    if (now >= next_sample_) {
        const double interval = std::clamp(options_.minutes * 60 / 300, 0.1, 5.0);
        next_sample_ = now + milliseconds(static_cast<int>(interval * 1000));
        recorder_->sample(server_, *clients_);
    }
    read_failures();
    show_progress(false);
}

bool Coordinator::run_until(const std::function<bool()>& is_done, Clock::time_point deadline) {
    while (!is_done()) {
        if (Clock::now() >= deadline || !server_is_there_) return false;
        step();
        pollfd slot = {failures_in_, POLLIN, 0};
        poll(&slot, 1, static_cast<int>(kStep.count()));
    }
    return true;
}

// All fall quiet before anybody leaves: what is sent has to be received by somebody.
void Coordinator::end_in_order() {
    is_running_ = false;
    board_->phase = Phase::kFallQuiet;
    const auto deadline = Clock::now() + std::chrono::seconds(options_.grace);
    const auto are_all_gone = [this] { return clients_->are_all_gone(); };
    run_until([this] { return clients_->are_all_quiet() && !channels_->are_some_retired(); }, deadline);
    board_->phase = Phase::kLeave;
    if (!run_until(are_all_gone, deadline)) {
        clients_->end_stragglers();
        run_until(are_all_gone, Clock::now() + kKilledStragglersTime);
    }
    // Without a server nobody can give anything back.
    if (!server_is_there_) return;
    channels_->close_all();
    guards_->close_all();
    take_back_unknown_uses(true);
}

void Coordinator::judge() {
    verdicts_ = recorder_->judge();
    for (const Verdict& v : verdicts_) {
        if (v.is_flat) continue;
        report_failure(v.process + ": its " + v.what + " grow, from " + std::to_string(v.second_quarter) +
                       " in the second quarter to " + std::to_string(v.last_quarter) + " in the last");
    }
}

int Coordinator::run() {
    if (board_ != nullptr) recorder_ = std::make_unique<Recorder>(*board_, options_.output);
    if (failures_in_ < 0 || recorder_ == nullptr || !recorder_->is_good()) {
        perror("soak");
        return 2;
    }
    stop_when_interrupted();
    const auto end = Clock::now() + milliseconds(static_cast<int64_t>(options_.minutes * 60000));
    end_at(end + std::chrono::seconds(options_.grace) + kReportTime);
    printf("seed %llu\n", static_cast<unsigned long long>(options_.seed));
    fflush(stdout);
    std::ofstream(TAVO_STORAGE_ROOT "/shm_key_gen_file.txt") << "soak\n";
    clients_ = std::make_unique<Clients>(*board_, options_, board_fd_, failures_out_,
                                         [this](const std::string& line) { report_failure(line); });
    channels_ = std::make_unique<Channels>(*board_, options_.fault);
    guards_ = std::make_unique<Guards>(*board_, options_.seed);
    if (start_server()) {
        run_until([this] { return g_stop != 0 || (options_.stop_at_failure && failure_count_ > 0); }, end);
        judge();
        if (server_is_there_) end_in_order();
    }
    read_failures();
    server_.kill(SIGKILL);
    show_progress(true);
    const Report report(*this);
    std::ofstream(options_.output + "/report.md") << report.page();
    if (g_stop != 0) printf("interrupted\n");
    printf("%s", report.summary().c_str());
    return failure_count_ == 0 ? 0 : 1;
}

}  // namespace tavo::soak

#include "soak/recorder.h"

namespace tavo::soak {
namespace {

bool is_sanitized() {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    return true;
#else
    return false;
#endif
}

std::string name_of(unsigned slot) { return "client " + std::to_string(slot); }

}  // namespace

Recorder::Recorder(const Board& board, const std::string& directory)
    : board_(board), samples_file_(directory + "/samples.csv"), rates_file_(directory + "/rates.csv") {
    samples_file_ << "seconds,process,incarnation,descriptors,resident_kib,threads,mappings\n";
    rates_file_ << "seconds,messages_per_second,operations_per_second,kills\n";
    series_.emplace_back("server");
    for (unsigned i = 0; i < kSteadyClients; ++i) series_.emplace_back(name_of(i));
}

double Recorder::seconds() const { return std::chrono::duration<double>(Clock::now() - start_).count(); }

Totals Recorder::totals() const {
    Totals totals;
    for (const Slot& slot : board_.slots) {
        totals.messages += slot.messages;
        totals.bytes += slot.bytes;
        for (const auto& count : slot.done) totals.operations += count;
    }
    return totals;
}

void Recorder::add(const std::string& name, uint32_t incarnation, const ChildProcess& process, Series* series) {
    if (!process.is_running()) return;
    const Holdings h = process.holdings();
    if (h.resident_kib == 0) return;  // it has just been killed
    samples_file_ << seconds() << ',' << name << ',' << incarnation << ',' << h.descriptors << ',' << h.resident_kib
                  << ',' << h.threads << ',' << h.mappings << std::endl;
    if (series != nullptr) series->add(h);
}

void Recorder::sample(const ChildProcess& server, const Clients& clients) {
    add("server", 1, server, &series_[0]);
    for (unsigned i = 0; i < kClients; ++i) {
        Series* series = i < kSteadyClients ? &series_[1 + i] : nullptr;
        add(name_of(i), board_.slots[i].incarnation, clients.process(i), series);
    }
    const Totals now = totals();
    const double passed = seconds() - latest_seconds_;
    const auto rate = [passed](uint64_t count) { return static_cast<double>(count) / passed; };
    messages_per_second_ = rate(now.messages - latest_.messages);
    rates_file_ << seconds() << ',' << messages_per_second_ << ',' << rate(now.operations - latest_.operations) << ','
                << clients.kills() << std::endl;
    latest_ = now;
    latest_seconds_ += passed;
}

std::vector<Verdict> Recorder::judge() const {
    const bool is_long = seconds() >= 60;
    std::vector<Verdict> all;
    for (const Series& series : series_) {
        const std::vector<Verdict> verdicts = series.judge(is_long, is_long && !is_sanitized());
        all.insert(all.end(), verdicts.begin(), verdicts.end());
    }
    return all;
}

}  // namespace tavo::soak

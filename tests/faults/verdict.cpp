#include "faults/verdict.h"

#include <algorithm>
#include <cctype>
#include <cstring>
#include <sstream>

#include "faults/platform_calls.h"
#include "tavo_osal/testing/log_capture.hpp"

namespace tavo::test::faults {
namespace {

bool matches(const char* pattern, const char* text) {
    for (; *pattern != '\0'; ++pattern, ++text) {
        if (*pattern == '*') {
            for (const char* rest = text;; ++rest) {
                if (matches(pattern + 1, rest)) return true;
                if (*rest == '\0') return false;
            }
        }
        if (*pattern != *text) return false;
    }
    return *text == '\0';
}

bool is(const LogLine& line, const Line& expected) {
    return line.priority == priority_of(expected.level) && strcmp(line.tag, expected.tag) == 0 &&
           matches(expected.text.c_str(), line.text);
}

// Addresses, descriptors and processes have other numbers in every run.
std::string numberless(const LogLine& line) {
    std::string text = std::to_string(line.priority) + line.tag + ": ";
    for (const char* at = line.text; *at != '\0'; ++at) {
        if (isxdigit(static_cast<unsigned char>(*at)) == 0) {
            text += *at;
        } else if (text.back() != '#') {
            text += '#';
        }
    }
    return text;
}

// Takes the expected lines out, in their order. False when one is not there.
bool take_out(std::vector<LogLine>& lines, const std::vector<Line>& expected) {
    auto from = lines.begin();
    for (const Line& line : expected) {
        from = std::find_if(from, lines.end(), [&](const LogLine& candidate) { return is(candidate, line); });
        if (from == lines.end()) return false;
        from = lines.erase(from);
    }
    return true;
}

bool lines_are_right(const Outcome& outcome, const Trial& fault_free, const Trial& run) {
    std::vector<LogLine> rest = run.lines;
    if (!take_out(rest, outcome.lines)) return false;
    if (outcome.way == Outcome::kSame && rest.size() != fault_free.lines.size()) return false;
    // The others are the fault-free run's, in their order.
    auto from = fault_free.lines.begin();
    for (const LogLine& line : rest) {
        from = std::find_if(from, fault_free.lines.end(),
                            [&](const LogLine& known) { return numberless(known) == numberless(line); });
        if (from == fault_free.lines.end()) return false;
        ++from;
    }
    return true;
}

std::string shown(const Held& held) {
    std::ostringstream text;
    text << held.descriptors << " descriptors, " << held.threads << " threads, " << held.blocks << " blocks, "
         << held.mappings << " mappings";
    return text.str();
}

// What is wrong with the run, if this is what was to come; empty when nothing is.
std::string wrong(const Outcome& outcome, const Scenario& scenario, const Trial& fault_free, const Trial& run) {
    if (outcome.way == Outcome::kEnds) return run.end == Trial::kEnded ? "" : "the process goes on";
    if (run.end != Trial::kReturned) {
        return run.end == Trial::kHung ? "it does not come back"
                                       : "the process ended, by signal " + std::to_string(run.signal);
    }
    std::ostringstream text;
    const long expected = outcome.way == Outcome::kSame ? fault_free.result : outcome.result;
    if (run.result != expected) text << "the result is " << run.result << ", not " << expected << "; ";
    if (!lines_are_right(outcome, fault_free, run)) text << "other lines in the log; ";
    if (!run.complaint.empty()) text << "not so: " << run.complaint << "; ";
    if (!outcome.for_good && run.again != fault_free.again) {
        text << "then, without a fault, the result is " << run.again << ", not " << fault_free.again << "; ";
    }
    Held held = fault_free.held;
    held.blocks += outcome.blocks;
    held.mappings += outcome.mappings;
    const bool has_blocks = outcome.at_most
                                ? run.held.blocks <= held.blocks && run.held.blocks >= fault_free.held.blocks
                                : run.held.blocks == held.blocks;
    const bool is_held = run.held.descriptors == held.descriptors && run.held.threads == held.threads && has_blocks &&
                         run.held.mappings == held.mappings;
    if (!is_held && !outcome.for_good) text << "it holds " << shown(run.held) << ", not " << shown(held) << "; ";
    if (!scenario.service) return text.str();
    if (!run.service_lives) return text.str() + "the service has ended";
    if (run.figures != fault_free.figures && !outcome.uses) text << "the service's figures:\n" << run.figures;
    if (run.service_held.descriptors > fault_free.service_held.descriptors && !outcome.uses) {
        text << "the service holds " << shown(run.service_held) << ", more than " << shown(fault_free.service_held);
    }
    return text.str();
}

// What names the call and its number comes first.
const Expectation* best_of(const std::vector<Expectation>& expectations, const Fault& fault, const char* name) {
    const Expectation* best = nullptr;
    int best_rank = -1;
    for (const Expectation& each : expectations) {
        const auto named = std::find_if(each.calls.begin(), each.calls.end(),
                                        [name](const char* call) { return strcmp(call, name) == 0; });
        if (!each.calls.empty() && named == each.calls.end()) continue;
        if (each.nth != 0 && each.nth != fault.nth) continue;
        if (each.error != 0 && each.error != fault.error) continue;
        const int rank = (each.calls.empty() ? 0 : 4) + (each.nth != 0 ? 2 : 0) + (each.error != 0 ? 1 : 0);
        if (rank <= best_rank) continue;
        best = &each;
        best_rank = rank;
    }
    return best;
}

// Holds for every row that says nothing else.
const std::vector<Expectation>& common_expectations() {
    static const std::vector<Expectation>& common = *new std::vector<Expectation>{
        skip({"snprintf", "vsnprintf"},
             "makes texts of plain numbers and names, in memory of its own: only other formats can fail"),
    };
    return common;
}

}  // namespace

const Expectation* expectation_for(const Scenario& scenario, const Fault& fault) {
    const char* name = platform_calls()[static_cast<size_t>(fault.call)].name;
    const Expectation* own = best_of(scenario.expectations, fault, name);
    if (own != nullptr && !own->calls.empty()) return own;
    const Expectation* common = best_of(common_expectations(), fault, name);
    return common != nullptr ? common : own;
}

const Outcome* outcome_of(const Expectation& expectation, const Scenario& scenario, const Trial& fault_free,
                          const Trial& run, std::string& why) {
    // Of several, those say most that have the right result.
    std::string others;
    for (const Outcome& outcome : expectation.outcomes) {
        const std::string fault = wrong(outcome, scenario, fault_free, run);
        if (fault.empty()) return &outcome;
        (fault.find("the result is") == std::string::npos ? why : others) += "  not as expected, for " + fault + "\n";
    }
    if (why.empty()) why = others;
    return nullptr;
}

std::string shown(const Trial& run) {
    std::ostringstream text;
    text << "  result " << run.result << ", later " << run.again << ", holds " << shown(run.held) << "\n";
    for (const LogLine& line : run.lines) {
        text << "  [" << line.priority << " " << line.tag << "] " << line.text;
        if (strchr(line.text, '\n') == nullptr) text << "\n";
    }
    if (!run.output.empty()) text << "  standard error: " << run.output << "\n";
    return text.str();
}

}  // namespace tavo::test::faults

// Every exported function in a working sequence, under which the first, the second, and in the end every platform call
// fails. docs/faults.md tells how to read the table that this makes.
#include <gtest/gtest.h>

#include <array>
#include <cstdlib>
#include <fstream>
#include <iomanip>
#include <iostream>
#include <map>
#include <set>
#include <sstream>

#include "faults/platform_calls.h"
#include "faults/verdict.h"

namespace tavo::test::faults {
namespace {

// More calls of one kind than any function makes: what goes on for ever must not go on for ever here.
constexpr int kMostFaults = 500;

// A row of the printed table.
struct Tally {
    std::array<int, kKinds> faults = {};
    int same = 0, told = 0, ended = 0;
    std::map<std::string, int> reasons;                    // what is kept, or ends the process, and how often
    std::map<std::string, std::set<std::string>> skipped;  // why, and which calls
};

// Without the namespace and the types of the arguments.
std::string short_name(const std::string& symbol) {
    const std::string name = symbol.rfind("android::", 0) == 0 ? symbol.substr(9) : symbol;
    const bool is_method = name.find("::") != std::string::npos && name.find(" for ") == std::string::npos &&
                           name.find("thunk") == std::string::npos;
    return is_method ? name.substr(0, name.find('(')) : name;
}

class FaultMatrix : public testing::TestWithParam<const Row*> {
protected:
    void add(const PlatformCall& call, const Outcome& outcome) {
        ++tally_.faults[static_cast<size_t>(call.kind)];
        switch (outcome.way) {
            case Outcome::kSame: ++tally_.same; break;
            case Outcome::kFails: ++tally_.told; break;
            case Outcome::kEnds: ++tally_.ended; break;
        }
        if (outcome.reason != nullptr) ++tally_.reasons[outcome.reason];
    }

    // One call of the platform's, failing for the first time, the second, and so on.
    void fail_each(const Scenario& scenario, const Trial& fault_free, int index, int error) {
        const PlatformCall& call = platform_calls()[static_cast<size_t>(index)];
        for (int nth = 1;; ++nth) {
            const Fault fault = {index, error, nth};
            const Expectation* expectation = expectation_for(scenario, fault);
            if (expectation != nullptr && expectation->skipped != nullptr) {
                tally_.skipped[expectation->skipped].insert(call.name);
                return;
            }
            const Trial run = tried(scenario, &fault);
            if (!run.reached) return;
            std::ostringstream cell;
            cell << scenario.name << (*scenario.name != '\0' ? ": " : "") << call.name << " fails for the " << nth
                 << ". time, error " << error << "\n";
            ASSERT_LE(nth, kMostFaults) << cell.str();
            if (getenv("TAVO_FAULTS_SHOW") != nullptr) std::cout << cell.str() << shown(run);
            if (expectation == nullptr) {
                ADD_FAILURE() << cell.str() << "nothing says what happens then\n" << shown(run);
                continue;
            }
            std::string why;
            const Outcome* outcome = outcome_of(*expectation, scenario, fault_free, run, why);
            if (outcome == nullptr) {
                ADD_FAILURE() << cell.str() << why << shown(run);
            } else {
                add(call, *outcome);
            }
        }
    }

    void go_through(const Scenario& scenario) {
        const Trial fault_free = tried(scenario, nullptr);
        ASSERT_EQ(fault_free.end, Trial::kReturned)
            << scenario.name << ", without a fault: signal " << fault_free.signal << "\n"
            << shown(fault_free);
        ASSERT_EQ(fault_free.complaint, "") << scenario.name;
        if (getenv("TAVO_FAULTS_SHOW") != nullptr) std::cout << scenario.name << ", no fault\n" << shown(fault_free);
        for (size_t i = 0; i < platform_calls().size(); ++i) {
            if (fault_free.seen[i] == 0) continue;
            for (const int error : platform_calls()[i].errors) {
                fail_each(scenario, fault_free, static_cast<int>(i), error);
            }
        }
    }

    // For './dev faults', which puts the rows together.
    void write(const Row& row) const {
        std::ostringstream text;
        text << std::left << std::setw(62) << short_name(row.symbol) << std::right;
        if (row.no_function != nullptr) {
            text << "  " << row.no_function << "\n";
        } else {
            for (const int count : tally_.faults) text << std::setw(7) << (count > 0 ? std::to_string(count) : "-");
            text << std::setw(8) << tally_.same << std::setw(7) << tally_.told << std::setw(7) << tally_.ended << "\n";
        }
        for (const auto& [reason, count] : tally_.reasons) text << "    * " << count << ": " << reason << "\n";
        for (const auto& [reason, calls] : tally_.skipped) {
            text << "    - not made to fail:";
            for (const std::string& call : calls) text << " " << call;
            text << ": " << reason << "\n";
        }
        std::cout << text.str();
        if (const char* directory = getenv("TAVO_FAULTS_TABLE")) {
            const std::string test = testing::UnitTest::GetInstance()->current_test_info()->name();
            std::ofstream(std::string(directory) + "/" + test.substr(test.find('/') + 1) + ".row") << text.str();
        }
    }

    Tally tally_;
};

TEST_P(FaultMatrix, Fails) {
    const Row& row = *GetParam();
    ASSERT_EQ(row.scenarios.empty(), row.no_function != nullptr);
    for (const Scenario& scenario : row.scenarios) go_through(scenario);
    write(row);
}

std::vector<const Row*> all_rows() {
    std::vector<const Row*> pointers;
    for (const Row& row : rows()) pointers.push_back(&row);
    return pointers;
}

std::string test_name(const testing::TestParamInfo<const Row*>& one) {
    std::string name;
    for (const char* at = one.param->symbol; *at != '\0'; ++at) {
        if (isalnum(static_cast<unsigned char>(*at)) != 0) {
            name += *at;
        } else if (*at == '~') {
            name += "destroy_";
        } else if (!name.empty() && name.back() != '_') {
            name += '_';
        }
    }
    while (!name.empty() && name.back() == '_') name.pop_back();
    return name;
}

INSTANTIATE_TEST_SUITE_P(Row, FaultMatrix, testing::ValuesIn(all_rows()), test_name);

std::set<std::string> exported_names() {
    std::ifstream list(TAVO_EXPORTED_SYMBOLS);
    std::set<std::string> names;
    for (std::string name; std::getline(list, name);) names.insert(name);
    return names;
}

TEST(FaultTable, HasARowForEveryExportedName) {
    std::set<std::string> names;
    for (const Row& row : rows()) EXPECT_TRUE(names.insert(row.symbol).second) << "two rows: " << row.symbol;
    const std::set<std::string> exported = exported_names();
    ASSERT_FALSE(exported.empty());
    for (const std::string& name : exported)
        EXPECT_TRUE(names.count(name) == 1) << "exported, and has no row: " << name;
    for (const std::string& name : names) EXPECT_TRUE(exported.count(name) == 1) << "a row, and not exported: " << name;
}

class FaultTableOf : public testing::TestWithParam<const char*> {};

// Optimised builds call checked variants of some functions.
std::string unchecked(const std::string& name) {
    const bool is_checked = name.rfind("__", 0) == 0 && name.size() > 6 && name.substr(name.size() - 4) == "_chk";
    return is_checked ? name.substr(2, name.size() - 6) : name;
}

TEST_P(FaultTableOf, HasAnEntryForEveryImport) {
    const std::vector<std::string> imports = imports_of(GetParam());
    ASSERT_GT(imports.size(), 50U);
    for (const std::string& import : imports) {
        const std::string name = unchecked(import);
        const int index = index_of(name);
        EXPECT_TRUE(index >= 0 || why_exempt(name) != nullptr)
            << "neither made to fail nor named as exempt: " << import;
        EXPECT_TRUE(index < 0 || why_exempt(name) == nullptr) << "made to fail, and named as exempt: " << import;
    }
}

INSTANTIATE_TEST_SUITE_P(Library, FaultTableOf, testing::Values("libtavoosal.so", "libbinder.so"),
                         [](const auto& one) { return std::string(one.param).substr(0, 6); });

}  // namespace
}  // namespace tavo::test::faults

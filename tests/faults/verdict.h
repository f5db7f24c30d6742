// Whether a run with a fault is what a row says of it.
#pragma once

#include <string>

#include "faults/cell.h"

namespace tavo::test::faults {

// The row's word on a fault; null when it has none. What names the call and its number comes before what names the call
// alone, and that before what names none.
const Expectation* expectation_for(const Scenario& scenario, const Fault& fault);

// Which of the expected outcomes the run is; null when it is none, and why says what is wrong with each.
const Outcome* outcome_of(const Expectation& expectation, const Scenario& scenario, const Trial& fault_free,
                          const Trial& run, std::string& why);

// A run as text, for messages.
std::string shown(const Trial& run);

}  // namespace tavo::test::faults

// The log.
#include <cstdlib>
#include <cstring>

#include "faults/plan.h"
#include "faults/row.h"
#include "tavo_osal/log.h"

namespace tavo::test::faults {

namespace {

constexpr char kTag[] = "TAVO_LOG";

}  // namespace

std::vector<Row> log_rows() {
    const Line no_file_name = {TAVO_LOG_ERROR, kTag, "snprintf failed.\n"};
    return {
        {"tavo_print_log",
         {{"", nullptr, [] { return tavo_print_log(TAVO_LOG_ERROR, 0, 1, "TAG", "text %d", 1), 0L; }, nullptr, {}},
          {"with a time",
           [] {
               g_uiPerformance = 1;
               g_uiMxEnabledLogLevel = TAVO_LOG_TRACE;
           },
           [] { return tavo_print_log(TAVO_LOG_PERFORMANCE, 0, 1, "TAG", "text %d", 1), 0L; },
           [](long) { g_uiPerformance = 0; },
           // The time is printed as 0.
           {on({"gettimeofday"}, {same()})}}}},
        {"tavo_set_log_preference",
         {{"given",
           nullptr,
           [] { return tavo_set_log_preference("NAME -s -l3 -m1,2 -a", nullptr, nullptr), 0L; },
           [](long) {
               g_uiEnabledModuleMask = UINT32_MAX;
               g_uiMxEnabledLogLevel = TAVO_LOG_INFO;
           },
           {on({"strdup"}, {fails(0, {{TAVO_LOG_ERROR, kTag, " pcLogPreference memory allocation failed.\n"}})}, 1),
            on({"strdup"}, {fails(0, {{TAVO_LOG_ERROR, kTag, "pcTempString memory allocation failed.\n"}})}, 2),
            on({"snprintf"}, {same_but({no_file_name})}), on({"printf"}, {same()})}},
          {"from the environment",
           [] {
               static char preference[64];
               strcpy(preference, "LOG_PREF=NAME -l3 -m1");
               putenv(preference);
               g_uiEnvValueRead = 0;
           },
           [] { return tavo_set_log_preference(nullptr, nullptr, nullptr), 0L; },
           [](long) { g_uiEnabledModuleMask = UINT32_MAX; },
           {on({"strdup"}, {fails(0, {{TAVO_LOG_ERROR, kTag, "pcTempString memory allocation failed.\n"}})}),
            on({"snprintf"}, {same_but({no_file_name})}), on({"printf"}, {same()})}}}},
    };
}

}  // namespace tavo::test::faults

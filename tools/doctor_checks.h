// What 'tavo doctor' looks at.
#pragma once

#include <string>
#include <vector>

namespace tavo::tool {

enum class Health {
    kGood,
    kNote,    // worth knowing; nothing has to be done
    kProblem  // something has to be done
};

struct Finding {
    Health health;
    std::string subject;
    std::string finding;
    std::string advice;  // empty where there is none
};
using Findings = std::vector<Finding>;

void check_storage_root(Findings& findings);
void check_service(Findings& findings);
void check_driver(Findings& findings);
void check_semaphores(Findings& findings);
void check_key_files(Findings& findings);
void check_limits(Findings& findings);

}  // namespace tavo::tool

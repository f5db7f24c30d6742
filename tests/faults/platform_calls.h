// Every platform call that the libraries import: of which kind it is, how it fails, or why it cannot.
#pragma once

#include <string>
#include <vector>

namespace tavo::test::faults {

enum class Kind { kAllocation, kDescriptor, kThread, kClock, kFile, kSocket, kDriver, kProcess };
constexpr int kKinds = 8;
const char* name_of(Kind kind);

struct PlatformCall {
    const char* name;  // as it is imported; demangled it would not be found
    Kind kind;
    std::vector<int> errors;  // it is made to fail with each
    void* hook;
};

// Calls that are made to fail.
const std::vector<PlatformCall>& platform_calls();
// The call's place there; -1 when there is none.
int index_of(const std::string& name);

// Why an import is not made to fail; null when it has no entry.
const char* why_exempt(const std::string& import);

// The functions that a loaded library imports, by the names in its dynamic symbol table.
std::vector<std::string> imports_of(const std::string& library);

// Stands in front of the libraries' imports from now on.
void hook_platform_calls();

}  // namespace tavo::test::faults

// While it lasts, this program's own requests for memory that may be refused are refused: new (std::nothrow).
#pragma once

#include <new>
#include <string>

#include "support/platform_fault.h"

namespace tavo::test {

class NoMemory {
    static std::string name_of(char kind) {
        std::string name = std::string(kOperatorNew) + "RKSt9nothrow_t";
        name[3] = kind;
        return name;
    }
    static void* refuse(size_t, const std::nothrow_t&) { return nullptr; }
    static bool this_program(const std::string& object) { return object.empty(); }

    const PlatformHook one_{this_program, name_of('w').c_str(), reinterpret_cast<void*>(refuse)};
    const PlatformHook many_{this_program, name_of('a').c_str(), reinterpret_cast<void*>(refuse)};
};

}  // namespace tavo::test

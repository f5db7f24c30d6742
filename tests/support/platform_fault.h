// Makes the library's platform calls fail, with the testing kit's means.
#pragma once

#include <cstddef>
#include <type_traits>

#include "tavo_osal/testing/platform_hook.hpp"

namespace tavo::test {

// What operator new(size_t) is called in the symbol table, by the type that size_t is.
inline constexpr const char* kOperatorNew = std::is_same_v<size_t, unsigned long> ? "_Znwm" : "_Znwj";

}  // namespace tavo::test

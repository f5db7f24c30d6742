#include "tavo_osal/testing/failing_call.hpp"

namespace tavo::test::detail {

bool is_a_caller(const std::string& object) { return object.rfind("libtavoosal.so", 0) != 0; }

}  // namespace tavo::test::detail

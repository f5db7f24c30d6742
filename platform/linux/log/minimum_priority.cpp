// Debian's liblog drops every message below INFO on its own. The library has a filter of its own,
// which must be the only one its users meet, so liblog's is opened when the library is loaded.
#include <android/log.h>

namespace {

[[gnu::constructor]] void open_platform_log_filter() { __android_log_set_minimum_priority(ANDROID_LOG_UNKNOWN); }

}  // namespace

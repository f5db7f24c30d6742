#include <android/log.h>
#include <gtest/gtest.h>

#include <cstdarg>

#include "support/process.h"

// What no test captures is not worth seeing: these stand in front of liblog's functions and drop it.
extern "C" [[gnu::visibility("default")]] int __android_log_vprint(int, const char*, const char*, va_list) { return 1; }

extern "C" [[gnu::visibility("default")]] int __android_log_print(int, const char*, const char*, ...) { return 1; }

int main(int argc, char** argv) {
    tavo::test::run_role_if_asked();
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}

#include <gtest/gtest.h>

#include "support/process.h"

int main(int argc, char** argv) {
    tavo::test::run_role_if_asked();
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}

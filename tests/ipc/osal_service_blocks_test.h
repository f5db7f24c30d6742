// A service with room for 25 blocks, and what it says.
#pragma once

#include <climits>
#include <cstdio>
#include <vector>

#include "ipc/osal_service_test.h"

namespace tavo::test {

class OsalServiceBlocks : public OsalServiceTest {
protected:
    OsalServiceBlocks() { start(25, 25); }

    static testing::AssertionResult said(const LogCapture& log, const std::vector<ExpectedLine>& lines) {
        return logged_exactly(library_lines(log), lines);
    }
    // How many blocks the service says it has. Once per test: asking makes one.
    int count(LogCapture& log) {
        log.clear();
        service_->get_shared_mem(INT_MIN, 1);
        int blocks = -1;
        for (const auto& logged : log.lines()) {
            sscanf(logged.message().c_str(), "Current num of shared memory blocks = %d", &blocks);
        }
        return blocks;
    }
};

}  // namespace tavo::test

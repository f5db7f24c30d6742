// Puts the logging globals back after each test, so that a whole test program can run in one process.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <array>

#include "tavo_osal/log.h"

namespace tavo::test {

class LogState : public testing::Test {
protected:
    LogState() { std::copy(std::begin(g_acFilePath), std::end(g_acFilePath), path_.begin()); }
    ~LogState() override {
        g_uiMxEnabledLogLevel = level_;
        g_uiOutputStreamId = stream_;
        g_uiEnabledModuleMask = mask_;
        std::copy(path_.begin(), path_.end(), g_acFilePath);
        g_fpLogCallback = callback_;
        g_pvCallbackParam = param_;
        g_uiPerformance = performance_;
        g_uiEnvValueRead = env_read_;
    }

private:
    const uint32_t level_ = g_uiMxEnabledLogLevel;
    const uint32_t stream_ = g_uiOutputStreamId;
    const uint32_t mask_ = g_uiEnabledModuleMask;
    std::array<TAVO_CHAR, sizeof g_acFilePath> path_ = {};
    const TAVO_LogCallback callback_ = g_fpLogCallback;
    void* const param_ = g_pvCallbackParam;
    const uint32_t performance_ = g_uiPerformance;
    const uint32_t env_read_ = g_uiEnvValueRead;
};

}  // namespace tavo::test

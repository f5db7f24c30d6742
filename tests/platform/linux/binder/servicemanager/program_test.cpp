// The service manager as a program.
#include <gtest/gtest.h>
#include <stdio.h>
#include <sys/wait.h>

#include <cstdlib>
#include <cstring>
#include <string>

namespace {

struct Outcome {
    int status = -1;
    std::string said;
};

Outcome run(const std::string& command) {
    Outcome outcome;
    FILE* output = popen((command + " 2>&1").c_str(), "r");
    if (output == nullptr) return outcome;
    char text[256];
    while (fgets(text, sizeof text, output) != nullptr) {
        // Not what the log of the machine's own makes of it.
        if (strncmp(text, "servicemanager:", 15) == 0 || strncmp(text, "usage:", 6) == 0) outcome.said += text;
    }
    const int status = pclose(output);
    outcome.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return outcome;
}

const std::string kProgram =
    std::string(getenv("TAVO_EMULATOR") != nullptr ? getenv("TAVO_EMULATOR") : "") + " " + SERVICEMANAGER_PROGRAM;

TEST(ServiceManagerProgram, SaysInOneLineThatThereIsNoDevice) {
    const Outcome ran = run("BINDER_DRIVER= BINDER_DEVICE=/nowhere/binder " + kProgram + " --ready");
    EXPECT_EQ(ran.status, 1);
    EXPECT_EQ(ran.said, "servicemanager: the binder device cannot be opened (is the module binder_linux loaded?)\n");
}

TEST(ServiceManagerProgram, IsOfNoUseToSockets) {
    const Outcome ran = run("BINDER_DRIVER=socket " + kProgram);
    EXPECT_EQ(ran.status, 1);
    EXPECT_EQ(ran.said, "servicemanager: the driver that BINDER_DRIVER names needs no service manager\n");
}

TEST(ServiceManagerProgram, TellsHowItIsUsed) {
    EXPECT_EQ(run(kProgram + " --help").status, 0);
    const Outcome ran = run(kProgram + " --unknown");
    EXPECT_EQ(ran.status, 2);
    EXPECT_EQ(ran.said, "usage: servicemanager [--ready]\n");
}

}  // namespace

// The binder driver that the matrix makes fail: the one over sockets, with a fault in front of it.
#pragma once

namespace tavo::test::faults {

constexpr char kDriverTransact[] = "transact";
constexpr char kDriverOpen[] = "the driver's opening";

// Their places in platform_calls().
extern int g_driver_transact;
extern int g_driver_open;

// Has this process, and those it forks, open that driver. Before anything opens one.
void use_failing_driver();

}  // namespace tavo::test::faults

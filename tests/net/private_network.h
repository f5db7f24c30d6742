// A network of the test's own, where interfaces may go up and down without the machine noticing.
#pragma once

#include <string>

namespace tavo::test {

// Moves the calling thread, for good, into a network namespace that holds one loopback interface, which is down.
// The answer is empty, or the reason why this user may not.
std::string enter_private_network();

// The flags of an interface, IFF_UP and others, read without the library.
int interface_flags(const char* name);

// Gives up, for the calling thread, the right to configure networks.
void give_up_network_rights();

}  // namespace tavo::test

#define TAVO_ENTER_PRIVATE_NETWORK()                                                               \
    do {                                                                                           \
        const std::string reason = tavo::test::enter_private_network();                            \
        if (!reason.empty()) GTEST_SKIP() << "no network namespace of the test's own: " << reason; \
    } while (false)

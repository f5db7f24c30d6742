// A network of the test's own, where interfaces may go up and down without the machine noticing.
#pragma once

#include <string>

#include "net/sockets.h"

namespace tavo::test {

// While it lives, the calling thread is in a new network namespace, which holds one loopback interface that is
// down. There is no way back for users who may enter one only through a user namespace: their test's process stays.
class PrivateNetwork {
public:
    PrivateNetwork();
    ~PrivateNetwork();
    PrivateNetwork(const PrivateNetwork&) = delete;
    PrivateNetwork& operator=(const PrivateNetwork&) = delete;

    // Why this user may not enter one; empty when the thread is in it.
    const std::string& refusal() const { return refusal_; }

private:
    Descriptor before_;
    std::string refusal_;
};

// The flags of an interface, IFF_UP and others, read without the library.
int interface_flags(const char* name);

// Gives up, for the calling thread and for good, the right to configure networks.
void give_up_network_rights();

}  // namespace tavo::test

// Puts the rest of the test into a network of its own.
#define TAVO_ENTER_PRIVATE_NETWORK()                  \
    const tavo::test::PrivateNetwork private_network; \
    if (!private_network.refusal().empty())           \
    GTEST_SKIP() << "no network namespace of the test's own: " << private_network.refusal()

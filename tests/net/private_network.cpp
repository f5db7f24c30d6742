#include "net/private_network.h"

#include <fcntl.h>
#include <linux/capability.h>
#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace tavo::test {

PrivateNetwork::PrivateNetwork() : before_(open("/proc/thread-self/ns/net", O_RDONLY | O_CLOEXEC)) {
    // Root needs no user namespace; anybody else has the rights over a network only in one.
    if (unshare(CLONE_NEWNET) != 0 && unshare(CLONE_NEWUSER | CLONE_NEWNET) != 0) refusal_ = strerror(errno);
}

PrivateNetwork::~PrivateNetwork() { setns(before_.get(), CLONE_NEWNET); }

int interface_flags(const char* name) {
    const Descriptor any = make_socket(AF_INET, SOCK_DGRAM);
    ifreq request = {};
    snprintf(request.ifr_name, sizeof request.ifr_name, "%s", name);
    if (ioctl(any.get(), SIOCGIFFLAGS, &request) != 0) {
        perror("SIOCGIFFLAGS");
        abort();
    }
    return request.ifr_flags;
}

void give_up_network_rights() {
    __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct rights[2] = {};
    const bool read = syscall(SYS_capget, &header, rights) == 0;
    rights[0].effective &= ~(1U << CAP_NET_ADMIN);
    if (!read || syscall(SYS_capset, &header, rights) != 0) {
        perror("capset");
        abort();
    }
}

}  // namespace tavo::test

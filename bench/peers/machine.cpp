// What the figures were measured on and with. Nothing that tells one machine from another of its kind.
#include <gnu/libc-version.h>
#include <nng/nng.h>
#include <sched.h>
#include <spdlog/version.h>
#include <sys/utsname.h>
#include <zmq.h>

#include <boost/version.hpp>
#include <cstdlib>
#include <fstream>
#include <string>

#include "runner.h"

namespace tavo::peers {
namespace {

// The value of the first line of /proc/cpuinfo with this name.
std::string cpu_field(const std::string& name) {
    std::ifstream file("/proc/cpuinfo");
    for (std::string line; std::getline(file, line);) {
        const size_t colon = line.find(':');
        if (colon == std::string::npos || line.compare(0, name.size(), name) != 0) continue;
        return colon + 2 <= line.size() ? line.substr(colon + 2) : std::string();
    }
    return {};
}

int usable_cpus() {
    cpu_set_t set;
    return sched_getaffinity(0, sizeof set, &set) == 0 ? CPU_COUNT(&set) : 1;
}

std::string dotted(int major, int minor, int patch) {
    return std::to_string(major) + "." + std::to_string(minor) + "." + std::to_string(patch);
}

}  // namespace

nlohmann::json machine() {
    utsname name = {};
    uname(&name);
    // What follows the number names whoever built the kernel.
    const std::string release = name.release;
    const std::string kernel = release.substr(0, release.find_first_not_of("0123456789."));
    const std::string model = cpu_field("model name");
    double load[1] = {0};
    getloadavg(load, 1);
    return {
        {"cpu", model.empty() ? std::string(name.machine) : model},
        {"architecture", name.machine},
        {"cpus", usable_cpus()},
        {"kernel", std::string(name.sysname) + " " + kernel},
        {"virtual", cpu_field("flags").find(" hypervisor") != std::string::npos},
        {"load", load[0]},
    };
}

nlohmann::json versions() {
    int major = 0, minor = 0, patch = 0;
    zmq_version(&major, &minor, &patch);
    const std::string zmq = dotted(major, minor, patch);
    return {
        {"compiler",
#ifdef __clang__
         "Clang " __clang_version__
#else
         "GCC " __VERSION__
#endif
        },
        {"C library", std::string("glibc ") + gnu_get_libc_version()},
        {"Boost", dotted(BOOST_VERSION / 100000, BOOST_VERSION / 100 % 1000, BOOST_VERSION % 100)},
        {"ZeroMQ", zmq},
        {"nng", nng_version()},
        {"libsystemd", TAVO_LIBSYSTEMD_VERSION},
        {"spdlog", dotted(SPDLOG_VER_MAJOR, SPDLOG_VER_MINOR, SPDLOG_VER_PATCH)},
        {"TAVO OSAL", TAVO_VERSION},
    };
}

}  // namespace tavo::peers

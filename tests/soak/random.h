// Numbers that follow from a seed, the same on every machine.
#pragma once

#include <cstdint>

namespace tavo::soak {

constexpr uint64_t mixed(uint64_t value) {
    value = (value ^ (value >> 30)) * 0xbf58476d1ce4e5b9U;
    value = (value ^ (value >> 27)) * 0x94d049bb133111ebU;
    return value ^ (value >> 31);
}

class Random {
public:
    explicit Random(uint64_t seed) : state_(mixed(seed)) {}
    uint64_t next() { return mixed(state_ += 0x9e3779b97f4a7c15U); }
    // 0 to limit - 1
    unsigned below(unsigned limit) { return static_cast<unsigned>(next() % limit); }
    unsigned between(unsigned least, unsigned most) { return least + below(most - least + 1); }
    bool one_in(unsigned count) { return below(count) == 0; }

private:
    uint64_t state_;
};

}  // namespace tavo::soak

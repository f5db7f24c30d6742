// The report in the end: a page, and a few lines.
#pragma once

#include <string>

namespace tavo::soak {

class Coordinator;

class Report {
public:
    explicit Report(const Coordinator& run) : run_(run) {}
    std::string page() const;
    std::string summary() const;

private:
    std::string result() const;
    const Coordinator& run_;
};

}  // namespace tavo::soak

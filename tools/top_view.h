// What 'tavo top' shows: one look at the service's figures, compared with the one before.
#pragma once

#include <chrono>
#include <string>

#include "ipc/service_figures.h"
#include "tools/terminal.h"

namespace tavo::tool {

struct Look {
    ServiceFigures figures;
    std::chrono::steady_clock::time_point when;
};

// Lines of text. previous may be null: there are no rates then.
std::string show_look(const Look& look, const Look* previous, const Style& style);

// One line of JSON: the service's figures, with "change" for each queue, in bytes a second, where it is known.
std::string look_as_json(const std::string& service_json, const Look& look, const Look* previous);

}  // namespace tavo::tool

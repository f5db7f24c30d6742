// Colours for lines of the Android log.
#pragma once

#include <string>

#include "tools/terminal.h"

namespace tavo::tool {

// The priority's letter in a line as liblog writes it, in one form or the other; 0 where there is none.
char priority_in(const std::string& line);

// Passes a stream of lines on, whole ones coloured by their priority. The empty lines that a message with an end of its
// own leaves behind are dropped. Without colours, everything is passed on as it is.
class LogColours {
public:
    explicit LogColours(const Style& style) : style_(style) {}
    // What can be written now that these bytes have come.
    std::string take(const std::string& bytes);
    // What has come of a last line without an end.
    std::string rest();

private:
    std::string coloured(const std::string& line);

    const Style style_;
    std::string line_;
    bool after_log_line_ = false;
};

}  // namespace tavo::tool

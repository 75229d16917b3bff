/// What a test program's own process is kept from doing for real: log lines go into a list, sleeping
/// moves a virtual clock and returns at once. Children share both.
#pragma once

#include <string>
#include <vector>

namespace fake {

struct LogLine {
    int priority;
    std::string text;
};

std::vector<LogLine> logLines();
void forgetLogLines();

/// Seconds slept by this process and its children.
unsigned int secondsSlept();
void forgetSleep();

} // namespace fake

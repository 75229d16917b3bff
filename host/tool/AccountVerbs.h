/// The verbs "account" and "session".
#pragma once

#include <CLI/CLI.hpp>

/// Adds them. One that runs sets the program's exit status: 0 done, 1 failed.
void addAccountVerbs(CLI::App &app, int &status);

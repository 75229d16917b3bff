/// What other appliances are told of this one: "address".
#pragma once

#include <CLI/CLI.hpp>

/// Adds the verbs. One that runs sets the program's exit status: 0 done, 1 failed.
void addNodeVerbs(CLI::App &app, int &status);

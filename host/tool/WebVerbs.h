/// The verbs of the web server: "web" and "certificate".
#pragma once

#include <CLI/CLI.hpp>

/// Adds them. One that runs sets the program's exit status: 0 done, 1 failed.
void addWebVerbs(CLI::App &app, int &status);

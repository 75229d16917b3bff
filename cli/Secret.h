/// Reading secrets; they never come from the command line, which every user of the machine can read.
#pragma once

#include <string>

namespace cli {

/// A new secret is asked for twice.
enum class Asked {
    Once,
    Twice
};

/// The first line of a file ("-": the next line of standard input) or, without a file, what the user
/// types at the terminal for `what`. Throws Failure or UsageError.
std::string readSecret(const std::string &file, const std::string &what, Asked asked = Asked::Twice);

} // namespace cli

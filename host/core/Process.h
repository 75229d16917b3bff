/// Running a program and reading what it says.
#pragma once

#include <cstddef>
#include <spawn.h>
#include <string>
#include <vector>

namespace norvhost {

struct ProgramRun {
    std::vector<std::string> arguments;   ///< the program first: a path, or a name looked up in PATH; never a shell
    std::vector<std::string> environment; ///< "NAME=value" entries that replace or extend our own environment
    int timeout_seconds = 0;              ///< the program is killed after this long; 0 = no limit
    size_t output_limit = 4 << 20;        ///< bytes kept of each output; the rest is read and dropped
};

struct ProgramResult {
    int status = -1; ///< exit status, 128 + n when signal n ended it
    std::string output;
    std::string errors;
};

/// Runs a program with no input and waits for it. 0 when it ran, whatever its exit status; else
/// NORV_ERR_FILE_NOT_FOUND (no such program), NORV_ERR_TIMEOUT or another error code.
int runProgram(const ProgramRun &run, ProgramResult &result);

/// Attributes of a new process: whatever we ignore or block ourselves, it starts with the default signals.
class SpawnAttributes {
public:
    /// `flags` as of posix_spawnattr_setflags(), beside those of the signals.
    explicit SpawnAttributes(int flags = 0);
    SpawnAttributes(const SpawnAttributes &) = delete;
    ~SpawnAttributes() { posix_spawnattr_destroy(&attributes); }

    const posix_spawnattr_t *get() const { return &attributes; }

private:
    posix_spawnattr_t attributes;
};

/// An argument vector or an environment of texts, which must stay.
std::vector<char *> pointers(std::vector<std::string> &texts);

/// The last line of a program's messages, for a reason.
std::string lastLine(const std::string &text);

} // namespace norvhost

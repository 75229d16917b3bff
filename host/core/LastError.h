/// The human reason behind an error code.
///
/// A platform function returns a number only. Whoever finds a failure records why, once, at the step
/// that failed; callers above pass the code on unchanged.
#pragma once

#include <string>

namespace norvhost {

/// Records the reason for this thread and returns `code`. Never put a secret into it.
int fail(int code, const char *format, ...) __attribute__((format(printf, 2, 3)));

/// As fail() for a failed system call: the errno value chooses the code where it says more than
/// `code` does (no space, no permission or read-only, no memory), and its text ends the reason.
int failErrno(int code, int errnum, const char *format, ...) __attribute__((format(printf, 3, 4)));

/// This thread's latest reason, as iscsi_host_last_error().
const char *lastError();

/// The code that went with it.
int lastErrorCode();

/// What failed last stays that, whatever fails while this lives: for cleaning up after a failure.
class KeptError {
public:
    KeptError() : reason(lastError()), code(lastErrorCode()) {}
    KeptError(const KeptError &) = delete;
    ~KeptError() { fail(code, "%s", reason.c_str()); }

private:
    const std::string reason;
    const int code;
};

} // namespace norvhost

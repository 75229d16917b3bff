/// Core helpers: programs.
#pragma once

#include "platform/sdk.h"

NORV_BEGIN_DECLS

/// Runs a program with up to four arguments, the first null ending them, without a shell, and waits
/// for it. Returns its exit status, 128 + n when signal n ended it, -1 when it could not be run.
NORV_API int NLIBCExec(const char *program, const char *arg1, const char *arg2, const char *arg3, const char *arg4);

NORV_END_DECLS

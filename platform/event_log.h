/// The system event log, which administrators read.
#pragma once

#include "platform/sdk.h"

NORV_BEGIN_DECLS

/// Writes the event `number` with up to four texts that fill its message; null for none. `scope` is
/// the log that it goes to (1: the system's, 9: the snapshot and replication log), `level` its
/// gravity (1: information, 2: warning, 3: error). 0 on success.
NORV_API int NORVLogSet1(int scope, int level, unsigned int number, const char *text1, const char *text2,
                         const char *text3, const char *text4);

NORV_END_DECLS

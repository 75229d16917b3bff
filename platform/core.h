/// Core helpers: programs, processes, string lists, key-value files.
#pragma once

#include "platform/sdk.h"

/// A list of texts; `count` may be read, the rest is the platform's.
typedef struct NLIBC_SZ_LIST {
    int count;
    int capacity;
    char **texts;
} NLIBC_SZ_LIST;

NORV_BEGIN_DECLS

/// Runs a program with up to four arguments, the first null ending them, without a shell, and waits
/// for it. Returns its exit status, 128 + n when signal n ended it, -1 when it could not be run.
NORV_API int NLIBCExec(const char *program, const char *arg1, const char *arg2, const char *arg3, const char *arg4);

/// Forks a child that the parent never waits for. Returns the child's ID in the parent, 0 in the
/// child, negative on failure.
NORV_API int NLIBCProcForkChildNoWait(void);

/// A list with room for `capacity` texts, null on failure; freed with NLIBCSzListFree, which takes
/// null.
NORV_API NLIBC_SZ_LIST *NLIBCSzListAlloc(int capacity);
NORV_API void NLIBCSzListFree(NLIBC_SZ_LIST *list);
/// Appends a copy of the text. Returns the new count, negative on failure.
NORV_API int NLIBCSzListPush(NLIBC_SZ_LIST *list, const char *text);
/// The text at `index`, owned by the list; null when there is none.
NORV_API const char *NLIBCSzListGet(const NLIBC_SZ_LIST *list, int index);

/// 1 when the path exists, else 0.
NORV_API int NLIBCFileExist(const char *path);

/// Reads a key of a file of key=value lines (values may be quoted) into `value` of `size` bytes.
/// Returns 1 when found, 0 when the file has no such key, negative on failure.
NORV_API int NLIBCFileGetKeyValue(const char *path, const char *key, char *value, int size);

/// 1 when the key's value in such a file equals `value` (case-sensitive when the last argument is
/// not 0), 0 when it does not, negative on failure.
NORV_API int NLIBCFileCheckKeyValue(const char *path, const char *key, const char *value, int case_sensitive);

NORV_END_DECLS

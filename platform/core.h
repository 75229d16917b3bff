/// Core helpers: programs, processes, string lists and hashes, key-value and section files, file locks.
#pragma once

#include "platform/sdk.h"

/// A list of texts; `count` may be read, the rest is the platform's.
typedef struct NLIBC_SZ_LIST {
    int count;
    int capacity;
    char **texts;
} NLIBC_SZ_LIST;

/// A hash of texts; its inside is the platform's.
typedef struct NLIBC_SZ_HASH NLIBC_SZ_HASH;

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

/// Creates a folder and its missing parents; the library passes 0, 1, -1, -1, -1 for the rest: mode
/// and owners as the platform sees fit. Negative on failure.
NORV_API int NORVFSMkdirP(const char *path, int flags, int parents, int uid, int gid, int mode);

/// 1 when the path exists, else 0.
NORV_API int NLIBCFileExist(const char *path);

/// Reads a key of a file of key=value lines (values may be quoted) into `value` of `size` bytes.
/// Returns 1 when found, 0 when the file has no such key, negative on failure.
NORV_API int NLIBCFileGetKeyValue(const char *path, const char *key, char *value, int size);

/// 1 when the key's value in such a file equals `value` (case-sensitive when the last argument is
/// not 0), 0 when it does not, negative on failure.
NORV_API int NLIBCFileCheckKeyValue(const char *path, const char *key, const char *value, int case_sensitive);

/// Creates the file, empty, when it does not exist. Negative on failure.
NORV_API int NLIBCFileTouch(const char *path);

/// A hash of about `capacity` texts, null on failure; freed with NLIBCSzHashFree, which takes null.
/// Keys keep the order in which they were first set.
NORV_API NLIBC_SZ_HASH *NLIBCSzHashAlloc(int capacity);
NORV_API void NLIBCSzHashFree(NLIBC_SZ_HASH *hash);
/// Sets a copy of the value. Negative on failure.
NORV_API int NLIBCSzHashSetValue(NLIBC_SZ_HASH *hash, const char *key, const char *value);
/// The value, owned by the hash; null when there is none.
NORV_API const char *NLIBCSzHashGetValue(const NLIBC_SZ_HASH *hash, const char *key);

// Section files: sections with a name, each with key lines. `line_format` writes one key line from
// the key and the value ("\t%s=%s\n"). A change is whole or not made.

/// Adds the section's keys to the hash. 1 when found, 0 when there is no such section, negative on
/// failure.
NORV_API int NLIBCFileGetSection(const char *path, const char *section, NLIBC_SZ_HASH *keys);
/// Appends a section; positive on success.
NORV_API int NLIBCFileAddSection(const char *path, const char *section, const NLIBC_SZ_HASH *keys,
                                 const char *line_format);
/// Replaces a section and renames it; positive on success.
NORV_API int NLIBCFileSetSection(const char *path, const char *section, const char *new_name, const NLIBC_SZ_HASH *keys,
                                 const char *line_format);
/// Removes a section, if there. Negative on failure.
NORV_API int NLIBCFileRemoveSection(const char *path, const char *section);
/// Appends the names of all sections to the list. Their count, negative on failure.
NORV_API int NLIBCFileEnumSection(const char *path, NLIBC_SZ_LIST *names);

/// Takes the lock of a file, exclusive when `exclusive` is not 0, without waiting; the file is made
/// when it does not exist, links are not followed and files of other users refused. Non-zero on
/// success, with the descriptor, which a forked child inherits, in `*fd`.
NORV_API int NLIBCFileLockByFile(const char *path, int exclusive, int *fd);
/// The same, waiting at most so many seconds; 1 on success.
NORV_API int NLIBCFileLockTimeByFile(const char *path, int exclusive, int seconds, int *fd);
/// Releases the lock and closes the descriptor; 0 on failure.
NORV_API int NLIBCFileUnlockByFile(int fd);

/// The number of the last failure of a core helper in this thread.
NORV_API int NLIBCErrGet(void);

NORV_END_DECLS

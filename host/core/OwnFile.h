/// Files at fixed paths where somebody else may have put something: links are not followed, and what is not ours
/// alone is refused.
///
/// Each function returns 0 or a negative errno value, its reason recorded.
#pragma once

#include "host/core/FileDescriptor.h"

#include <string>
#include <sys/types.h>

namespace norvhost {

/// A file by its folder, so that nobody exchanges the folder in between.
struct FilePlace {
    FileDescriptor folder;
    std::string name;
    std::string path; ///< for reasons
};

/// The folder must be no link, be ours or root's, and others must not write to it unless it is sticky, as /tmp is.
int openPlace(const char *path, FilePlace &place);

/// Opens a regular file of ours that has one name only; with O_CREAT it is made, mode 0600, when it is missing.
int openOwnFile(const FilePlace &place, int flags, FileDescriptor &file);

/// Makes a folder and its missing parents; the folder, also one that was there, must be ours and no link, and
/// others must not write to it.
int makeOwnFolder(const char *path);

/// Whether somebody holds the lock that NLIBCFileLockByFile() takes; a file that is not there has none. Asked without
/// taking it, which would refuse whoever wants it just then.
int fileLockHeld(const char *path, bool &held);

} // namespace norvhost

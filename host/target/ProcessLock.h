/// Which process is a daemon: the one that holds a POSIX lock on the daemon's lock file. The kernel
/// answers, so that no file with an old process ID can name somebody else's process.
#pragma once

#include <string>
#include <sys/types.h>

namespace norvhost {

/// The process that holds the lock, 0 when none does.
pid_t processLockHolder(const std::string &path);

/// Takes the lock for the rest of this process's life.
int holdProcessLock(const std::string &path);

/// The lock file of iscsi-portald.
std::string portalLockPath();

} // namespace norvhost

#include "host/target/ProcessLock.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "platform/error.h"

#include <cerrno>
#include <fcntl.h>

namespace norvhost {
namespace {

/// As tgtd locks its lock file, with lockf().
struct flock firstByte()
{
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    lock.l_len = 1;
    return lock;
}

} // namespace

pid_t processLockHolder(const std::string &path)
{
    const FileDescriptor file(open(path.c_str(), O_RDWR | O_CLOEXEC));
    struct flock lock = firstByte();
    if (!file || fcntl(file.get(), F_GETLK, &lock) != 0 || lock.l_type == F_UNLCK)
        return 0;
    return lock.l_pid;
}

int holdProcessLock(const std::string &path)
{
    // Never closed: closing any descriptor of the file drops a POSIX lock.
    const int fd = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    struct flock lock = firstByte();
    if (fd < 0 || fcntl(fd, F_SETLK, &lock) != 0)
        return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot lock %s", path.c_str());
    return 0;
}

std::string portalLockPath()
{
    return runFolder() + "/portald.lock";
}

} // namespace norvhost

/// Locks of files at fixed paths. The kernel drops one when the last process that holds its descriptor ends; a child
/// made by fork() holds it too.
#include "host/core/LastError.h"
#include "host/core/OwnFile.h"
#include "platform/core.h"
#include "platform/error.h"

#include <cerrno>
#include <chrono>
#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>

using namespace norvhost;

namespace {

using Clock = std::chrono::steady_clock;

constexpr int ask_again_ms = 10;

/// Who asks without waiting is refused by what works, not by who only reads: every reader of the node configuration
/// holds its lock for so long as that takes.
constexpr auto for_a_moment = std::chrono::milliseconds(200);

struct flock wholeFile(int type)
{
    struct flock lock = {};
    lock.l_type = static_cast<short>(type);
    lock.l_whence = SEEK_SET;
    return lock;
}

bool setLock(int fd, int type)
{
    struct flock lock = wholeFile(type);
    return fcntl(fd, F_OFD_SETLK, &lock) == 0;
}

/// Whether the path still names the file: who cleans up /tmp may have removed it before it was locked.
bool isStillThere(const FilePlace &place, int fd)
{
    struct stat opened, named;
    return fstat(fd, &opened) == 0 &&
           fstatat(place.folder.get(), place.name.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 &&
           opened.st_dev == named.st_dev && opened.st_ino == named.st_ino;
}

/// 0, -EAGAIN when another process holds the lock, or another negative errno value.
int tryLock(const FilePlace &place, int type, FileDescriptor &locked)
{
    FileDescriptor file;
    do {
        if (int err = openOwnFile(place, O_RDWR | O_CREAT, file))
            return err;
        if (!setLock(file.get(), type)) {
            const int errnum = errno == EACCES ? EAGAIN : errno;
            failErrno(NORV_ERR_LOCK_FILE, errnum, "cannot lock %s", place.path.c_str());
            return -errnum;
        }
    } while (!isStillThere(place, file.get()));
    // A detached child replaces its standard descriptors; a caller without them would lose the lock there.
    locked.reset(fcntl(file.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    return locked ? 0 : -errno;
}

/// 1 on success, else 0.
int lockWithin(const char *path, int exclusive, std::chrono::milliseconds limit, int *fd)
{
    if (!fd) {
        fail(NORV_ERR_NULL_POINTER, "no place for the descriptor of a lock");
        return 0;
    }
    FilePlace place;
    if (openPlace(path, place) != 0)
        return 0;
    const Clock::time_point end = Clock::now() + limit;
    FileDescriptor file;
    int err;
    while ((err = tryLock(place, exclusive ? F_WRLCK : F_RDLCK, file)) == -EAGAIN && Clock::now() < end)
        poll(nullptr, 0, ask_again_ms);
    if (err)
        return 0;
    *fd = file.release();
    return 1;
}

} // namespace

int norvhost::fileLockHeld(const char *path, bool &held)
{
    FilePlace place;
    FileDescriptor file;
    struct flock lock = wholeFile(F_WRLCK);
    int err = openPlace(path, place);
    if (!err)
        err = openOwnFile(place, O_RDWR, file);
    if (!err && fcntl(file.get(), F_OFD_GETLK, &lock) != 0) {
        err = -errno;
        failErrno(NORV_ERR_LOCK_FILE, errno, "cannot ask for the lock %s", path);
    }
    held = !err && lock.l_type != F_UNLCK;
    return err == -ENOENT ? 0 : err;
}

int NLIBCFileLockByFile(const char *path, int exclusive, int *fd)
{
    return lockWithin(path, exclusive, for_a_moment, fd);
}

int NLIBCFileLockTimeByFile(const char *path, int exclusive, int seconds, int *fd)
{
    return lockWithin(path, exclusive, std::chrono::seconds(seconds > 0 ? seconds : 0), fd);
}

int NLIBCFileUnlockByFile(int fd)
{
    const FileDescriptor file(fd);
    // Closing alone would leave the lock with a child that was forked meanwhile.
    if (file && setLock(file.get(), F_UNLCK))
        return 1;
    failErrno(NORV_ERR_LOCK_FILE, errno, "cannot release a lock");
    return 0;
}

#include "host/core/Lock.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>

namespace norvhost {
namespace {

struct flock wholeFile(int type)
{
    struct flock lock = {};
    lock.l_type = static_cast<short>(type);
    lock.l_whence = SEEK_SET;
    return lock;
}

std::string lockFolder()
{
    return runFolder() + "/lock";
}

std::string lunLockPath(int lid)
{
    return lockFolder() + "/lun-" + std::to_string(lid);
}

int openLockFile(const std::string &path, FileDescriptor &file)
{
    file.reset(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    if (!file && errno == ENOENT) {
        if (int err = makeFolder(lockFolder()))
            return err;
        file.reset(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    }
    if (!file)
        return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot open the lock file %s", path.c_str());
    return 0;
}

/// Opens a LUN's lock file for asking; a file that does not exist was never locked and stays away.
int askLock(int lid, FileDescriptor &file, bool &held)
{
    held = false;
    const std::string path = lunLockPath(lid);
    file.reset(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!file)
        return errno == ENOENT ? 0 : failErrno(NORV_ERR_LOCK_FILE, errno, "cannot open the lock file %s", path.c_str());
    struct flock lock = wholeFile(F_WRLCK);
    if (fcntl(file.get(), F_OFD_GETLK, &lock) != 0)
        return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot ask for the lock %s", path.c_str());
    held = lock.l_type != F_UNLCK;
    return 0;
}

/// Leaves `file` empty when another holds the lock and the command does not wait.
int lockNamed(const std::string &name, int command, FileDescriptor &file)
{
    const std::string path = lockFolder() + "/" + name;
    FileDescriptor opened;
    if (int err = openLockFile(path, opened))
        return err;
    struct flock lock = wholeFile(F_WRLCK);
    while (fcntl(opened.get(), command, &lock) != 0) {
        if (command == F_OFD_SETLK && (errno == EAGAIN || errno == EACCES))
            return 0;
        if (errno != EINTR)
            return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot lock %s", path.c_str());
    }
    file = std::move(opened);
    return 0;
}

} // namespace

int LunLock::take(int lid, int state)
{
    FileDescriptor opened;
    const std::string path = lunLockPath(lid);
    if (int err = openLockFile(path, opened))
        return err;
    struct flock lock = wholeFile(F_WRLCK);
    if (fcntl(opened.get(), F_OFD_SETLK, &lock) != 0) {
        if (errno == EAGAIN || errno == EACCES)
            return fail(NORV_ERR_LUN_LOCKED, "another action is working on LUN %d", lid);
        return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot lock %s", path.c_str());
    }
    file = std::move(opened);
    become(state);
    return 0;
}

void LunLock::tell(int percent)
{
    // Fixed width, so that one write replaces what stood there.
    char text[32];
    const int length = snprintf(text, sizeof text, "%3d %4d\n", action_state, percent);
    // Display only: an action does not fail because its progress cannot be told.
    (void)!pwrite(file.get(), text, static_cast<size_t>(length), 0);
}

void LunLock::become(int state)
{
    action_state = state;
    tell(-1);
}

int lunLockHeld(int lid, bool &held)
{
    FileDescriptor file;
    return askLock(lid, file, held);
}

int lunLockAction(int lid, LunAction &action)
{
    FileDescriptor file;
    bool held;
    if (int err = askLock(lid, file, held))
        return err;
    action = LunAction();
    if (!held)
        return 0;
    char text[32] = {};
    if (pread(file.get(), text, sizeof text - 1, 0) <= 0 || sscanf(text, "%d %d", &action.state, &action.percent) != 2)
        action.state = 0; // taken this moment, not yet told for what
    return 0;
}

int NamedLock::take(const std::string &name)
{
    return lockNamed(name, F_OFD_SETLKW, file);
}

int NamedLock::tryTake(const std::string &name)
{
    return lockNamed(name, F_OFD_SETLK, file);
}

} // namespace norvhost

#include "host/core/Lock.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <fcntl.h>
#include <poll.h>
#include <sys/random.h>

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

std::string snapshotLockPath(int lid, int snap_id)
{
    return lockFolder() + "/snap-" + std::to_string(lid) + "-" + std::to_string(snap_id);
}

/// A lock file holds three fields of fixed place and width, so that each is replaced by one write: the action as
/// "<state> <percent>" (state 0 once it ended by itself), the holder's token, and the token of the holding that
/// is to stop.
constexpr off_t action_offset = 0, token_offset = 16, stop_offset = 48;
constexpr size_t token_size = 16;

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

/// Opens a lock file for asking; a file that does not exist was never locked and stays away.
int askLock(const std::string &path, int mode, FileDescriptor &file, bool &held)
{
    held = false;
    file.reset(open(path.c_str(), mode | O_CLOEXEC));
    if (!file)
        return errno == ENOENT ? 0 : failErrno(NORV_ERR_LOCK_FILE, errno, "cannot open the lock file %s", path.c_str());
    struct flock lock = wholeFile(F_WRLCK);
    if (fcntl(file.get(), F_OFD_GETLK, &lock) != 0)
        return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot ask for the lock %s", path.c_str());
    held = lock.l_type != F_UNLCK;
    return 0;
}

LunAction readAction(const FileDescriptor &file)
{
    LunAction action;
    char text[token_offset + 1] = {};
    if (pread(file.get(), text, token_offset, action_offset) <= 0 ||
        sscanf(text, "%d %d", &action.state, &action.percent) != 2)
        action = LunAction(); // taken this moment, not yet told for what
    return action;
}

std::string readToken(const FileDescriptor &file, off_t offset)
{
    char text[token_size];
    const ssize_t length = pread(file.get(), text, sizeof text, offset);
    return std::string(text, length < 0 ? 0 : static_cast<size_t>(length));
}

std::string newToken()
{
    uint64_t number = 0;
    while (getrandom(&number, sizeof number, 0) != sizeof number)
        ;
    char text[token_size + 1];
    snprintf(text, sizeof text, "%016" PRIx64, number);
    return text;
}

int requestStop(const std::string &path)
{
    FileDescriptor file;
    bool held;
    if (int err = askLock(path, O_RDWR, file, held))
        return err;
    if (!held)
        return 0;
    const std::string token = readToken(file, token_offset);
    if (pwrite(file.get(), token.data(), token.size(), stop_offset) != static_cast<ssize_t>(token.size()))
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot write to %s", path.c_str());
    return 0;
}

/// Asks again and again instead of queueing for the lock: a waiter that got it, for however short, would make
/// another action's attempt fail.
int waitForLock(const std::string &path, int limit)
{
    using namespace std::chrono;
    constexpr auto longest_pause = 50ms;
    const auto deadline = steady_clock::now() + seconds(limit);
    for (auto pause = 1ms;; pause = std::min(2 * pause, longest_pause)) {
        FileDescriptor file;
        bool held;
        if (int err = askLock(path, O_RDONLY, file, held))
            return err;
        if (!held)
            return 0;
        if (limit > 0 && steady_clock::now() >= deadline)
            return fail(NORV_ERR_TIMEOUT, "an action still holds %s after %d seconds", path.c_str(), limit);
        poll(nullptr, 0, static_cast<int>(pause.count()));
    }
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

ActionLock &ActionLock::operator=(ActionLock &&other) noexcept
{
    release();
    file = std::move(other.file);
    action_state = other.action_state;
    unfinished = other.unfinished;
    token = std::move(other.token);
    return *this;
}

int ActionLock::take(const std::string &path, int state, int busy, const std::string &owner)
{
    FileDescriptor opened;
    if (int err = openLockFile(path, opened))
        return err;
    struct flock lock = wholeFile(F_WRLCK);
    if (fcntl(opened.get(), F_OFD_SETLK, &lock) != 0) {
        if (errno == EAGAIN || errno == EACCES)
            return fail(busy, "another action is working on %s", owner.c_str());
        return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot lock %s", path.c_str());
    }
    release();
    file = std::move(opened);
    unfinished = readAction(file).state != 0;
    token = newToken();
    if (pwrite(file.get(), token.data(), token.size(), token_offset) != static_cast<ssize_t>(token.size()))
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot write to %s", path.c_str());
    become(state);
    return 0;
}

void ActionLock::tell(int percent)
{
    char text[token_offset];
    const int length = snprintf(text, sizeof text, "%3d %4d\n", action_state, percent);
    // Display only: an action does not fail because its progress cannot be told.
    (void)!pwrite(file.get(), text, static_cast<size_t>(length), action_offset);
}

void ActionLock::become(int state)
{
    action_state = state;
    tell(-1);
}

bool ActionLock::stopRequested() const
{
    return readToken(file, stop_offset) == token;
}

void ActionLock::release()
{
    if (!file)
        return;
    become(0);
    file.reset();
}

int LunLock::take(int lid, int state)
{
    return ActionLock::take(lunLockPath(lid), state, NORV_ERR_LUN_LOCKED, "LUN " + std::to_string(lid));
}

int SnapshotLock::take(int lid, int snap_id, int state)
{
    const std::string owner = "snapshot " + std::to_string(snap_id) + " of LUN " + std::to_string(lid);
    return ActionLock::take(snapshotLockPath(lid, snap_id), state, NORV_ERR_SNAPSHOT_LOCKED, owner);
}

int lunLockHeld(int lid, bool &held)
{
    FileDescriptor file;
    return askLock(lunLockPath(lid), O_RDONLY, file, held);
}

int lunLockAction(int lid, LunAction &action)
{
    FileDescriptor file;
    bool held;
    if (int err = askLock(lunLockPath(lid), O_RDONLY, file, held))
        return err;
    action = held ? readAction(file) : LunAction();
    return 0;
}

int snapshotLockHeld(int lid, int snap_id, bool &held)
{
    FileDescriptor file;
    return askLock(snapshotLockPath(lid, snap_id), O_RDONLY, file, held);
}

int requestLunStop(int lid)
{
    return requestStop(lunLockPath(lid));
}

int requestSnapshotStop(int lid, int snap_id)
{
    return requestStop(snapshotLockPath(lid, snap_id));
}

int waitForLunLock(int lid, int limit)
{
    return waitForLock(lunLockPath(lid), limit);
}

int waitForSnapshotLock(int lid, int snap_id, int limit)
{
    return waitForLock(snapshotLockPath(lid, snap_id), limit);
}

int namedLockHeld(const std::string &name, bool &held)
{
    FileDescriptor file;
    return askLock(lockFolder() + "/" + name, O_RDONLY, file, held);
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

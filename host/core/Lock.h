/// Locks between processes.
///
/// Open-file-description locks: the kernel drops one when its last holder ends, however it ends, and
/// asking who holds it takes nothing. Lock files are never removed, so that two processes always mean
/// the same file.
#pragma once

#include "host/core/FileDescriptor.h"

#include <string>

namespace norvhost {

/// What a LUN's lock holder is doing; the states are platform/iscsi_lun.h's NORV_LUN_... (0 = nothing).
struct LunAction {
    int state = 0;
    int percent = -1; ///< 0 to 100, -1 = cannot tell
};

/// A lock of an action, held until the object ends. A child made by fork() holds it too.
class ActionLock {
public:
    ActionLock() = default;
    ActionLock(ActionLock &&) = default;
    ActionLock &operator=(ActionLock &&other) noexcept;
    ~ActionLock() { release(); }

    /// Tells how far the action is, 0 to 100; -1 = cannot tell.
    void tell(int percent);

    /// The action goes on as another one.
    void become(int state);

    /// Whether the holder before this one was killed: what it left is to be put right.
    bool foundUnfinished() const { return unfinished; }

    /// Whether somebody wants this action to stop (see requestStop).
    bool stopRequested() const;

    void release();
    /// After a fork() that made the action the child's: lets go of it without saying that it ended.
    void leaveToChild() { file.reset(); }
    bool held() const { return static_cast<bool>(file); }

protected:
    /// Takes the lock without waiting and writes the action beside it. `busy` is returned when another holds it.
    int take(const std::string &path, int state, int busy, const std::string &owner);

private:
    FileDescriptor file;
    int action_state = 0;
    bool unfinished = false;
    std::string token; ///< names this holding of the lock
};

/// The lock of one LUN ID.
class LunLock : public ActionLock {
public:
    /// 0, NORV_ERR_LUN_LOCKED when another action holds it, else an error code.
    int take(int lid, int state);
};

/// The lock of one snapshot, for actions that need it to stay as it is. Whoever takes it with its LUN's lock takes
/// that one first.
class SnapshotLock : public ActionLock {
public:
    /// 0, NORV_ERR_SNAPSHOT_LOCKED when another action holds it, else an error code.
    int take(int lid, int snap_id, int state);
};

/// Whether a LUN's lock is held now, by whichever process, and for what.
int lunLockHeld(int lid, bool &held);
int lunLockAction(int lid, LunAction &action);
int snapshotLockHeld(int lid, int snap_id, bool &held);

/// Asks the action that holds the lock now to stop; without effect on any later one, and 0 when there is none. The
/// action decides whether it can.
int requestLunStop(int lid);
int requestSnapshotStop(int lid, int snap_id);

/// Wait until nobody holds the lock, `limit` in seconds, 0 for none: NORV_ERR_TIMEOUT when it is still held then.
int waitForLunLock(int lid, int limit);
int waitForSnapshotLock(int lid, int snap_id, int limit);

/// The lock of that name in the run folder, held until the object ends.
class NamedLock {
public:
    /// Waits for it.
    int take(const std::string &name);
    /// Does not wait: 0 also when another holds it, which held() tells.
    int tryTake(const std::string &name);

    bool held() const { return static_cast<bool>(file); }
    /// Lets go of it; after a fork() it stays the child's.
    void leaveToChild() { file.reset(); }

private:
    FileDescriptor file;
};

/// Whether the lock of that name is held now, by whichever process.
int namedLockHeld(const std::string &name, bool &held);

} // namespace norvhost

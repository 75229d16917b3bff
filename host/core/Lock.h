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

/// The lock of one LUN ID, held until the object ends. A child made by fork() holds it too.
class LunLock {
public:
    /// Takes the lock without waiting and writes the action beside it. 0, NORV_ERR_LUN_LOCKED when
    /// another action holds it, else an error code.
    int take(int lid, int state);

    /// Tells how far the action is, 0 to 100; -1 = cannot tell.
    void tell(int percent);

    /// The action goes on as another one.
    void become(int state);

    void release() { file.reset(); }
    bool held() const { return static_cast<bool>(file); }

private:
    FileDescriptor file;
    int action_state = 0;
};

/// Whether a LUN's lock is held now, by whichever process, and for what.
int lunLockHeld(int lid, bool &held);
int lunLockAction(int lid, LunAction &action);

/// The lock of that name in the run folder, held until the object ends.
class NamedLock {
public:
    /// Waits for it.
    int take(const std::string &name);
    /// Does not wait: 0 also when another holds it, which held() tells.
    int tryTake(const std::string &name);

    bool held() const { return static_cast<bool>(file); }

private:
    FileDescriptor file;
};

} // namespace norvhost

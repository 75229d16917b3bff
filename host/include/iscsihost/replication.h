/// The receiving side of a sending, as its peer asks for it, and what became of a sending.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <iscsihost/sink.h>
#include <string>

namespace iscsihost {

/// A state that a peer wants to send to the destination LUN of a task.
struct Incoming {
    std::string version; ///< UUID of the state
    std::string base;    ///< version that the peer takes as what the LUN holds; empty for none
    std::string name;    ///< of the peer's snapshot, which the one that is taken here of the state shall have too
};

/// What the LUN holds instead of or besides the base.
enum class Holding {
    zeros,   ///< nothing but zeros
    base,    ///< the base
    unknown, ///< something: everything has to be sent, zeros too
};

struct Reception {
    Holding holding = Holding::unknown;
    uint64_t offset = 0; ///< what lies below it has arrived before
    Sink sink;           ///< where the rest goes, open
};

/// Makes the destination LUN ready: it holds the base, set back to the snapshot of it where needed, or the reception
/// says what else, and opens it as a sink. From now on its current version is `incoming.version` and differs from its
/// base. The state that arrived before stays as a snapshot.
/// NORV_ERR_NOT_A_DESTINATION_TASK, and the codes of openSink() and of taking a snapshot.
ISCSI_HOST_API int beginReception(const std::string &task_uuid, const Incoming &incoming, Reception &reception);

/// Shuts out a sender that was killed, so that its LUN is not locked by it any more. NORV_ERR_LUN_TYPE when a
/// destination's LUN is no sink: it receives nothing any more.
ISCSI_HOST_API int breakReception(const std::string &task_uuid);

/// What lies below `offset` has arrived in the sink of this name and is flushed; `moved` bytes of `total`.
/// NORV_ERR_BASE_SNAPSHOT when another state is arriving, NORV_ERR_NO_SUCH_TARGET when that sink is closed.
ISCSI_HOST_API int noteReception(const std::string &task_uuid, const std::string &version, const std::string &sink_iqn,
                                 uint64_t offset, uint64_t moved, uint64_t total);

/// All of it has arrived, `total` bytes: it is flushed, the sink of this name is closed, and the version is the LUN's
/// base. Nothing is done when that was told before. Codes as above, and those of closeSink().
ISCSI_HOST_API int endReception(const std::string &task_uuid, const std::string &version, const std::string &sink_iqn,
                                uint64_t total);

/// The snapshot of that time which a destination LUN has of the state that it holds: whoever did not hear that it was
/// taken asks again. Empty when there is none.
ISCSI_HOST_API int findArrivedSnapshot(const std::string &lun_uuid, int64_t snapshot_time, std::string &uuid);

/// Bytes that have arrived so far of the state that arrives at a LUN; 0 when none does.
ISCSI_HOST_API int arrivedBytes(const std::string &lun_uuid, uint64_t &bytes);

/// Whether something is done with a task, whose lock file is given.
ISCSI_HOST_API int isTaskLocked(const std::string &lock_file, bool &is_locked);

/// Why the latest sending of a task failed, in words; empty when it did not, or when its code says all.
ISCSI_HOST_API int sendingFailure(const std::string &task_uuid, std::string &reason);

} // namespace iscsihost

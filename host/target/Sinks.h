/// Sinks: LUNs that a peer writes through a target of their own, which only the peer can enter and nobody is shown.
///
/// The target exists while the sink is open, on the read-write daemon alone. Its name is a new one at each opening, so
/// that whoever opened before is shut out for good. Its log-in is derived from this appliance's ROD key, which the peer
/// knows, and never travels.
#pragma once

#include "host/storage/LunStore.h"
#include "host/target/TargetStore.h"
#include "iscsihost/sink.h"

#include <string>

namespace norvhost {

/// Who enters a sink's target, and how both sides prove who they are.
struct SinkLogIn {
    std::string initiator;
    std::string user, secret;
    std::string mutual_user, mutual_secret;
};

/// For the sink LUN of the appliance that has this ROD key: HMAC-SHA256 of a label and the LUN's UUID, of which 192
/// bits are used, because a CHAP secret of tgtd has at most 63 characters.
SinkLogIn sinkLogIn(const std::string &rod_key, const std::string &lun_uuid);

/// The LUN number of the LUN in its sink's target.
constexpr int sink_lun_number = 1;

/// Target IDs of sinks in the daemons; those of the store's targets are lower.
int sinkTid(int lid);
bool isSinkTid(int tid);

// Each returns 0 or an error code. Outputs are set on success only.

/// The target of an open sink: NORV_ERR_NO_SUCH_TARGET when it is not open.
int loadSinkTarget(int tid, _tag_iscsi_target_ &target);
int loadSinkTargetByIqn(const std::string &iqn, _tag_iscsi_target_ &target);
/// Appends those of all open sinks.
int loadSinkTargets(std::vector<_tag_iscsi_target_> &targets);
/// Who may enter such a target: its peer alone.
int loadSinkMasking(int tid, Masking &masking);
/// The LUN in it.
int loadSinkLun(int tid, MappedLun &lun);

/// As iscsihost::openSink(), for whoever knows what the LUN is for.
int openSinkFor(const LunRow &lun, iscsihost::Sink &sink);

/// NORV_ERR_NO_SUCH_TARGET unless this opening of the LUN is the one that lasts.
int checkOpening(int lid, const std::string &iqn);

/// Closes all of them when their daemon is down: it took their sessions along, and a sender opens a sink anew.
int forgetOpenSinks();

/// Closes, as incomplete, the sinks that had no session for a minute: whoever opened them is gone.
int closeAbandonedSinks();

} // namespace norvhost

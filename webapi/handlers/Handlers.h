/// The handlers that the table names, and what they share.
#pragma once

#include "webapi/handlers/Route.h"

namespace iscsihost {
struct Sink;
}

namespace ISCSI {
class ISCSINodeInfo;
class ISCSISnapshotInfo;
} // namespace ISCSI

namespace webapi {

/// The IQN text that stands for the default masking entry, in input and in answers.
constexpr char DEFAULT_MASKING[] = "default";

/// A failure with the platform's reason for it.
Result failed(int code);
Result failed(int code, const std::string &reason);

Result openSession(const Request &request);
Result showSession(const Request &request);
Result closeSession(const Request &request);
Result showHealth(const Request &request);
Result showOpenApi(const Request &request);

Result listLuns(const Request &request);
Result createLun(const Request &request);
Result showLun(const Request &request);
Result updateLun(const Request &request);
Result deleteLun(const Request &request);
Result mapLun(const Request &request);
Result unmapLun(const Request &request);
Result loadLun(const Request &request);
Result unloadLun(const Request &request);

Result listTargets(const Request &request);
Result createTarget(const Request &request);
Result showTarget(const Request &request);
Result deleteTarget(const Request &request);
Result showMasks(const Request &request);
Result setMasks(const Request &request);
Result changeMasks(const Request &request);

Result listSnapshots(const Request &request);
Result takeSnapshot(const Request &request);
Result showSnapshot(const Request &request);
Result deleteSnapshot(const Request &request);
Result restoreSnapshot(const Request &request);
Result lockSnapshot(const Request &request);
Result unlockSnapshot(const Request &request);
Result stopSnapshot(const Request &request);
Result loadSnapshot(const Request &request);
Result unloadSnapshot(const Request &request);

Result cloneSnapshot(const Request &request);
Result cloneLun(const Request &request);
Result exportSnapshot(const Request &request);
Result showExport(const Request &request);
Result cancelExport(const Request &request);
Result importLun(const Request &request);
Result showImport(const Request &request);
Result cancelImport(const Request &request);

Result showRetention(const Request &request);
Result setRetention(const Request &request);
Result removeRetention(const Request &request);
Result tryRetention(const Request &request);
Result listSchedules(const Request &request);
Result addSchedule(const Request &request);
Result removeSchedule(const Request &request);
Result listEvents(const Request &request);

Result listNodes(const Request &request);
Result showNode(const Request &request);
Result addNodes(const Request &request);
Result joinNode(const Request &request);
Result openPeerSession(const Request &request);
Result showLocalKey(const Request &request);
Result showLocalStatus(const Request &request);
Result removeNode(const Request &request);
Result showPeerKey(const Request &request);
Result trustNode(const Request &request);
Result loginNode(const Request &request);
Result logoutNode(const Request &request);

Result listReplications(const Request &request);
Result createReplication(const Request &request);
Result createReplicationTask(const Request &request);
Result showReplication(const Request &request);
Result deleteReplication(const Request &request);
Result showSending(const Request &request);
Result sendReplication(const Request &request);
Result stopReplication(const Request &request);
Result countUnsynced(const Request &request);
Result showUnsynced(const Request &request);
Result promoteReplication(const Request &request);
Result demoteReplication(const Request &request);
Result checkReplicationNode(const Request &request);

// What a peer's sending asks for.
Result chooseBaseVersion(const Request &request);
Result beginReception(const Request &request);
Result noteReception(const Request &request);
Result endReception(const Request &request);

Result listVluns(const Request &request);
Result createVlun(const Request &request);
Result showVlun(const Request &request);
Result bindVlun(const Request &request);
Result deleteVlun(const Request &request);
Result remoteCloneLun(const Request &request);
Result showRemoteClone(const Request &request);

// What a peer that streams a LUN asks for.
Result openSink(const Request &request);
Result closeSink(const Request &request);

/// The sink's JSON form, which a peer enters it by; its log-in is not in it: both sides derive that.
Json::Value sinkForm(const iscsihost::Sink &sink);

/// Resolves a LUN selector to a UUID (which may name no LUN), or a target selector to a target ID
/// (which may name no target).
Result selectLun(const std::string &selector, std::string &uuid);
Result selectTarget(const std::string &selector, int &tid);

/// Loads the node that a selector names; "local" is this appliance.
Result selectNode(const std::string &selector, ISCSI::ISCSINodeInfo &node);

/// Loads the snapshot that the request's path selects, with its lock facts, and finds its LUN.
Result selectSnapshot(const Request &request, ISCSI::ISCSISnapshotInfo &snapshot, std::string &lun_uuid);

} // namespace webapi

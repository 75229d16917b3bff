// What callers of the replication operations see, or the log tells, when a platform call or a request of theirs or of
// their workers fails.
#include "tests/unit/replication/Pair.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;
using ISCSI::ISCSITaskInfo;
using ISCSI::LIB::LIBReplication::ISCSILIBReplication;
using Failures = std::vector<Failure>;

Failures operator+(Failures failures, const Failures &more)
{
    failures.insert(failures.end(), more.begin(), more.end());
    return failures;
}

/// Runs `act` on the task; what it writes into the text is the outputs.
Operation onTask(const char *name, void (*set_up)(), int (*act)(ISCSILIBReplication &, std::string &),
                 const std::string &untouched, const Failures &failures)
{
    const auto run = [act] {
        ISCSILIBReplication replication(TASK);
        std::string outputs;
        const int code = act(replication, outputs);
        return Outcome{code, replication.task.toString(), outputs};
    };
    Operation result = operation(name, set_up, run, untouched);
    result.failures = failures;
    return result;
}

/// The standard form with a code of the library's own.
std::string line(const std::string &method, const std::string &sentence, int code)
{
    return standard(method, sentence, shown(code));
}

std::string retold(const std::string &error)
{
    return "[E] sendSnapshot: error code: " + error + " [{info}]";
}

std::string nth(const char *call, int n)
{
    return std::string(call) + "#" + std::to_string(n);
}

const std::string NOT_LOADED = "Failed to load replication task";

Lines noNode(bool is_source, const char *which)
{
    const bool is_local = is_source == (which == std::string("source"));
    return {std::string("loadFromDRNode: Failed to get node info from DR Node. UUID: ") +
                (is_local ? LOCAL_NODE : PEER_NODE),
            std::string("loadFromConfig: Failed to load ") + which + " node. task: " + TASK};
}

/// The task is loaded first, and nothing of it may be missing.
Failures loaded(const std::string &method, bool is_source)
{
    Failures failures = {
        stops("NORViSCSIReplicationTaskConfGetByUUID", INJECTED,
              "loadFromConfig: Failed to load replication task: " + TASK, standard(method, NOT_LOADED)),
        stops("NORViSCSILunConfigGetByUUID#1", INJECTED,
              std::string("loadFromConfig: Failed to load ") + (is_source ? "source" : "destination") +
                  " LUN. task: " + TASK,
              standard(method, NOT_LOADED)),
        {"DRNodeDB::Get#1", 18991112, noNode(is_source, "source")},
        {"DRNodeDB::Get#2", 18991112, noNode(is_source, "destination")},
        {"DRNodeDB::ListAttr", 0, {}, true, true},
    };
    for (size_t i : {2, 3})
        failures[i].lines.push_back(line(method, NOT_LOADED, 18991112));
    return failures;
}

/// The same under the task's lock.
Failures locked(const std::string &method, bool is_source)
{
    const std::string sentence = "Failed to lock replication task";
    return Failures{
               stops("NORVFSMkdirP", 18990028, line("lockTask", "Failed to create iscsi lock folder", 18990028),
                     line(method, sentence, 18990028)),
               stops("NLIBCFileLockByFile", 18990808, line("lockTask", "Another process locked this task", 18990808),
                     line(method, sentence, 18990808)),
               Failure{"NLIBCFileUnlockByFile", 0, {line("unlockTask", "Failed to unlock task", 0)}, false, true}} +
           loaded(method, is_source);
}

/// Text of a LUN as `set_up` leaves it.
std::string textOf(void (*set_up)(), const std::string &uuid)
{
    set_up();
    ISCSILUNInfo lun(uuid);
    _tag_iscsi_lun_ record{};
    lun.loadFromConfig(record, 0);
    fake::reset();
    return lun.toString();
}

/// The second load of the LUN fails, in `method`.
Lines noLUN(const std::string &uuid, const std::string &method)
{
    return {"loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + uuid,
            method + ": Failed to load LUN info. LUN UUID: " + uuid};
}

Failures roleChange(const std::string &method, void (*set_up)(), const std::string &lun, const char *convert,
                    const std::string &sentence)
{
    const std::string unmapped = textOf(set_up, lun);
    return locked(method, method == "demote") +
           Failures{
               stops("NORViSCSILunConfigGetByUUID#2", INJECTED,
                     "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + lun,
                     "isLUNMapped: Failed to load LUN config. info: " + ISCSILUNInfo(lun).toString() + ". error: {err}",
                     standard(method, "Failed to get LUN status")),
               stops("NORViSCSIConfGet", 18990557,
                     "isLUNMapped: Failed to list LUN's mapping targets. info: " + unmapped +
                         ". error: " + shown(18990557),
                     line(method, "Failed to get LUN status", 18990557)),
               stops(convert, INJECTED, standard(method, sentence))};
}

int create(ISCSILIBReplication &replication, std::string &)
{
    replication = ISCSILIBReplication(SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", "copy");
    return replication.createReplication();
}

void noTask()
{
    sourceSide();
    fake::model().tasks.clear();
}

const std::string MISSING = "loadFromDRNode: Failed to get node info from DR Node. UUID: ";

/// Creating the source's half fails, and the LUN on the peer is deleted again.
template <class... Texts>
Failure noHalf(const std::string &call, int code, const Texts &...lines)
{
    return cleansUp(call, code, lines..., line("createReplication", "Failed to create source task", code));
}

const Failures creation = {
    stops("NORViSCSILunConfigGetByUUID#1", INJECTED,
          "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + SOURCE,
          standard("createReplication", "Failed to load source LUN's info")),
    stops("DRNodeDB::Get#1", 18991112, MISSING + PEER_NODE,
          line("createReplication", "Failed to load destination node's info", 18991112)),
    goesOn("DRNodeDB::ListAttr"),
    stops("WebAPIClientLUNCreate", INJECTED, standard("createReplication", "Failed to create destination LUN")),
    cleansUp("WebAPIClientLUNGet", INJECTED, standard("waitUntilRemoteLUNUnlock", "Failed to get remote LUN status"),
             standard("createReplication", "Failed to wait until creating destination LUN completed")),
    noHalf("NORViSCSILunConfigGetByUUID#2", INJECTED,
           "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + SOURCE,
           standard("createTask", "Failed to load local LUN's info")),
    noHalf("DRNodeDB::Get#2", 18991112, MISSING + LOCAL_NODE,
           line("createTask", "Failed to load local node's info", 18991112)),
    noHalf("NORVExtentPoolRODKeyGet", INJECTED, "loadLocalRODKey: Failed to get ROD key. err: {text}",
           standard("createTask", "Failed to get local ROD key")),
    noHalf("DRNodeDB::SetAttr#1", 18991118, "insertRODKey: Failed to set ROD key",
           line("createTask", "Failed to set local ROD key", 18991118)),
    noHalf("DRNodeDB::Get#3", 18991112, MISSING + PEER_NODE,
           line("createTask", "Failed to load remote node's info", 18991112)),
    noHalf("WebAPIClientNodeGet", INJECTED, standard("createTask", "Failed to get remote node's info")),
    noHalf("DRNodeDB::SetAttr#2", 18991118, "insertRODKey: Failed to set ROD key",
           line("createTask", "Failed to set remote ROD key", 18991118)),
    noHalf("NORViSCSIReplicationTaskCreate", INJECTED, standard("createTask", "Failed to create replication task")),
    cleansUp("WebAPIClientReplicationCreateTask", INJECTED,
             standard("createReplication", "Failed to create destination task")),
};

/// A failure of checkNode, with the node as it is then.
template <class... Texts>
Failure badNode(const char *call, int code, const char *key, const std::string &sentence, const Texts &...before)
{
    const bool is_loaded = key[0] != '\0';
    const std::string node =
        std::string("uuid: ") + PEER_NODE + " ,is_local_node: false ,rod_key: " + key +
        (is_loaded ? " ,hostname: peer.example ,port: 5443 ,protocol: https ,session_id: peer-session"
                   : " ,hostname:  ,port: 0 ,protocol:  ,session_id: ");
    return stops(call, code, before..., "checkNode: " + sentence + ". info: " + node + ". error: " + shown(code));
}

const Failures connection = {
    badNode("DRNodeDB::Get", 18991112, "", "Failed to load remote node's info", MISSING + PEER_NODE),
    goesOn("DRNodeDB::ListAttr"),
    badNode("WebAPIClientNodeGet", INJECTED, "kept-rod-key", "Failed to get remote node's info"),
    badNode("DRNodeDB::SetAttr", 18991118, "peer-rod-key", "Failed to set remote ROD key",
            "insertRODKey: Failed to set ROD key"),
    badNode("NORViSCSIReplicationTaskCheckConnection", INJECTED, "peer-rod-key", "Failed to check node"),
};

int send(ISCSILIBReplication &replication, std::string &)
{
    return replication.sendSnapshot(SNAPSHOT, "", 0, false, false);
}

void sourceBehind()
{
    sourceSide();
    fake::model().peer.not_aligned = true;
}

const std::string NOT_SENT = "sendSnapshot: Failed to send snapshot: " + SNAPSHOT + ". base: " + BASE +
                             ", full sync: false. info: {info}. error: {err}";
const std::string NOT_ALIGNED =
    "sendSnapshot: Base snapshot and LUN are not aligned. base: " + BASE + ". info: {info}. error: " + shown(0);
const std::string NO_RESIZE = standard("sendSnapshot", "Failed to resize destination LUN");

/// What both ways of sending share: the start, and the worker's end.
Failures sending(const Lines &told)
{
    Failures start =
        locked("sendSnapshot", true) +
        Failures{
            stops("NORViSCSISnapshotConfGetByUUID", INJECTED,
                  "loadFromConfig: Failed to load snapshot config. UUID: " + SNAPSHOT,
                  standard("sendSnapshot", "Failed to load sending snapshot info")),
            stops("NORViSCSILunConfigGetByUUID#2", INJECTED,
                  "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + SOURCE,
                  "listSnapshot: Failed to load LUN info from SDK. info: " + ISCSILUNInfo(SOURCE).toString() +
                      ". error: {err}",
                  standard("sendSnapshot", "Failed to load source snapshot info")),
            stops("NORViSCSISnapshotConfLoad", 18990573, ": NORViSCSISnapshotConfLoad({addresses}) failed, err{text}",
                  "listSnapshot: Failed to list snapshots. info: " + textOf(sourceSide, SOURCE) +
                      ". error: " + shown(18990573),
                  line("sendSnapshot", "Failed to load source snapshot info", 18990573)),
            stops("WebAPIClientReplicationGetBaseVersion", INJECTED,
                  standard("sendSnapshot", "Failed to get common base for sending snapshot")),
            stops("NLIBCProcForkChildNoWait", 18990014,
                  standard("forkProcessIfNotChild", "Failed to fork a process", "-77 (File descriptor in bad state)"),
                  line("sendSnapshot", "Failed to fork process", 18990014))};
    Failures end = {
        endsWorker("NORViSCSIReplicationTaskProgressGetByTask",
                   standard("waitUntilSendingCompleted", "Failed to get sending progress"),
                   standard("sendSnapshot", "Failed to wait until sending snapshot completed"), retold("{err}")),
        workerGoesOn("WebAPIClientLUNTakeSnapshot",
                     standard("sendSnapshot", "Failed to take a snapshot from destination LUN"), retold("{err}")),
        endsWorker("WebAPIClientLUNGetSnapshot",
                   standard("waitUntilRemoteSnapshotSyncDone", "Failed to get remote LUN status"),
                   standard("sendSnapshot", "Failed to wait until remote snapshot completed")),
    };
    for (auto &failure : end)
        failure.lines.insert(failure.lines.begin(), told.begin(), told.end());
    for (auto &failure : start) {
        if (failure.has_outputs)
            failure.lines.insert(failure.lines.begin(), told.begin(), told.end());
    }
    return start + end;
}

const Failures sent_at_once = {stops("WebAPIClientLUNSet", INJECTED, NO_RESIZE),
                               stops("NORViSCSIReplicationTaskSendSnapshot", INJECTED, NOT_SENT)};
const Failures sent_by_the_worker = {
    endsWorker("WebAPIClientLUNGet", NOT_ALIGNED,
               standard("waitUntilRemoteLUNSyncDone", "Failed to get remote LUN status"),
               standard("sendSnapshot", "Failed to wait until destination task is unlocked"), retold("{err}")),
    endsWorker("WebAPIClientLUNSet", NOT_ALIGNED, NO_RESIZE, retold("{err}")),
    endsWorker("NORViSCSIReplicationTaskSendSnapshot", NOT_ALIGNED, NOT_SENT, retold("{err}")),
};

void alignedDestination()
{
    destinationSide();
    fake::model().luns[4].map_file.current_version = SNAPSHOT;
}

int chooseBase(ISCSILIBReplication &replication, std::string &outputs)
{
    bool need_full_sync = true, not_aligned = true;
    const int code = replication.getBaseVersion(sourceSnapshots({SNAPSHOT}), outputs, need_full_sync, not_aligned);
    outputs += need_full_sync ? " full" : " difference";
    return code;
}

/// A question about the destination LUN's data fails; it loads the LUN for the n-th time.
Failures noVersion(int n, const std::string &question, const std::string &sentence)
{
    Failure failure = {nth("NORViSCSILunConfigGetByUUID", n), INJECTED, noLUN(DESTINATION, question)};
    failure.lines.push_back(standard("getBaseVersion", sentence));
    return {failure};
}

Failure noVersionInfo(const std::string &call, const std::string &told, const std::string &sentence)
{
    return stops(call, INJECTED, told + ". LUN UUID: " + DESTINATION, standard("getBaseVersion", sentence));
}

const std::string NO_BASE = "Failed to get LUN base version";
const std::string NOT_CHECKED = "Failed to check if LUN is modified";
const std::string UNKNOWN_OUTCOME = "Failed to check if last snapshot-sending failed";

const Failures choice =
    locked("getBaseVersion", false) + noVersion(2, "getBaseVersion", NO_BASE) +
    noVersion(3, "isModified", NOT_CHECKED) + noVersion(4, "isSnapshotSentFailed", UNKNOWN_OUTCOME) +
    Failures{
        noVersionInfo("NORVExtentPoolMapFileBaseVersionGet", "getBaseVersion: Failed to get LUN base version", NO_BASE),
        noVersionInfo("NORVExtentPoolMapFileVersionInfoGet#1", "isModified: Failed to get LUN version info",
                      NOT_CHECKED),
        noVersionInfo("NORVExtentPoolMapFileVersionInfoGet#2", "isSnapshotSentFailed: Failed to get LUN's version info",
                      UNKNOWN_OUTCOME),
        noVersionInfo("NORVExtentPoolMapFileTotalCountGet", "isSnapshotSentFailed: Failed to get LUN's total count",
                      UNKNOWN_OUTCOME),
        noVersionInfo("NORVExtentPoolMapFileSyncedCountGet", "isSnapshotSentFailed: Failed to get LUN's synced count",
                      UNKNOWN_OUTCOME),
    };

int status(ISCSILIBReplication &replication, std::string &outputs)
{
    bool is_locked = false;
    const int code = replication.getStatus(is_locked, outputs);
    outputs += is_locked ? " locked" : " free";
    return code;
}

int sendingStatus(ISCSILIBReplication &replication, std::string &outputs)
{
    unsigned long long sent = 9, total = 9, value = 9;
    int error = 9;
    const int code = replication.getSendingStatus(sent, total, value, error);
    for (unsigned long long number : {sent, total, value, static_cast<unsigned long long>(error)})
        outputs += std::to_string(number);
    return code;
}

int unsyncSize(ISCSILIBReplication &replication, std::string &outputs)
{
    unsigned long long size = 9;
    bool is_completed = false;
    const int code = replication.getCurrentUnsyncSize(size, is_completed);
    outputs = std::to_string(size) + (is_completed ? " in all" : "");
    return code;
}

int selectFirst(ISCSILIBReplication &, std::string &outputs)
{
    outputs = "before";
    return ISCSITaskInfo::GetTaskUUID("rep#1", outputs);
}

/// Removal loads the task twice, and needs neither its LUN nor its nodes.
Failures removal()
{
    Failures failures = {
        stops("NORViSCSIReplicationTaskConfGetByUUID#1", INJECTED,
              "loadFromConfig: Failed to load replication task: " + TASK, standard("deleteReplication", NOT_LOADED)),
        goesOn("NORViSCSILunConfigGetByUUID"),
        goesOn("NORViSCSILunConfigGetByUUID#2",
               "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + DESTINATION,
               standard("deleteReplication", "Failed to load local LUN's info")),
        goesOn("NORViSCSILunConvertSinkToAdv",
               standard("deleteReplication", "Failed to convert the sink lun to advanced lun")),
        goesOn("DRNodeDB::ListAttr"),
        stops("NORViSCSIReplicationTaskConfGetByUUID#2", INJECTED,
              "loadFromConfig: Failed to load replication task: " + TASK, standard("deleteTask", NOT_LOADED),
              standard("deleteReplication", "Failed to delete task")),
        stops("NORViSCSIReplicationTaskDelete", INJECTED, standard("deleteTask", "Failed to remove replication task"),
              standard("deleteReplication", "Failed to delete task")),
    };
    for (int n = 1; n <= 4; ++n)
        failures.push_back({nth("DRNodeDB::Get", n), 0, noNode(false, n % 2 ? "source" : "destination"), true});
    return failures;
}

const Failures counting = {
    stops("NORViSCSISnapshotConfGetByUUID#1", INJECTED,
          standard("startToComputeUnsyncSize", "Failed to get base snapshot by UUID: " + BASE)),
    stops("NORViSCSISnapshotConfGetByUUID#2", INJECTED,
          standard("startToComputeUnsyncSize", "Failed to get sending snapshot by UUID: " + SNAPSHOT)),
    stops("NORViSCSIReplicationTaskUnsyncSizeComputeStart", INJECTED,
          standard("startToComputeUnsyncSize", "Failed to compute unsync size")),
};

Failures statusFailures()
{
    Failure no_lun = {"NORViSCSILunConfigGetByUUID#2", INJECTED, noLUN(SOURCE, "getBaseVersion")};
    no_lun.lines.push_back(standard("getStatus", "Failed to get base version"));
    return loaded("getStatus", true) +
           Failures{goesOn("NORVFSMkdirP").leaving(std::string(NORV_ZERO_UUID) + " free"),
                    goesOn("NLIBCFileLockByFile").leaving(std::string(NORV_ZERO_UUID) + " locked"),
                    stops("NLIBCFileUnlockByFile", 18990016, line("getStatus", "Failed to unlock", 18990016)), no_lun,
                    stops("NORVExtentPoolMapFileBaseVersionGet", INJECTED,
                          "getBaseVersion: Failed to get LUN base version. LUN UUID: " + SOURCE,
                          standard("getStatus", "Failed to get base version"))};
}

const Operation operations[] = {
    onTask("GetTaskUUIDByIndex", sourceSide, selectFirst, "before",
           {stops("NORViSCSIReplicationTaskConfLoad", INJECTED, "ListTask: Failed to list task. error: {text}",
                  ": Failed to list tasks.")}),
    onTask("createReplication", noTask, create, "", creation),
    onTask(
        "checkNode", sourceSide, [](auto &task, auto &) { return task.checkNode(PEER_NODE, "10.0.0.9", 3262); }, "",
        connection),
    onTask("sendSnapshot", sourceSide, send, "", sending({}) + sent_at_once),
    logging({NOT_ALIGNED},
            onTask("sendSnapshotNotAligned", sourceBehind, send, "", sending({NOT_ALIGNED}) + sent_by_the_worker)),
    onTask("getReplicationBaseVersion", alignedDestination, chooseBase, " full", choice),
    onTask(
        "startToComputeUnsyncSize", sourceSide,
        [](auto &task, auto &) { return task.startToComputeUnsyncSize(BASE, SNAPSHOT); }, "",
        loaded("startToComputeUnsyncSize", true) + counting),
    onTask("getCurrentUnsyncSize", sourceSide, unsyncSize, "9",
           locked("getCurrentUnsyncSize", true) +
               Failures{stops("NORViSCSIReplicationTaskUnsyncSizeGet", INJECTED,
                              standard("getCurrentUnsyncSize", "Failed to compute unsync size"))}),
    onTask("getSendingStatus", sourceSide, sendingStatus, "9999",
           loaded("getSendingStatus", true) +
               Failures{stops("NORViSCSIReplicationTaskProgressGetByTask", INJECTED,
                              standard("getSendingStatus", "Failed to get sending progress"))}),
    onTask(
        "stopSending", sourceSide, [](auto &task, auto &) { return task.stopSending(); }, "",
        loaded("stopSending", true) + Failures{stops("NORViSCSIReplicationTaskStopSendingSnapshot", INJECTED,
                                                     standard("stopSending", "Failed to stop sending snapshot"))}),
    onTask("getReplicationStatus", sourceSide, status, " free", statusFailures()),
    onTask(
        "promote", destinationSide, [](auto &task, auto &) { return task.promote(); }, "",
        roleChange("promote", destinationSide, DESTINATION, "NORViSCSIReplicationTaskConvertDstToSrc",
                   "Failed to convert task to source")),
    onTask(
        "demote", sourceSide, [](auto &task, auto &) { return task.demote(); }, "",
        roleChange("demote", sourceSide, SOURCE, "NORViSCSIReplicationTaskConvertSrcToDst",
                   "Failed to convert task to sink")),
    onTask(
        "deleteReplication", destinationSide, [](auto &task, auto &) { return task.deleteReplication(false); }, "",
        removal()),
};

INSTANTIATE_TEST_SUITE_P(Replication, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

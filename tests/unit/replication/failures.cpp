// What becomes of the replication operations when a platform call or a request of theirs or of their workers fails.
#include "tests/unit/replication/Pair.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSITaskInfo;
using ISCSI::LIB::LIBReplication::ISCSILIBReplication;
using List = std::vector<Codes>;

List operator+(List codes, const List &more)
{
    codes.insert(codes.end(), more.begin(), more.end());
    return codes;
}

/// Loading a task, of which nothing may be missing.
const List LOADED = {{"DRNodeDB::Get", 18991112}, {"DRNodeDB::ListAttr", 0, Then::GOES_ON}};
/// The same under the task's lock.
const List LOCKED = LOADED + List{{"NORVFSMkdirP", 18990028},
                                  {"NLIBCFileLockByFile", 18990808},
                                  {"NLIBCFileUnlockByFile", 0, Then::ONLY_THE_LOG_TELLS}};
const List MAPPING = {{"NORViSCSIConfGet", 18990557}};

/// Runs `act` on the task; what it writes into the text is the outputs.
Operation onTask(const char *name, void (*set_up)(), int (*act)(ISCSILIBReplication &, std::string &),
                 const std::string &untouched, const List &codes)
{
    const auto run = [act] {
        ISCSILIBReplication replication(TASK);
        std::string outputs;
        const int code = act(replication, outputs);
        return Outcome{code, "", outputs};
    };
    return sweptForCodes(name, set_up, run, untouched, codes);
}

void sourceBehind()
{
    sourceSide();
    fake::model().peer.not_aligned = true;
}

void alignedDestination()
{
    destinationSide();
    fake::model().luns[4].map_file.current_version = SNAPSHOT;
}

int selectFirst(ISCSILIBReplication &, std::string &outputs)
{
    outputs = "before";
    return ISCSITaskInfo::GetTaskUUID("rep#1", outputs);
}

int create(ISCSILIBReplication &replication, std::string &)
{
    replication = ISCSILIBReplication(SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", "copy");
    return replication.createReplication();
}

int send(ISCSILIBReplication &replication, std::string &)
{
    return replication.sendSnapshot(SNAPSHOT, "", 0, false, false);
}

int chooseBase(ISCSILIBReplication &replication, std::string &outputs)
{
    bool need_full_sync = true, not_aligned = true;
    const int code = replication.getBaseVersion(sourceSnapshots({SNAPSHOT}), outputs, need_full_sync, not_aligned);
    outputs += need_full_sync || not_aligned ? " other" : " same";
    return code;
}

int status(ISCSILIBReplication &replication, std::string &outputs)
{
    bool is_locked = true;
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

const Operation operations[] = {
    onTask("GetTaskUUIDByIndex", sourceSide, selectFirst, "before", {}),
    onTask("createReplication", noTask, create, "",
           {{"DRNodeDB::Get#1", 18991112},
            {"DRNodeDB::ListAttr", 0, Then::GOES_ON},
            {"WebAPIClientLUNGet NORViSCSILunConfigGetByUUID#2 NORVExtentPoolRODKeyGet WebAPIClientNodeGet "
             "NORViSCSIReplicationTaskCreate WebAPIClientReplicationCreateTask",
             INJECTED, Then::CLEANS_UP},
            {"DRNodeDB::Get", 18991112, Then::CLEANS_UP},
            {"DRNodeDB::SetAttr", 18991118, Then::CLEANS_UP}}),
    onTask(
        "checkNode", sourceSide, [](auto &task, auto &) { return task.checkNode(PEER_NODE, "10.0.0.9", 3262); }, "",
        LOADED + List{{"DRNodeDB::SetAttr", 18991118}}),
    onTask("sendSnapshot", sourceSide, send, "",
           LOCKED + List{{"NORViSCSISnapshotConfLoad", 18990573},
                         {"NLIBCProcForkChildNoWait", 18990014},
                         {"NORViSCSIReplicationTaskProgressGetByTask WebAPIClientLUNTakeSnapshot "
                          "WebAPIClientLUNGetSnapshot",
                          0, Then::ONLY_THE_LOG_TELLS}}),
    onTask("sendSnapshotNotAligned", sourceBehind, send, "",
           LOCKED + List{{"NORViSCSISnapshotConfLoad", 18990573},
                         {"NLIBCProcForkChildNoWait", 18990014},
                         {"WebAPIClientLUNGet WebAPIClientLUNSet NORViSCSIReplicationTaskSendSnapshot "
                          "NORViSCSIReplicationTaskProgressGetByTask WebAPIClientLUNTakeSnapshot "
                          "WebAPIClientLUNGetSnapshot",
                          0, Then::ONLY_THE_LOG_TELLS}}),
    onTask("getReplicationBaseVersion", alignedDestination, chooseBase, " other", LOCKED),
    onTask(
        "startToComputeUnsyncSize", sourceSide,
        [](auto &task, auto &) { return task.startToComputeUnsyncSize(BASE, SNAPSHOT); }, "", LOADED),
    onTask("getCurrentUnsyncSize", sourceSide, unsyncSize, "9", LOCKED),
    onTask("getSendingStatus", sourceSide, sendingStatus, "9999", LOADED),
    onTask(
        "stopSending", sourceSide, [](auto &task, auto &) { return task.stopSending(); }, "", LOADED),
    onTask("getReplicationStatus", sourceSide, status, " locked",
           LOADED + List{{"NORVFSMkdirP NLIBCFileLockByFile", 0, Then::GOES_ON}, {"NLIBCFileUnlockByFile", 18990016}}),
    onTask(
        "promote", destinationSide, [](auto &task, auto &) { return task.promote(); }, "", LOCKED + MAPPING),
    onTask(
        "demote", sourceSide, [](auto &task, auto &) { return task.demote(); }, "", LOCKED + MAPPING),
    onTask("deleteReplication", destinationSide, [](auto &task, auto &) { return task.deleteReplication(false); }, "",
           {{"NORViSCSILunConfigGetByUUID DRNodeDB::ListAttr", 0, Then::GOES_ON},
            {"NORViSCSILunConfigGetByUUID#2 NORViSCSILunConvertSinkToAdv DRNodeDB::Get", 0, Then::ONLY_THE_LOG_TELLS}}),
};

INSTANTIATE_TEST_SUITE_P(Replication, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

// What becomes of the replication operations when a platform call or a request of theirs or of their workers fails.
#include "tests/unit/replication/Pair.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSITaskInfo;
using ISCSI::LIB::LIBReplication::ISCSILIBReplication;

ISCSILIBReplication theTask()
{
    return ISCSILIBReplication(TASK);
}

/// Loading a task, of which nothing may be missing.
const Failures LOADED = {{"DRNodeDB::Get", 18991112}, {"DRNodeDB::ListAttr", 0, Then::GOES_ON}};
/// The same under the task's lock.
const Failures LOCKED = LOADED + Failures{{"NORVFSMkdirP", 18990028},
                                          {"NLIBCFileLockByFile", 18990808},
                                          {"NLIBCFileUnlockByFile", 0, Then::ONLY_THE_LOG_TELLS}};
/// Sending, which the worker ends.
const Failures SENT = LOCKED + Failures{{"NORViSCSISnapshotConfLoad", 18990573},
                                        {"NLIBCProcForkChildNoWait", 18990014},
                                        {"NORViSCSIReplicationTaskProgressGetByTask WebAPIClientLUNTakeSnapshot "
                                         "WebAPIClientLUNGetSnapshot",
                                         0, Then::ONLY_THE_LOG_TELLS}};
const Failures MAPPING = {{"NORViSCSIConfGet", 18990557}};

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

/// The outputs are the tasks left, and whether the last request took the peer's LUN back.
int create(ISCSILIBReplication &replication, std::string &outputs)
{
    replication = ISCSILIBReplication(SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", "copy");
    const int code = replication.createReplication();
    outputs = std::to_string(fake::model().tasks.size()) + " tasks";
    for (const auto &call : fake::calls()) {
        if (call.name == "WebAPIClientLUNDelete")
            outputs = "LUN deleted, " + outputs;
    }
    return code;
}

int send(ISCSILIBReplication &replication, std::string &)
{
    return replication.sendSnapshot(SNAPSHOT, "", 0, false, false);
}

int chooseBase(ISCSILIBReplication &replication, std::string &outputs)
{
    bool need_full_sync = true, not_aligned = true;
    outputs.clear();
    const int code = replication.getBaseVersion(sourceSnapshots({SNAPSHOT}), outputs, need_full_sync, not_aligned);
    outputs += need_full_sync || not_aligned ? " other" : " same";
    return code;
}

int status(ISCSILIBReplication &replication, std::string &outputs)
{
    bool is_locked = true;
    outputs.clear();
    const int code = replication.getStatus(is_locked, outputs);
    outputs += is_locked ? " locked" : " free";
    return code;
}

int sendingStatus(ISCSILIBReplication &replication, std::string &outputs)
{
    unsigned long long sent = 9, total = 9, value = 9;
    int error = 9;
    outputs.clear();
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
    {"GetTaskUUIDByIndex", sourceSide, [](auto &uuid) { return ISCSITaskInfo::GetTaskUUID("rep#1", uuid); }, "before"},
    on(theTask, "createReplication", noTask, create, "LUN deleted, 0 tasks",
       {Failure("NORViSCSILunConfigGetByUUID WebAPIClientLUNCreate", INJECTED).leaving("0 tasks"),
        Failure("DRNodeDB::Get#1", 18991112).leaving("0 tasks"),
        {"DRNodeDB::ListAttr", 0, Then::GOES_ON},
        {"WebAPIClientLUNGet NORViSCSILunConfigGetByUUID#2 NORVExtentPoolRODKeyGet WebAPIClientNodeGet "
         "NORViSCSIReplicationTaskCreate WebAPIClientReplicationCreateTask",
         INJECTED, Then::CLEANS_UP},
        {"DRNodeDB::Get", 18991112, Then::CLEANS_UP},
        {"DRNodeDB::SetAttr", 18991118, Then::CLEANS_UP}}),
    on(
        theTask, "checkNode", sourceSide,
        [](auto &task, auto &) { return task.checkNode(PEER_NODE, "10.0.0.9", 3262); }, "",
        LOADED + Failures{{"DRNodeDB::SetAttr", 18991118}}),
    on(theTask, "sendSnapshot", sourceSide, send, "", SENT),
    on(theTask, "sendSnapshotNotAligned", sourceBehind, send, "",
       SENT + Failures{{"WebAPIClientLUNGet WebAPIClientLUNSet NORViSCSIReplicationTaskSendSnapshot", 0,
                        Then::ONLY_THE_LOG_TELLS}}),
    on(theTask, "getReplicationBaseVersion", alignedDestination, chooseBase, " other", LOCKED, SNAPSHOT + " same"),
    on(
        theTask, "startToComputeUnsyncSize", sourceSide,
        [](auto &task, auto &) { return task.startToComputeUnsyncSize(BASE, SNAPSHOT); }, "", LOADED),
    on(theTask, "getCurrentUnsyncSize", sourceSide, unsyncSize, "9", LOCKED, "0 in all"),
    on(theTask, "getSendingStatus", sourceSide, sendingStatus, "9999", LOADED, "1200"),
    on(
        theTask, "stopSending", sourceSide, [](auto &task, auto &) { return task.stopSending(); }, "", LOADED),
    on(theTask, "getReplicationStatus", sourceSide, status, " locked",
       LOADED + Failures{{"NORVFSMkdirP NLIBCFileLockByFile", 0, Then::GOES_ON}, {"NLIBCFileUnlockByFile", 18990016}}),
    on(
        theTask, "promote", destinationSide, [](auto &task, auto &) { return task.promote(); }, "", LOCKED + MAPPING),
    on(
        theTask, "demote", sourceSide, [](auto &task, auto &) { return task.demote(); }, "", LOCKED + MAPPING),
    on(theTask, "deleteReplication", destinationSide, [](auto &task, auto &) { return task.deleteReplication(false); },
       "",
       {{"NORViSCSILunConfigGetByUUID DRNodeDB::ListAttr", 0, Then::GOES_ON},
        {"NORViSCSILunConfigGetByUUID#2 NORViSCSILunConvertSinkToAdv DRNodeDB::Get", 0, Then::ONLY_THE_LOG_TELLS}}),
};

INSTANTIATE_TEST_SUITE_P(Replication, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

// What callers of the LUN operations see, or the log tells, when a platform call of theirs or of their workers fails.
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;
using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const int LID = privateLUNID();
const std::string SNAPSHOT = snapshotUUIDOf(LID, 2);
const std::string MADE = "00000000-0000-4000-8000-000000000001"; // the first that the fake makes
const std::string IMPORT_FILE = "/tmp/iscsi/L" + std::to_string(LID) + ".import_progress";

ISCSILIBLUN theLUN()
{
    return ISCSILIBLUN(uuidOf(LID));
}

ISCSILIBLUN newLUN()
{
    return ISCSILIBLUN("new", NORV_LUN_TYPE_ADV, "/volume1", GIB, 65536);
}

void freeSnapshotOfLUN()
{
    addLUN(LID, "vol1");
    addSnapshot(LID, 2, "daily");
}

void snapshotOfLUN()
{
    freeSnapshotOfLUN();
    fake::model().snapshots.at({LID, 2}).app_keys = {"backup"};
}

void mappedLUN()
{
    addLUN(LID, "vol1").is_locked = true;
    for (int tid : {5, 6}) {
        addTarget(tid, "t" + std::to_string(tid));
        addMapping(tid, LID);
    }
}

void scheduledLUN()
{
    addLUN(LID, "vol1");
    fake::model().jobs = {{11, {"vol1", 0}}, {12, {"", LID}}};
}

void runningAction()
{
    addLUN(LID, "vol1").is_locked = true;
    addSnapshot(LID, 2, "daily").is_locked = true;
}

void exportedSnapshot()
{
    snapshotOfLUN();
    fake::model().luns.at(LID).map_file.to_copy = 5;
    fake::model().exports["/export"] = {{}, "a note", "bob", EPOCH, 1, 0, {}};
    writeFile(IMPORT_FILE, "step=0\ndone_bytes=1\ntotal_bytes=2\n");
}

int create(ISCSILIBLUN &lun, std::string &outputs)
{
    const int code = lun.createLUN();
    outputs = lun.info.uuid + std::to_string(lun.info.lun_id);
    return code;
}

template <int (ISCSILIBLUN::*ask)(bool &)>
int question(ISCSILIBLUN &lun, std::string &outputs)
{
    bool answer = false;
    const int code = (lun.*ask)(answer);
    outputs = answer ? "yes" : "no";
    return code;
}

int take(ISCSILIBLUN &lun, std::string &outputs)
{
    std::string uuid = "none";
    int number = 0;
    const int code = lun.takeSnapshot(false, false, "", "", "", EPOCH, false, uuid, number);
    outputs = uuid + " " + std::to_string(number);
    return code;
}

int list(ISCSILIBLUN &lun, std::string &outputs)
{
    std::vector<ISCSISnapshotInfo> snapshots(5);
    const int code = lun.listSnapshot(snapshots, 3);
    outputs = std::to_string(snapshots.size());
    return code;
}

int importProgress(ISCSILIBLUN &lun, std::string &outputs)
{
    unsigned long long done = 9, total = 9;
    int step = 9;
    const int code = lun.getImportProgress(done, total, step);
    outputs = std::to_string(step) + " " + std::to_string(done) + " " + std::to_string(total);
    return code;
}

int syncProgress(ISCSILIBLUN &lun, std::string &outputs)
{
    unsigned long long done = 9, total = 9;
    const int code = lun.getSyncProgress(done, total);
    outputs = std::to_string(done) + " " + std::to_string(total);
    return code;
}

/// Of taking a snapshot; the numbers are those of the calls when the operation makes them twice.
Failures retention(const std::string &wait)
{
    return {{wait, 0, "takeSnapshot: Failed to wait until taking snapshot completed."},
            {"NORVRETENTIONRunPolicy", 0, "takeSnapshot: Failed to run retention policy."}};
}

const Operation operations[] = {
    on(newLUN, "createLUN", mappedLUN, create, "0",
       {{"NORViSCSILunCreate", INJECTED, "createLUN: Failed to create LUN."}}),
    on(theLUN, "loadLUNInfo", mappedLUN, [](auto &lun, auto &) { return lun.loadLUNInfo(0); }, "", {}),
    on(theLUN, "deleteLUN", scheduledLUN, [](auto &lun, auto &) { return lun.deleteLUN(); }, "",
       {{"NORViSCSILunTaskGetSchIDByName ScheduleSnapshotTaskGetIDByLid NORVRETENTIONRemovePolicy", 0, Then::GOES_ON},
        {"NORVSchedTaskRemove#1", 0, Then::ONLY_THE_LOG_TELLS, ": NORVSchedTaskRemove() fail, schedule id = 11"},
        {"NORVSchedTaskRemove#2", 0, Then::ONLY_THE_LOG_TELLS, ": NORVSchedTaskRemove() fail, schedule id = 12"},
        {"NORViSCSILunDelete", 18990551, "deleteLUN: Failed to delete LUN: "}}),
    on(theLUN, "isLUNLocked", mappedLUN, question<&ISCSILIBLUN::isLUNLocked>, "no",
       {{"NORViSCSILunIsLocked", INJECTED, "isLUNLocked: Failed to check if LUN is locked."}}, "yes"),
    on(theLUN, "isLUNMapped", mappedLUN, question<&ISCSILIBLUN::isLUNMapped>, "no",
       {{"NORViSCSIConfGet", 18990557, "isLUNMapped: Failed to list LUN's mapping targets."}}, "yes"),
    on(theLUN, "loadLUN", mappedLUN, [](auto &lun, auto &) { return lun.loadLUN(true, false); }, "",
       {{"NORViSCSILunLoad", INJECTED,
         "loadLUN: Failed to load LUN. is_for_trash: true, is_for_unsync_size: false info: "}}),
    on(theLUN, "unloadLUN", mappedLUN, [](auto &lun, auto &) { return lun.unloadLUN(false, true); }, "",
       {{"NORViSCSILunUnload", INJECTED,
         "unloadLUN: Failed to unload LUN. is_for_trash: false, is_for_unsync_size: true info: "}}),
    on(theLUN, "updateLUN", scheduledLUN, [](auto &lun, auto &) { return lun.updateLUN("new", 2 * GIB); }, "",
       {{"NORViSCSILunIsNameExist", INJECTED, "updateLUN: Failed to query if the LUN name exists."},
        {"NORViSCSILunUpdate", INJECTED, "updateLUN: Failed to update LUN."}}),
    on(theLUN, "mapTarget", mappedLUN,
       [](auto &lun, auto &) {
           return lun.mapTarget(std::set<int>{6, 5});
       },
       "", {{"NORViSCSILunMappingsAdd", 18990570, "mapTarget: Failed to add mappings. targets: 5 6. info: "}}),
    on(theLUN, "unmapTarget", mappedLUN, [](auto &lun, auto &) { return lun.unmapTarget(std::set<int>{5}); }, "",
       {{"NORViSCSILunMappingsRemove", 18990710, "unmapTarget: Failed to remove mappings. targets: 5. info: "}}),

    on(theLUN, "takeSnapshot", snapshotOfLUN, take, "none 0",
       Failures{{"NORViSCSIUnusedSnapshotNameFind", INJECTED, "takeSnapshot: Failed to find unused snapshot name."},
                {"NORViSCSISnapshotCreate", INJECTED, "takeSnapshot: Failed to take a snapshot."},
                Failure("NLIBCProcForkChildNoWait", 18990014, "takeSnapshot: Failed to fork a process.")
                    .leaving(MADE + " 1")} +
           retention("NORViSCSILunWaitUntilUnlock")),
    on(theLUN, "deleteSnapshot", freeSnapshotOfLUN, [](auto &lun, auto &) { return lun.deleteSnapshot(SNAPSHOT, ""); },
       "", {{"NORViSCSISnapshotDelete", INJECTED, "deleteSnapshot: Failed to delete snapshot. UUID: "}}),
    on(theLUN, "listSnapshot", snapshotOfLUN, list, "5",
       {Failure("NORViSCSIIsSnapshotLocked NORViSCSISnapshotLockedAppKeysGet", INJECTED,
                "listSnapshot: Failed to list snapshots.")
            .leaving("0"),
        Failure("NLIBCSzListAlloc", 18990001, "listSnapshot: Failed to list snapshots.").leaving("0"),
        Failure("NLIBCSzListGet", 18990309, "listSnapshot: Failed to list snapshots.").leaving("0"),
        {"NORViSCSISnapshotConfLoad", 18990573, "listSnapshot: Failed to list snapshots."}}),
    on([] { return ISCSILIBLUN(); }, "listAllSnapshots", scheduledLUN, list, "5",
       {{"NORViSCSISnapshotConfLoad", 18990573, "listSnapshot: Failed to list all snapshots."}}),
    on(theLUN, "restoreSnapshot", snapshotOfLUN, [](auto &lun, auto &) { return lun.restoreSnapshot(SNAPSHOT); }, "",
       {{"NORViSCSISnapshotRestore", INJECTED, Then::CLEANS_UP, ": Failed to restore snapshot. UUID: "},
        {"NLIBCProcForkChildNoWait", 18990014, "restoreSnapshot: Failed to fork a process."},
        {"NORViSCSILunWaitUntilUnlock", 0, "restoreSnapshot: Failed to wait until restoring snapshot completed."},
        {"NORVLogSet1", 0, Then::GOES_ON}}),
    on(theLUN, "stopSnapshot", runningAction, [](auto &lun, auto &) { return lun.stopSnapshot(SNAPSHOT); }, "",
       {{"NORViSCSILunIsLocked", INJECTED, "stopSnapshot: Failed to check if LUN is locked."},
        {"NORViSCSIIsSnapshotLocked", INJECTED, "stopSnapshot: Failed to check if snapshot is locked. UUID: "},
        {"NORViSCSISnapshotUnload", INJECTED, "stopSnapshot: Failed to unload snapshot. UUID: "}}),
    on(theLUN, "loadSnapshot", snapshotOfLUN, [](auto &lun, auto &) { return lun.loadSnapshot(SNAPSHOT, true, false); },
       "",
       {{"NORViSCSISnapshotLoad", INJECTED,
         "loadSnapshot: Failed to load snapshot. UUID: " + SNAPSHOT +
             ", is_for_trash: true, is_for_unsync_size: false info: "}}),
    on(theLUN, "unloadSnapshot", snapshotOfLUN,
       [](auto &lun, auto &) { return lun.unloadSnapshot(SNAPSHOT, true, true); }, "",
       {{"NORViSCSISnapshotUnload", INJECTED,
         "unloadSnapshot: Failed to unload snapshot. UUID: " + SNAPSHOT +
             ", is_for_trash: true, is_for_unsync_size: true info: "}}),
    on(theLUN, "cloneSnapshot", snapshotOfLUN,
       [](auto &lun, auto &outputs) { return lun.cloneSnapshot(SNAPSHOT, "copy", outputs); }, "none",
       {{"NORVLogSet1", 0, Then::GOES_ON},
        {"NORViSCSISnapshotClone", INJECTED, Then::CLEANS_UP, ": Failed to clone snapshot. UUID: "},
        Failure("NLIBCProcForkChildNoWait", 18990014, "cloneSnapshot: Failed to fork a process. info info: ")
            .leaving(MADE),
        {"NORViSCSILunWaitUntilUnlock", 0, "cloneSnapshot: Failed to wait until restoring snapshot completed."}}),
    on(theLUN, "localClone", snapshotOfLUN, [](auto &lun, auto &outputs) { return lun.localClone("copy", outputs); },
       "none", {{"NORViSCSILunClone", INJECTED, "localClone: Failed to clone LUN to copy."}}),
    on(theLUN, "exportLUN", snapshotOfLUN, [](auto &lun, auto &) { return lun.exportLUN(SNAPSHOT, "/export"); }, "",
       {{"NORViSCSISnapshotExport", INJECTED, "exportLUN: Failed to export snapshot. UUID: "}}),
    on(theLUN, "exportCancel", runningAction, [](auto &lun, auto &) { return lun.exportCancel(SNAPSHOT); }, "",
       {{"NORViSCSISnapshotExportCancel", INJECTED, "exportCancel: Failed to cancel export snapshot. UUID: "},
        {"NORViSCSISnapshotWaitUntilUnlock", INJECTED,
         "exportCancel: Failed to wait until cancel export completed. UUID: "}}),
    on(
        theLUN, "importLUN", exportedSnapshot, [](auto &lun, auto &) { return lun.importLUN("/export"); }, "",
        Failures{{"NORViSCSILunImport", INJECTED, "importLUN: Failed to import to LUN."},
                 {"NLIBCProcForkChildNoWait#1", 18990014, "importLUN: Failed to fork a process. info info: "},
                 {"NORViSCSILunWaitUntilUnlock#1 NORViSCSISnapshotExportConfigGet NORViSCSILunConfigGetByUUID#2 "
                  "NORViSCSIUnusedSnapshotNameFind NORViSCSISnapshotCreate",
                  0, "[E] importLUN: error code: 18990999 (Unknown error 18990999) [uuid: "},
                 {"NLIBCFileGetKeyValue", 0, "[E] importLUN: error code: -77 (File descriptor in bad state) [uuid: "},
                 {"NLIBCProcForkChildNoWait#2", 0, "[E] importLUN: error code: 18990014 (Failed to fork) [uuid: "}} +
            retention("NORViSCSILunWaitUntilUnlock#2")),
    on(theLUN, "importCancel", runningAction, [](auto &lun, auto &) { return lun.importCancel(); }, "",
       {{"NORViSCSILunImportCancel", INJECTED, "importCancel: Failed to cancel import to LUN."},
        {"NORViSCSILunWaitUntilUnlock", INJECTED, "importCancel: Failed to wait until cancel import completed."}}),
    on(theLUN, "getImportProgress", exportedSnapshot, importProgress, "9 9 9",
       {Failure("NLIBCFileExist", 0, Then::GOES_ON).leaving("18990593 0 0"),
        Failure("NLIBCFileGetKeyValue", 18990017,
                "getImportProgress: Failed to get import progress from '" + IMPORT_FILE + "': key = step"),
        Failure("NLIBCFileGetKeyValue#2", 18990017).leaving("0 9 9"),
        Failure("NLIBCFileGetKeyValue#3", 18990017).leaving("0 1 9")}),
    on(theLUN, "getSyncProgress", exportedSnapshot, syncProgress, "9 9",
       {{"NORViSCSIChildLunSyncProgressGet", INJECTED, "getSyncProgress: Failed to load sync progress."}}, "0 5"),
};

INSTANTIATE_TEST_SUITE_P(LUNOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

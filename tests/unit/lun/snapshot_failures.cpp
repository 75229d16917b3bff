// What callers of the snapshot, clone, import and export operations see, or the log tells, when a
// platform call of theirs or of their workers fails.
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;
using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const int LID = privateLUNID();
const std::string UUID = uuidOf(LID);
const std::string SNAPSHOT = snapshotUUIDOf(LID, 2);
const std::string MADE = "00000000-0000-4000-8000-000000000001"; // the first that the fake makes
const std::string NO_FORK = "18990014 (Failed to fork)";
const std::string REFUSED = "-77 (File descriptor in bad state)"; // by a function that has no codes
const std::string LIST_REFUSED = ": NORViSCSISnapshotConfLoad({addresses}) failed, err{text}";
const std::string LIST_ERROR = "18990573 (Failed to load snapshot config)";
const std::string IMPORT_FILE = "/tmp/iscsi/L" + std::to_string(LID) + ".import_progress";

void snapshotOfLUN()
{
    addLUN(LID, "vol1");
    addSnapshot(LID, 2, "daily").app_keys = {"backup"};
}

void freeSnapshotOfLUN()
{
    addLUN(LID, "vol1");
    addSnapshot(LID, 2, "daily");
}

void noSnapshots()
{
    addLUN(LID, "vol1");
}

void runningAction()
{
    addLUN(LID, "vol1").is_locked = true;
    addSnapshot(LID, 2, "daily").is_locked = true;
}

void exportedSnapshot()
{
    snapshotOfLUN();
    fake::model().exports["/export"] = {{}, "a note", "bob", EPOCH, 1, 0, {}};
    writeFile(IMPORT_FILE, "step=0\ndone_bytes=1\ntotal_bytes=2\n");
}

void syncedLUN()
{
    addLUN(4, "copy").map_file.to_copy = 5;
}

/// Runs `act` on the LUN; what it writes into the text is the outputs.
template <class... Failures>
Operation onLUN(const char *name, void (*set_up)(), int (*act)(ISCSILIBLUN &, std::string &), const std::string &before,
                const Failures &...failures)
{
    const auto run = [act, before] {
        ISCSILIBLUN lun(UUID);
        std::string outputs = before;
        const int code = act(lun, outputs);
        return Outcome{code, lun.info.toString(), outputs};
    };
    return operation(name, set_up, run, before, failures...);
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

int listAll(ISCSILIBLUN &lun, std::string &outputs)
{
    lun = ISCSILIBLUN();
    return list(lun, outputs);
}

int progress(ISCSILIBLUN &lun, std::string &outputs)
{
    unsigned long long done = 9, total = 9;
    int step = 9;
    const int code = lun.getImportProgress(done, total, step);
    outputs = std::to_string(step) + " " + std::to_string(done) + " " + std::to_string(total);
    return code;
}

int syncProgress(ISCSILIBLUN &lun, std::string &outputs)
{
    lun = ISCSILIBLUN(uuidOf(4));
    unsigned long long done = 9, total = 9;
    const int code = lun.getSyncProgress(done, total);
    outputs = std::to_string(done) + " " + std::to_string(total);
    return code;
}

const std::string NOT_LOADED = "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID;

/// The LUN cannot be loaded, the first time.
Failure noLUN(const std::string &method, const std::string &sentence = "Failed to load LUN info from SDK.")
{
    return stops("NORViSCSILunConfigGetByUUID#1", INJECTED, NOT_LOADED,
                 method + ": " + sentence + " info: {info}. error: {err}");
}

/// A line with the snapshot's UUID.
std::string ofSnapshot(const std::string &sentence, const std::string &rest = " info: {info}. error: {err}")
{
    return sentence + " UUID: " + SNAPSHOT + rest;
}

Failure noSnapshot(const std::string &line)
{
    return stops("NORViSCSISnapshotConfGetByUUID", INJECTED, line);
}

const std::string COMMAS = ", info: {info}, error: {err}";

/// The import's worker fails, with `lines` and the closing one.
template <class... Texts>
Failure endsImport(const std::string &call, const std::string &error, const Texts &...lines)
{
    return endsWorker(call, lines..., "[E] importLUN: error code: " + error + " [{info}]");
}

/// The same within the closing snapshot.
Failure endsSnapshotOfImport(const std::string &call, const std::string &line, const std::string &error = "{err}")
{
    return endsImport(call, error, line, standard("importLUN", "Failed to take snapshot when import done", error));
}

Failure reloadFails()
{
    Failure failure = endsSnapshotOfImport("NORViSCSILunConfigGetByUUID#2",
                                           standard("takeSnapshot", "Failed to load LUN info from SDK"));
    failure.lines.insert(failure.lines.begin(), NOT_LOADED);
    return failure;
}

Failure noImportProgress(int n, const std::string &key)
{
    return stops("NLIBCFileGetKeyValue#" + std::to_string(n), 18990017,
                 "getImportProgress: Failed to get import progress from '" + IMPORT_FILE + "': key = " + key);
}

const Operation operations[] = {
    onLUN("takeSnapshot", snapshotOfLUN, take, "none 0", noLUN("takeSnapshot"),
          stops("NORViSCSIUnusedSnapshotNameFind", INJECTED,
                standard("takeSnapshot", "Failed to find unused snapshot name")),
          stops("NORViSCSISnapshotCreate", INJECTED, standard("takeSnapshot", "Failed to take a snapshot")),
          stops("NLIBCProcForkChildNoWait", 18990014, standard("takeSnapshot", "Failed to fork a process", NO_FORK))
              .leaving(MADE + " 1"),
          endsWorker("NORViSCSILunWaitUntilUnlock",
                     standard("takeSnapshot", "Failed to wait until taking snapshot completed")),
          endsWorker("NORVRETENTIONRunPolicy", standard("takeSnapshot", "Failed to run retention policy", REFUSED))),
    onLUN(
        "deleteSnapshot", freeSnapshotOfLUN, [](auto &lun, auto &) { return lun.deleteSnapshot(SNAPSHOT, ""); }, "",
        noSnapshot(ofSnapshot("deleteSnapshot: Failed to load snapshot config.")),
        stops("NORViSCSISnapshotDelete", INJECTED, ofSnapshot("deleteSnapshot: Failed to delete snapshot."))),
    onLUN("listSnapshot", snapshotOfLUN, list, "5", noLUN("listSnapshot"),
          stops("NORViSCSIIsSnapshotLocked", INJECTED,
                "ListSnapshot: Failed to check if snapshot is locked. err: {err}",
                standard("listSnapshot", "Failed to list snapshots"))
              .leaving("0"),
          stops("NLIBCSzListAlloc", 18990001, "ListSnapshot: Failed to allocate memory for list.",
                standard("listSnapshot", "Failed to list snapshots", "18990001 (Out of memory)"))
              .leaving("0"),
          stops("NORViSCSISnapshotLockedAppKeysGet", INJECTED,
                "ListSnapshot: Failed to get locked app key for snapshot: " + SNAPSHOT + ".",
                standard("listSnapshot", "Failed to list snapshots"))
              .leaving("0"),
          stops("NLIBCSzListGet", 18990309, ": Failed to get line from list. index: 0",
                standard("listSnapshot", "Failed to list snapshots", "18990309 (Failed to get from list)"))
              .leaving("0"),
          stops("NORViSCSISnapshotConfLoad", 18990573, LIST_REFUSED,
                standard("listSnapshot", "Failed to list snapshots", LIST_ERROR))),
    onLUN("listAllSnapshots", noSnapshots, listAll, "5",
          stops("NORViSCSISnapshotConfLoad", 18990573, LIST_REFUSED,
                standard("listSnapshot", "Failed to list all snapshots", LIST_ERROR))),
    onLUN(
        "restoreSnapshot", snapshotOfLUN, [](auto &lun, auto &) { return lun.restoreSnapshot(SNAPSHOT); }, "",
        noLUN("restoreSnapshot"), noSnapshot(ofSnapshot(": Failed to load snapshot config.", COMMAS)),
        Failure{"NORViSCSISnapshotRestore", INJECTED, {ofSnapshot(": Failed to restore snapshot.", COMMAS)}, true},
        stops("NLIBCProcForkChildNoWait", 18990014, standard("restoreSnapshot", "Failed to fork a process", NO_FORK)),
        endsWorker("NORViSCSILunWaitUntilUnlock",
                   standard("restoreSnapshot", "Failed to wait until restoring snapshot completed")),
        endsWorker("NORVLogSet1")),
    onLUN(
        "stopSnapshot", runningAction, [](auto &lun, auto &) { return lun.stopSnapshot(SNAPSHOT); }, "",
        noLUN("stopSnapshot"), noSnapshot(ofSnapshot("stopSnapshot: Failed to load snapshot config.")),
        stops("NORViSCSILunIsLocked", INJECTED, standard("stopSnapshot", "Failed to check if LUN is locked")),
        stops("NORViSCSIIsSnapshotLocked", INJECTED,
              ofSnapshot("stopSnapshot: Failed to check if snapshot is locked.")),
        stops("NORViSCSISnapshotUnload", INJECTED, ofSnapshot("stopSnapshot: Failed to unload snapshot."))),
    onLUN(
        "loadSnapshot", snapshotOfLUN, [](auto &lun, auto &) { return lun.loadSnapshot(SNAPSHOT, true, false); }, "",
        noSnapshot("loadSnapshot: Failed to load snapshot config by UUID: " + SNAPSHOT +
                   ". info: {info}. error: {err}"),
        stops("NORViSCSISnapshotLoad", INJECTED,
              ofSnapshot("loadSnapshot: Failed to load snapshot.",
                         ", is_for_trash: true, is_for_unsync_size: false info: {info}. error: {err}"))),
    onLUN(
        "unloadSnapshot", snapshotOfLUN, [](auto &lun, auto &) { return lun.unloadSnapshot(SNAPSHOT, true, true); }, "",
        noSnapshot("unloadSnapshot: Failed to load snapshot config by UUID: " + SNAPSHOT +
                   ". info: {info}. error: {err}"),
        stops("NORViSCSISnapshotUnload", INJECTED,
              ofSnapshot("unloadSnapshot: Failed to unload snapshot.",
                         ", is_for_trash: true, is_for_unsync_size: true info: {info}. error: {err}"))),
    onLUN(
        "cloneSnapshot", snapshotOfLUN,
        [](auto &lun, auto &outputs) { return lun.cloneSnapshot(SNAPSHOT, "copy", outputs); }, "none",
        noLUN("cloneSnapshot"), noSnapshot(ofSnapshot(": Failed to load snapshot config.", COMMAS)),
        goesOn("NORVLogSet1#1").leaving(MADE),
        Failure{"NORViSCSISnapshotClone", INJECTED, {ofSnapshot(": Failed to clone snapshot.", COMMAS)}, true},
        stops("NLIBCProcForkChildNoWait", 18990014,
              "cloneSnapshot: Failed to fork a process. info info: {info}. error: " + NO_FORK)
            .leaving(MADE),
        endsWorker("NORViSCSILunWaitUntilUnlock",
                   standard("cloneSnapshot", "Failed to wait until restoring snapshot completed")),
        workerGoesOn("NORVLogSet1#2"), endsWorker("NORVLogSet1#3")),
    onLUN(
        "localClone", snapshotOfLUN, [](auto &lun, auto &outputs) { return lun.localClone("copy", outputs); }, "none",
        noLUN("localClone", "Failed to load LUN config."),
        stops("NORViSCSILunClone", INJECTED, standard("localClone", "Failed to clone LUN to copy"))),
    onLUN(
        "exportLUN", snapshotOfLUN, [](auto &lun, auto &) { return lun.exportLUN(SNAPSHOT, "/export"); }, "",
        noSnapshot(ofSnapshot("exportLUN: Failed to load snapshot config.", ".")),
        stops("NORViSCSISnapshotExport", INJECTED, ofSnapshot("exportLUN: Failed to export snapshot.", "."))),
    onLUN(
        "exportCancel", runningAction, [](auto &lun, auto &) { return lun.exportCancel(SNAPSHOT); }, "",
        noSnapshot(ofSnapshot("exportCancel: Failed to load snapshot config.", ".")),
        stops("NORViSCSISnapshotExportCancel", INJECTED,
              ofSnapshot("exportCancel: Failed to cancel export snapshot.", ".")),
        stops("NORViSCSISnapshotWaitUntilUnlock", INJECTED,
              ofSnapshot("exportCancel: Failed to wait until cancel export completed.", "."))),
    onLUN(
        "importLUN", exportedSnapshot, [](auto &lun, auto &) { return lun.importLUN("/export"); }, "",
        noLUN("importLUN"), stops("NORViSCSILunImport", INJECTED, standard("importLUN", "Failed to import to LUN")),
        stops("NLIBCProcForkChildNoWait#1", 18990014,
              "importLUN: Failed to fork a process. info info: {info}. error: " + NO_FORK),
        endsImport("NORViSCSILunWaitUntilUnlock#1", "{err}",
                   standard("importLUN", "Failed to wait until LUN is unlocked")),
        endsImport("NLIBCFileGetKeyValue", REFUSED,
                   standard("importLUN", "Failed to get the status of import", REFUSED)),
        endsImport("NORViSCSISnapshotExportConfigGet", "{err}",
                   "importLUN: Failed to get export config from directory '/export' info: {info}. error: {err}"),
        reloadFails(),
        endsSnapshotOfImport("NORViSCSIUnusedSnapshotNameFind",
                             standard("takeSnapshot", "Failed to find unused snapshot name")),
        endsSnapshotOfImport("NORViSCSISnapshotCreate", standard("takeSnapshot", "Failed to take a snapshot")),
        endsSnapshotOfImport("NLIBCProcForkChildNoWait#2",
                             standard("takeSnapshot", "Failed to fork a process", NO_FORK), NO_FORK),
        endsWorker("NORViSCSILunWaitUntilUnlock#2",
                   standard("takeSnapshot", "Failed to wait until taking snapshot completed")),
        endsWorker("NORVRETENTIONRunPolicy", standard("takeSnapshot", "Failed to run retention policy", REFUSED))),
    onLUN(
        "importCancel", runningAction, [](auto &lun, auto &) { return lun.importCancel(); }, "", noLUN("importCancel"),
        stops("NORViSCSILunImportCancel", INJECTED, standard("importCancel", "Failed to cancel import to LUN")),
        stops("NORViSCSILunWaitUntilUnlock", INJECTED,
              standard("importCancel", "Failed to wait until cancel import completed"))),
    onLUN("getImportProgress", exportedSnapshot, progress, "9 9 9",
          noLUN("getImportProgress", "Failed to load LUN info from SDK"),
          stops("NLIBCFileExist", 0).leaving("18990593 0 0"), noImportProgress(1, "step"),
          noImportProgress(2, "done_bytes").leaving("0 9 9"), noImportProgress(3, "total_bytes").leaving("0 1 9")),
    onLUN("getSyncProgress", syncedLUN, syncProgress, "9 9",
          stops("NORViSCSILunConfigGetByUUID", INJECTED,
                "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + uuidOf(4),
                standard("getSyncProgress", "Failed to load LUN info from SDK")),
          stops("NORViSCSIChildLunSyncProgressGet", INJECTED,
                standard("loadSyncProgress", "Failed to get LUN sync progress"),
                standard("getSyncProgress", "Failed to load sync progress"))),
};

INSTANTIATE_TEST_SUITE_P(SnapshotOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

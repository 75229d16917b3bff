// What callers of the snapshot record see when a platform call fails.
#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;

const int LID = privateLUNID();
const std::string EXPORT_FILE = "/tmp/iscsi/L" + std::to_string(LID) + "_S2.export_progress";

ISCSISnapshotInfo theSnapshot()
{
    return ISCSISnapshotInfo(snapshotUUIDOf(LID, 2));
}

void exportedSnapshot()
{
    addLUN(LID, "vol1");
    auto &daily = addSnapshot(LID, 2, "daily");
    daily.is_locked = true;
    daily.app_keys = {"backup"};
    daily.to_copy = 5;
    writeFile(EXPORT_FILE, "step=0\ndone_bytes=1\ntotal_bytes=2\n");
}

template <int (ISCSISnapshotInfo::*load)(_tag_iscsi_snapshot_ &)>
int loadFact(ISCSISnapshotInfo &snapshot, std::string &outputs)
{
    _tag_iscsi_snapshot_ record{};
    const int code = (snapshot.*load)(record);
    outputs = (snapshot.is_action_locked ? "locked " : "free ") + std::to_string(snapshot.locked_app_keys.size());
    return code;
}

int exportProgress(ISCSISnapshotInfo &snapshot, std::string &outputs)
{
    unsigned long long done = 9, total = 9;
    int step = 9;
    const int code = snapshot.getExportProgress(done, total, step);
    outputs = std::to_string(step) + " " + std::to_string(done) + " " + std::to_string(total);
    return code;
}

int syncProgress(ISCSISnapshotInfo &snapshot, std::string &outputs)
{
    unsigned long long done = 9, total = 9;
    const int code = snapshot.loadSyncProgress(done, total);
    outputs = std::to_string(done) + " " + std::to_string(total);
    return code;
}

Failures notLoaded(const std::string &sentence)
{
    return {{"NORViSCSISnapshotConfGetByUUID", INJECTED, sentence}};
}

const Failures NO_LOCK = {
    {"NORViSCSIIsSnapshotLocked", INJECTED,
     "loadActionLock: Failed to check if snapshot is locked. err: Unknown error 18990999, info: "}};
const Failures NO_KEYS = {
    {"NLIBCSzListAlloc", 18990001, "loadLockedAppKeys: Failed to allocate memory for list."},
    {"NORViSCSISnapshotLockedAppKeysGet", INJECTED, "loadLockedAppKeys: Failed to get locked app key for snapshot: "},
    {"NLIBCSzListGet", 18990309, ": Failed to get line from list. index: 0"}};

const Operation operations[] = {
    on(
        theSnapshot, "SnapshotLoadFromConfig", exportedSnapshot,
        [](auto &snapshot, auto &) { return snapshot.loadFromConfig(3); }, "",
        notLoaded("loadFromConfig: Failed to load snapshot config. UUID: ") +
            Failures{{"NORViSCSIIsSnapshotLocked", INJECTED, "loadFromConfig: Failed to check if snapshot is locked."},
                     {"NORViSCSISnapshotLockedAppKeysGet", INJECTED, "loadFromConfig: Failed to load locked app keys."},
                     {"NLIBCSzListAlloc", 18990001, "loadFromConfig: Failed to load locked app keys."},
                     {"NLIBCSzListGet", 18990309, "loadFromConfig: Failed to load locked app keys."}}),
    on(theSnapshot, "loadActionLock", exportedSnapshot, loadFact<&ISCSISnapshotInfo::loadActionLock>, "free 0",
       NO_LOCK + notLoaded("loadActionLock: Failed to load snapshot. err: Unknown error 18990999, info: ")),
    on(theSnapshot, "loadLockedAppKeys", exportedSnapshot, loadFact<&ISCSISnapshotInfo::loadLockedAppKeys>, "free 0",
       NO_KEYS + notLoaded("loadLockedAppKeys: Failed to load snapshot. err: ")),
    on(theSnapshot, "lockSnapshotByAppKey", exportedSnapshot,
       [](auto &snapshot, auto &) { return snapshot.lockSnapshotByAppKey("key"); }, "",
       {{"NORViSCSISnapshotLockByAppKey", INJECTED, "lockSnapshotByAppKey: Failed to lock snapshot by app key: key."}}),
    on(theSnapshot, "unlockSnapshotByAppKey", exportedSnapshot,
       [](auto &snapshot, auto &) { return snapshot.unlockSnapshotByAppKey("backup"); }, "",
       {{"NORViSCSISnapshotUnlockByAppKey", INJECTED,
         "unlockSnapshotByAppKey: Failed to unlock snapshot by app key: backup."}}),
    on(theSnapshot, "SnapshotLoadSyncProgress", exportedSnapshot, syncProgress, "9 9",
       notLoaded("loadSyncProgress: Failed to load snapshot.") +
           Failures{{"NORViSCSIChildLunSyncProgressGet", INJECTED,
                     "loadSyncProgress: Failed to get snapshot sync progress."}}),
    on(theSnapshot, "getExportProgress", exportedSnapshot, exportProgress, "9 9 9",
       {Failure("NLIBCFileExist", 0, Then::GOES_ON).leaving("18990592 0 0"),
        {"NLIBCFileGetKeyValue", 18990017, ": Failed to get export progress from '" + EXPORT_FILE + "': key = step"},
        Failure("NLIBCFileGetKeyValue#2", 18990017).leaving("0 9 9"),
        Failure("NLIBCFileGetKeyValue#3", 18990017).leaving("0 1 9")}),
    {"GetSnapshotUUIDByIndex",
     exportedSnapshot,
     [](auto &uuid) { return ISCSISnapshotInfo::GetSnapshotUUID("sn#1", uuid); },
     "before",
     {{"NORViSCSISnapshotConfLoad", 18990573, ": Failed to list snapshots."}}},
    {"GetSnapshotUUIDByName",
     exportedSnapshot,
     [](auto &uuid) { return ISCSISnapshotInfo::GetSnapshotUUID("vol1_daily", uuid); },
     "before",
     {{"NORViSCSILunGetByLunName NORViSCSISnapshotConfGetByLIDAndName", 18990520}}},
};

INSTANTIATE_TEST_SUITE_P(SnapshotRecord, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

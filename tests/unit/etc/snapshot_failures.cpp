// What callers of the snapshot record see when a platform call fails.
#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;

const int LID = privateLUNID();
const std::string UUID = snapshotUUIDOf(LID, 2);
const std::string LIST_REFUSED = ": NORViSCSISnapshotConfLoad({addresses}) failed, err{text}";
const std::string EXPORT_FILE = "/tmp/iscsi/L" + std::to_string(LID) + "_S2.export_progress";

void exportedSnapshot()
{
    addLUN(LID, "vol1");
    auto &daily = addSnapshot(LID, 2, "daily");
    daily.is_locked = true;
    daily.app_keys = {"backup"};
    daily.to_copy = 5;
    writeFile(EXPORT_FILE, "step=0\ndone_bytes=1\ntotal_bytes=2\n");
}

/// Runs `act` on the record; what it writes into the text is the outputs.
template <class... Failures>
Operation onSnapshot(const char *name, int (*act)(ISCSISnapshotInfo &, std::string &), const std::string &before,
                     const Failures &...failures)
{
    const auto run = [act, before] {
        ISCSISnapshotInfo snapshot(UUID);
        std::string outputs = before;
        const int code = act(snapshot, outputs);
        return Outcome{code, snapshot.toString(), outputs};
    };
    return operation(name, exportedSnapshot, run, before, failures...);
}

template <class Loader>
int loadFact(ISCSISnapshotInfo &snapshot, std::string &outputs, Loader loader)
{
    _tag_iscsi_snapshot_ record{};
    const int code = (snapshot.*loader)(record);
    outputs = (snapshot.is_action_locked ? "locked " : "free ") + std::to_string(snapshot.locked_app_keys.size());
    return code;
}

template <class Reader>
int readBytes(Reader reader, std::string &outputs)
{
    unsigned long long done = 9, total = 9;
    const int code = reader(done, total);
    outputs += std::to_string(done) + " " + std::to_string(total);
    return code;
}

int exportProgress(ISCSISnapshotInfo &snapshot, std::string &outputs)
{
    int step = 9;
    outputs.clear();
    const int code =
        readBytes([&](auto &done, auto &total) { return snapshot.getExportProgress(done, total, step); }, outputs);
    outputs = std::to_string(step) + " " + outputs;
    return code;
}

int syncProgress(ISCSISnapshotInfo &snapshot, std::string &outputs)
{
    outputs.clear();
    return readBytes([&](auto &done, auto &total) { return snapshot.loadSyncProgress(done, total); }, outputs);
}

/// The snapshot cannot be loaded into an SDK record.
Failure notLoaded(const std::string &method)
{
    return stops("NORViSCSISnapshotConfGetByUUID", INJECTED,
                 method + ": Failed to load snapshot. err: {text}, info: {info}");
}

/// The failures of loadLockedAppKeys, as `method` tells them too unless that is empty.
std::vector<Failure> noAppKeys(const std::string &method)
{
    std::vector<Failure> failures = {
        stops("NLIBCSzListAlloc", 18990001, "loadLockedAppKeys: Failed to allocate memory for list."),
        stops("NORViSCSISnapshotLockedAppKeysGet", INJECTED,
              "loadLockedAppKeys: Failed to get locked app key for snapshot: " + UUID + "."),
        stops("NLIBCSzListGet", 18990309, ": Failed to get line from list. index: 0"),
    };
    const char *const errors[] = {"18990001 (Out of memory)", "{err}", "18990309 (Failed to get from list)"};
    for (size_t i = 0; i < failures.size() && !method.empty(); ++i)
        failures[i].lines.push_back(standard(method, "Failed to load locked app keys", errors[i]));
    return failures;
}

Operation with(Operation operation, const std::vector<Failure> &more)
{
    operation.failures.insert(operation.failures.end(), more.begin(), more.end());
    return operation;
}

Failure noExportProgress(int n, const std::string &key)
{
    return stops("NLIBCFileGetKeyValue#" + std::to_string(n), 18990017,
                 ": Failed to get export progress from '" + EXPORT_FILE + "': key = " + key);
}

template <class... Failures>
Operation select(const char *name, const std::string &selector, const Failures &...failures)
{
    const auto run = [selector] {
        std::string uuid = "before";
        const int code = ISCSISnapshotInfo::GetSnapshotUUID(selector, uuid);
        return Outcome{code, "", uuid};
    };
    return operation(name, exportedSnapshot, run, "before", failures...);
}

const Operation operations[] = {
    with(onSnapshot(
             "SnapshotLoadFromConfig", [](auto &snapshot, auto &) { return snapshot.loadFromConfig(3); }, "",
             stops("NORViSCSISnapshotConfGetByUUID", INJECTED,
                   "loadFromConfig: Failed to load snapshot config. UUID: " + UUID),
             stops("NORViSCSIIsSnapshotLocked", INJECTED,
                   "loadActionLock: Failed to check if snapshot is locked. err: {text}, info: {info}",
                   standard("loadFromConfig", "Failed to check if snapshot is locked"))),
         noAppKeys("loadFromConfig")),
    onSnapshot(
        "loadActionLock",
        [](auto &snapshot, auto &outputs) { return loadFact(snapshot, outputs, &ISCSISnapshotInfo::loadActionLock); },
        "free 0", notLoaded("loadActionLock"),
        stops("NORViSCSIIsSnapshotLocked", INJECTED,
              "loadActionLock: Failed to check if snapshot is locked. err: {text}, info: {info}")),
    with(onSnapshot(
             "loadLockedAppKeys",
             [](auto &snapshot, auto &outputs) {
                 return loadFact(snapshot, outputs, &ISCSISnapshotInfo::loadLockedAppKeys);
             },
             "free 0", notLoaded("loadLockedAppKeys")),
         noAppKeys("")),
    onSnapshot(
        "lockSnapshotByAppKey", [](auto &snapshot, auto &) { return snapshot.lockSnapshotByAppKey("key"); }, "",
        notLoaded("lockSnapshotByAppKey"),
        stops("NORViSCSISnapshotLockByAppKey", INJECTED,
              "lockSnapshotByAppKey: Failed to lock snapshot by app key: key.")),
    onSnapshot(
        "unlockSnapshotByAppKey", [](auto &snapshot, auto &) { return snapshot.unlockSnapshotByAppKey("backup"); }, "",
        notLoaded("unlockSnapshotByAppKey"),
        stops("NORViSCSISnapshotUnlockByAppKey", INJECTED,
              "unlockSnapshotByAppKey: Failed to unlock snapshot by app key: backup.")),
    onSnapshot(
        "SnapshotLoadSyncProgress", syncProgress, "9 9",
        stops("NORViSCSISnapshotConfGetByUUID", INJECTED, standard("loadSyncProgress", "Failed to load snapshot")),
        stops("NORViSCSIChildLunSyncProgressGet", INJECTED,
              standard("loadSyncProgress", "Failed to get snapshot sync progress"))),
    onSnapshot("getExportProgress", exportProgress, "9 9 9", notLoaded("getExportProgress"),
               stops("NLIBCFileExist", 0).leaving("18990592 0 0"), noExportProgress(1, "step"),
               noExportProgress(2, "done_bytes").leaving("0 9 9"), noExportProgress(3, "total_bytes").leaving("0 1 9")),
    select("GetSnapshotUUIDByIndex", "sn#1",
           stops("NORViSCSISnapshotConfLoad", 18990573, LIST_REFUSED, ": Failed to list snapshots.")),
    select(
        "GetSnapshotUUIDByName", "vol1_daily",
        stops("NORViSCSILunGetByLunName", 18990520, "GetLIDByLUNName: No such LUN. Name: vol1",
              ": Failed to get lid by LUN name: vol1."),
        stops("NORViSCSISnapshotConfGetByLIDAndName", 18990520,
              "GetUUIDByLIDAndSnapshotName: No such snapshot. lid: " + std::to_string(LID) + ", name: daily",
              ": Failed to get snapshot UUID by lid and snapshot name. lid: " + std::to_string(LID) + ", name: daily")),
};

INSTANTIATE_TEST_SUITE_P(SnapshotRecord, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

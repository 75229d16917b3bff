// What callers of the records see when a platform call fails.
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSITargetInfo.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;
using ISCSI::ISCSITargetInfo;

const std::string UUID = uuidOf(3);
const std::string LIST_FAILED = "18990557 (Failed to list LUN)";
const std::string NOT_FOUND = "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID;

void twoLUNs()
{
    addLUN(3, "vol1");
    addLUN(4, "vol2");
}

/// A LUN whose every state differs from that of a record not loaded yet.
void busyLUN()
{
    auto &lun = addLUN(3, "vol1");
    lun.is_locked = true;
    lun.map_file = {NORV_ZERO_UUID, "aaaaaaaa-0000-4000-8000-000000000000", 1536, 10, 5, 2, 4};
    addTarget(5, "five");
    addMapping(5, 3);
}

/// The loaders' failures as reported by a method that runs them all, for the n-th LUN that it loads.
std::vector<Failure> liveState(const std::string &method, int n, int lid, const std::string &map_file)
{
    const std::string nth = "#" + std::to_string(n);
    return {
        stops("NORViSCSILunIsLocked" + nth, INJECTED,
              "loadIsActionLocked: Failed to check if LUN is locked. err: {text}, info: {info}",
              standard(method, "Failed to check if LUN is locked")),
        stops("NORViSCSIConfGet" + nth, 18990557,
              "loadIsMapped: Failed to list LUN's mapping targets. LUN ID: " + std::to_string(lid),
              standard(method, "Failed to check if LUN is mapped", LIST_FAILED)),
        stops("NORVExtentPoolMapFileMappedSizeGet" + nth, INJECTED,
              "loadAllocatedSize: Failed to get mapped size from " + map_file,
              standard(method, "Failed to load LUN's allocate size")),
    };
}

Operation loadEverything(const char *name, int quiet, const Failure &not_found)
{
    const auto run = [quiet] {
        ISCSILUNInfo lun(UUID);
        _tag_iscsi_lun_ record{};
        const int code = lun.loadFromConfig(record, 62 | quiet);
        return Outcome{code, lun.toString()};
    };
    auto result = operation(name, busyLUN, run, "", not_found, stops("NLIBCExec", 0), goesOn("NORViSCSILunProgressGet"),
                            stops("NORViSCSIFamilyConfGetByLID", 0));
    for (const auto &failure : liveState("loadFromConfig", 1, 3, "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000"))
        result.failures.push_back(failure);
    return result;
}

/// After a failure the list holds the LUNs before the failing one.
Operation listLUNs()
{
    const auto run = [] {
        std::vector<ISCSILUNInfo> luns{ISCSILUNInfo("before")};
        const int code = ISCSILUNInfo::ListLUN(luns, 62);
        std::string names = "list:";
        for (const auto &lun : luns)
            names += " " + (lun.name.empty() ? lun.uuid : lun.name);
        return Outcome{code, ISCSILUNInfo(recordOf(luns.empty() ? 3 : 4)).toString(), names};
    };
    const std::string all = "list: vol1 vol2";
    auto result =
        operation("ListLUN", twoLUNs, run, "list: before",
                  stops("NORViSCSILunConfigGetAll", 18990557, "ListLUN: Failed to list LUNs' config."),
                  goesOn("NLIBCExec#1").leaving(all), stops("NLIBCExec#2", 0).leaving(all),
                  goesOn("NORViSCSILunProgressGet").leaving(all), goesOn("NORViSCSIFamilyConfGetByLID#1").leaving(all),
                  stops("NORViSCSIFamilyConfGetByLID#2", 0).leaving(all));
    for (const auto &failure : liveState("ListLUN", 1, 3, "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000"))
        result.failures.push_back(failure.leaving("list:"));
    for (const auto &failure : liveState("ListLUN", 2, 4, "/volume1/@iSCSITrg/iSCSI_4_Extent_vol2_000"))
        result.failures.push_back(failure.leaving("list: vol1"));
    return result;
}

/// Runs a loader on a record that holds no LUN yet.
template <class... Failures>
Operation loader(const std::string &name, int (ISCSILUNInfo::*load)(_tag_iscsi_lun_ &), const Failures &...failures)
{
    const auto run = [load] {
        ISCSILUNInfo lun(0, NORV_LUN_TYPE_NONE, 0, 0, UUID, "", "", false, false, 1, 2, "before");
        _tag_iscsi_lun_ record{};
        const int code = (lun.*load)(record);
        return Outcome{code, lun.toString(),
                       testing::PrintToString(std::make_tuple(lun.is_action_locked, lun.is_mapped, lun.extent_size,
                                                              lun.allocated_size, lun.status))};
    };
    return operation(
        name.c_str(), busyLUN, run, "(false, false, 1, 2, \"before\")",
        stops("NORViSCSILunConfigGetByUUID", INJECTED, name + ": Failed to load LUN info from SDK. LUN UUID: " + UUID),
        failures...);
}

/// Asks about the LUN's map file; the answer is other than `untouched`.
template <class Answer, class... Failures>
Operation question(const std::string &name, int (ISCSILUNInfo::*ask)(Answer &), Answer untouched,
                   const Failures &...failures)
{
    const auto run = [ask, untouched] {
        ISCSILUNInfo lun(UUID);
        Answer answer = untouched;
        const int code = (lun.*ask)(answer);
        return Outcome{code, lun.toString(), testing::PrintToString(answer)};
    };
    return operation(name.c_str(), busyLUN, run, testing::PrintToString(untouched),
                     stops("NORViSCSILunConfigGetByUUID", INJECTED, NOT_FOUND,
                           name + ": Failed to load LUN info. LUN UUID: " + UUID),
                     failures...);
}

Outcome syncProgress()
{
    ISCSILUNInfo lun(UUID);
    _tag_iscsi_lun_ record{};
    unsigned long long first = 77, second = 88;
    const int code = lun.loadSyncProgress(record, first, second);
    return {code, lun.toString(), std::to_string(first) + " " + std::to_string(second)};
}

template <class Key, class Value>
Operation lookup(const char *name, int (*look)(Key, Value &), std::decay_t<Key> key, Value untouched,
                 const Failure &failure)
{
    const auto run = [look, key, untouched] {
        Value value = untouched;
        const int code = look(key, value);
        return Outcome{code, "", testing::PrintToString(value)};
    };
    const auto set_up = [] {
        twoLUNs();
        addTarget(5, "five");
    };
    return operation(name, set_up, run, testing::PrintToString(untouched), failure);
}

template <class... Failures>
Operation listTargets(const char *name, const std::string &lun_uuid, const Failures &...failures)
{
    const auto run = [lun_uuid] {
        std::vector<ISCSITargetInfo> targets{ISCSITargetInfo(9)};
        const int code = ISCSITargetInfo::ListTarget(targets, lun_uuid);
        return Outcome{code, ISCSILUNInfo(lun_uuid).toString(), std::to_string(targets.size()) + " targets"};
    };
    return operation(name, busyLUN, run, "0 targets", failures...);
}

Outcome loadTarget()
{
    ISCSITargetInfo target(5);
    target.name = "before";
    _tag_iscsi_target_ record{};
    const int code = target.loadFromConfig(record);
    return {code, target.toString(), target.name + " " + std::to_string(record.tid)};
}

const Operation operations[] = {
    loadEverything("loadFromConfig", 0, stops("NORViSCSILunConfigGetByUUID", INJECTED, NOT_FOUND)),
    loadEverything("loadFromConfigQuietly", 1, stops("NORViSCSILunConfigGetByUUID", INJECTED)),
    listLUNs(),
    loader("loadIsActionLocked", &ISCSILUNInfo::loadIsActionLocked,
           stops("NORViSCSILunIsLocked", INJECTED,
                 "loadIsActionLocked: Failed to check if LUN is locked. err: {text}, info: {info}")),
    loader("loadIsMapped", &ISCSILUNInfo::loadIsMapped,
           stops("NORViSCSIConfGet", 18990557, "loadIsMapped: Failed to list LUN's mapping targets. LUN ID: 3")),
    loader("loadExtentSize", &ISCSILUNInfo::loadExtentSize),
    loader("loadAllocatedSize", &ISCSILUNInfo::loadAllocatedSize,
           stops("NORVExtentPoolMapFileMappedSizeGet", INJECTED,
                 "loadAllocatedSize: Failed to get mapped size from /volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000")),
    loader("loadStatus", &ISCSILUNInfo::loadStatus,
           stops("NLIBCExec", 0).leaving("(false, false, 1, 2, \"unavailabling\")"),
           goesOn("NORViSCSILunProgressGet").leaving("(false, false, 1, 2, \"normal\")"),
           stops("NORViSCSIFamilyConfGetByLID", 0).leaving("(false, false, 1, 2, \"normal\")")),
    question("getBaseVersion", &ISCSILUNInfo::getBaseVersion, std::string("before"),
             stops("NORVExtentPoolMapFileBaseVersionGet", INJECTED,
                   "getBaseVersion: Failed to get LUN base version. LUN UUID: " + UUID)),
    question("isModified", &ISCSILUNInfo::isModified, false,
             stops("NORVExtentPoolMapFileVersionInfoGet", INJECTED,
                   "isModified: Failed to get LUN version info. LUN UUID: " + UUID)),
    question("isSnapshotSentFailed", &ISCSILUNInfo::isSnapshotSentFailed, false,
             stops("NORVExtentPoolMapFileVersionInfoGet", INJECTED,
                   "isSnapshotSentFailed: Failed to get LUN's version info. LUN UUID: " + UUID),
             stops("NORVExtentPoolMapFileTotalCountGet", INJECTED,
                   "isSnapshotSentFailed: Failed to get LUN's total count. LUN UUID: " + UUID),
             stops("NORVExtentPoolMapFileSyncedCountGet", INJECTED,
                   "isSnapshotSentFailed: Failed to get LUN's synced count. LUN UUID: " + UUID)),
    operation("loadSyncProgress", busyLUN, syncProgress, "77 88",
              stops("NORViSCSILunConfigGetByUUID", INJECTED,
                    "loadSyncProgress: Failed to load LUN info from SDK. LUN UUID: " + UUID),
              stops("NORViSCSIChildLunSyncProgressGet", INJECTED,
                    standard("loadSyncProgress", "Failed to get LUN sync progress"))),
    lookup("GetUUIDByLID", &ISCSILUNInfo::GetUUIDByLID, 3, std::string("before"),
           stops("NORViSCSILunGetByLunId", 18990531, "GetUUIDByLID: No such LUN. LUN ID: 3")),
    lookup("GetUUIDByLUNName", &ISCSILUNInfo::GetUUIDByLUNName, "vol1", std::string("before"),
           stops("NORViSCSILunGetByLunName", 18990531, "GetUUIDByLUNName: No such LUN. Name: vol1")),
    lookup("GetLIDByLUNName", &ISCSILUNInfo::GetLIDByLUNName, "vol1", -5,
           stops("NORViSCSILunGetByLunName", 18990531, "GetLIDByLUNName: No such LUN. Name: vol1")),
    lookup(
        "GetLUNUUIDByIndex", &ISCSILUNInfo::GetLUNUUID, "lun#2", std::string("before"),
        stops("NORViSCSILunConfigGetAll", 18990557, "ListLUN: Failed to list LUNs' config.", ": Failed to list LUNs.")),
    lookup("GetLUNUUIDByName", &ISCSILUNInfo::GetLUNUUID, "vol1", std::string("before"),
           stops("NORViSCSILunGetByLunName", 18990505, "GetUUIDByLUNName: No such LUN. Name: vol1",
                 ": Invalid LUN UUID, name or index. input: vol1")),
    operation("TargetLoadFromConfig", busyLUN, loadTarget, "before 0",
              stops("NORViSCSIConfGet", 18990722, "loadFromConfig: Failed to load target info. target ID: 5")),
    listTargets("ListTarget", "", stops("NORViSCSIConfGet", 18990721, "ListTarget: Failed to list target. LUN UUID: ")),
    listTargets(
        "ListTargetOfLUN", UUID,
        stops("NORViSCSILunConfigGetByUUID", INJECTED, NOT_FOUND, "ListTarget: Failed to load LUN info: {info}"),
        stops("NORViSCSIConfGet", 18990721, "ListTarget: Failed to list target. LUN UUID: " + UUID)),
    lookup("GetTIDByTargetName", &ISCSITargetInfo::GetTIDByTargetName, "five", -5,
           stops("NORViSCSIConfTargetLoad", INJECTED, "GetTIDByTargetName: Failed to load target config.")),
    lookup("GetTIDByIndex", &ISCSITargetInfo::GetTID, "tg#1", -5,
           stops("NORViSCSIConfGet", 18990721,
                 "ListTarget: Failed to list target. LUN UUID: ", ": Failed to list targets.")),
    lookup("GetTIDByName", &ISCSITargetInfo::GetTID, "five", -5,
           stops("NORViSCSIConfTargetLoad", 18990710, "GetTIDByTargetName: Failed to load target config.",
                 ": Invalid target ID, name or index. input: five")),
};

INSTANTIATE_TEST_SUITE_P(Records, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

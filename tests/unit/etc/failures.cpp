// What callers of the records see when a platform call fails.
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "iscsiwebapi/ISCSILIBTarget.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;
using ISCSI::ISCSITargetInfo;
using ISCSI::LIB::LIBLUN::ISCSILIBLUN;
using ISCSI::LIB::LIBTarget::ISCSILIBTarget;

const std::string UUID = uuidOf(3);

void twoLUNs()
{
    addLUN(3, "vol1");
    addLUN(4, "vol2");
    addTarget(5, "five");
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

/// The loaders' failures as told by a method that runs them all, for the n-th LUN that it loads.
Failures liveState(const std::string &method, const std::string &n, const std::string &outputs)
{
    return {
        Failure("NORViSCSILunIsLocked" + n, INJECTED, method + ": Failed to check if LUN is locked.").leaving(outputs),
        Failure("NORViSCSIConfGet" + n, 18990557, method + ": Failed to check if LUN is mapped.").leaving(outputs),
        Failure("NORVExtentPoolMapFileMappedSizeGet" + n, INJECTED, method + ": Failed to load LUN's allocate size.")
            .leaving(outputs),
    };
}

const Failures STATUS = {{"NLIBCExec NORViSCSILunProgressGet NORViSCSIFamilyConfGetByLID", 0, Then::GOES_ON}};

int listLUNs(std::string &outputs)
{
    std::vector<ISCSILUNInfo> luns{ISCSILUNInfo("before")};
    const int code = ISCSILIBLUN::ListLUN(luns, 62);
    outputs = "list:";
    for (const auto &lun : luns)
        outputs += " " + (lun.name.empty() ? lun.uuid : lun.name);
    return code;
}

/// The LUN's record, with the facts of another.
ISCSILUNInfo loaded()
{
    return {0, NORV_LUN_TYPE_NONE, 0, 0, UUID, "", "", false, false, 1, 2, "before"};
}

template <int flags>
int loadFromConfig(ISCSILUNInfo &lun, std::string &)
{
    _tag_iscsi_lun_ record{};
    return lun.loadFromConfig(record, flags);
}

Operation loader(const char *name, int (ISCSILUNInfo::*load)(_tag_iscsi_lun_ &), const Failures &failures)
{
    const auto run = [load](ISCSILUNInfo &lun, std::string &outputs) {
        _tag_iscsi_lun_ record{};
        const int code = (lun.*load)(record);
        outputs = testing::PrintToString(
            std::make_tuple(lun.is_action_locked, lun.is_mapped, lun.extent_size, lun.allocated_size, lun.status));
        return code;
    };
    const std::string sentence = std::string(name) + ": Failed to load LUN info from SDK. LUN UUID: " + UUID;
    return on(loaded, name, busyLUN, run, "(false, false, 1, 2, \"before\")",
              failures + Failures{{"NORViSCSILunConfigGetByUUID", INJECTED, sentence}});
}

/// Asks about the LUN's map file; the answer is other than `untouched`.
template <class Answer>
Operation question(const char *name, int (ISCSILUNInfo::*ask)(Answer &), Answer untouched, const Failures &failures)
{
    const auto run = [ask, untouched](ISCSILUNInfo &lun, std::string &outputs) {
        Answer answer = untouched;
        const int code = (lun.*ask)(answer);
        outputs = testing::PrintToString(answer);
        return code;
    };
    const std::string sentence = std::string(name) + ": Failed to load LUN info. LUN UUID: " + UUID;
    return on(loaded, name, busyLUN, run, testing::PrintToString(untouched),
              failures + Failures{{"NORViSCSILunConfigGetByUUID", INJECTED, sentence}});
}

int syncProgress(ISCSILUNInfo &lun, std::string &outputs)
{
    _tag_iscsi_lun_ record{};
    unsigned long long first = 77, second = 88;
    const int code = lun.loadSyncProgress(record, first, second);
    outputs = std::to_string(first) + " " + std::to_string(second);
    return code;
}

template <class Key, class Value>
Operation lookup(const char *name, int (*look)(Key, Value &), std::decay_t<Key> key, Value untouched,
                 const Failures &failures)
{
    const auto run = [look, key, untouched](std::string &outputs) {
        Value value = untouched;
        const int code = look(key, value);
        outputs = testing::PrintToString(value);
        return code;
    };
    return {name, twoLUNs, run, testing::PrintToString(untouched), failures};
}

template <bool is_of_lun>
int listTargets(std::string &outputs)
{
    std::vector<ISCSITargetInfo> targets{ISCSITargetInfo(9)};
    const int code = ISCSILIBTarget::ListTarget(targets, is_of_lun ? UUID : "");
    outputs = std::to_string(targets.size()) + " targets";
    return code;
}

int loadTarget(std::string &outputs)
{
    ISCSITargetInfo target(5);
    target.name = "before";
    _tag_iscsi_target_ record{};
    const int code = target.loadFromConfig(record);
    outputs = target.name + " " + std::to_string(record.tid);
    return code;
}

const Operation operations[] = {
    on(loaded, "loadFromConfig", busyLUN, loadFromConfig<62>, "",
       STATUS + liveState("loadFromConfig", "", "") +
           Failures{{"NORViSCSILunConfigGetByUUID", INJECTED,
                     "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID}}),
    on(loaded, "loadFromConfigQuietly", busyLUN, loadFromConfig<1>, "",
       {{"NORViSCSILunConfigGetByUUID", INJECTED, Then::STOPS_SILENTLY}}),
    {"ListLUN", twoLUNs, listLUNs, "list: before",
     STATUS + liveState("ListLUN", "#1", "list:") + liveState("ListLUN", "#2", "list: vol1") +
         Failures{{"NORViSCSILunConfigGetAll", 18990557, "ListLUN: Failed to list LUNs' config."}}},
    loader("loadIsActionLocked", &ISCSILUNInfo::loadIsActionLocked,
           {{"NORViSCSILunIsLocked", INJECTED,
             "loadIsActionLocked: Failed to check if LUN is locked. err: Unknown error 18990999, info: uuid: "}}),
    loader("loadIsMapped", &ISCSILUNInfo::loadIsMapped,
           {{"NORViSCSIConfGet", 18990557, "loadIsMapped: Failed to list LUN's mapping targets. LUN ID: 3"}}),
    loader("loadExtentSize", &ISCSILUNInfo::loadExtentSize, {}),
    loader("loadAllocatedSize", &ISCSILUNInfo::loadAllocatedSize,
           {{"NORVExtentPoolMapFileMappedSizeGet", INJECTED,
             "loadAllocatedSize: Failed to get mapped size from /volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000"}}),
    loader("loadStatus", &ISCSILUNInfo::loadStatus,
           {Failure("NLIBCExec", 0, Then::GOES_ON).leaving("(false, false, 1, 2, \"unavailabling\")"),
            Failure("NORViSCSILunProgressGet NORViSCSIFamilyConfGetByLID", 0, Then::GOES_ON)
                .leaving("(false, false, 1, 2, \"normal\")")}),
    question("getBaseVersion", &ISCSILUNInfo::getBaseVersion, std::string("before"),
             {{"NORVExtentPoolMapFileBaseVersionGet", INJECTED, "getBaseVersion: Failed to get LUN base version."}}),
    question("isModified", &ISCSILUNInfo::isModified, false,
             {{"NORVExtentPoolMapFileVersionInfoGet", INJECTED, "isModified: Failed to get LUN version info."}}),
    question(
        "isSnapshotSentFailed", &ISCSILUNInfo::isSnapshotSentFailed, false,
        {{"NORVExtentPoolMapFileVersionInfoGet", INJECTED, "isSnapshotSentFailed: Failed to get LUN's version info."},
         {"NORVExtentPoolMapFileTotalCountGet", INJECTED, "isSnapshotSentFailed: Failed to get LUN's total count."},
         {"NORVExtentPoolMapFileSyncedCountGet", INJECTED, "isSnapshotSentFailed: Failed to get LUN's synced count."}}),
    on(loaded, "loadSyncProgress", busyLUN, syncProgress, "77 88",
       {{"NORViSCSILunConfigGetByUUID", INJECTED, "loadSyncProgress: Failed to load LUN info from SDK. LUN UUID: "},
        {"NORViSCSIChildLunSyncProgressGet", INJECTED, "loadSyncProgress: Failed to get LUN sync progress."}}),
    lookup("GetLUNUUIDByIndex", &ISCSILUNInfo::GetLUNUUID, "lun#2", std::string("before"),
           {{"NORViSCSILunConfigGetAll", 18990557, ": Failed to list LUNs."}}),
    lookup("GetTIDByTargetName", &ISCSITargetInfo::GetTIDByTargetName, "five", -5,
           {{"NORViSCSIConfTargetLoad", INJECTED, "GetTIDByTargetName: Failed to load target config."}}),
    lookup("GetTIDByIndex", &ISCSITargetInfo::GetTID, "tg#1", -5,
           {{"NORViSCSIConfGet", 18990721, ": Failed to list targets."}}),
    {"TargetLoadFromConfig",
     busyLUN,
     loadTarget,
     "before 0",
     {{"NORViSCSIConfGet", 18990722, "loadFromConfig: Failed to load target info. target ID: 5"}}},
    {"ListTarget",
     busyLUN,
     listTargets<false>,
     "0 targets",
     {{"NORViSCSIConfGet", 18990721, "ListTarget: Failed to list target. LUN UUID: "}}},
    {"ListTargetOfLUN",
     busyLUN,
     listTargets<true>,
     "0 targets",
     {{"NORViSCSILunConfigGetByUUID", INJECTED, "ListTarget: Failed to load LUN info: "},
      {"NORViSCSIConfGet", 18990721, "ListTarget: Failed to list target. LUN UUID: " + UUID}}},
};

INSTANTIATE_TEST_SUITE_P(Records, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

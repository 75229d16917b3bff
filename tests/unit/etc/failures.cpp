// What callers of the records see when a platform call fails.
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSITargetInfo.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;
using ISCSI::ISCSITargetInfo;

const char *const PATH = "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000";
const std::string UUID = uuidOf(3);

/// One mapped LUN, everything known about it.
void lunSet()
{
    auto &lun = addLUN(3, "vol1");
    lun.is_locked = true;
    lun.map_file = {NORV_ZERO_UUID, "aaaaaaaa-0000-4000-8000-000000000000", 1536, 10, 5, 2, 4};
    addTarget(5, "five");
    addMapping(5, 3);
}

void twoLUNs()
{
    lunSet();
    addLUN(4, "vol2").map_file.mapped_size = 1;
}

std::string text(bool value)
{
    return value ? "true" : "false";
}

/// Runs a loader on a record that holds no LUN yet; the record loaded into is the output.
Operation loader(const char *name, int (ISCSILUNInfo::*load)(_tag_iscsi_lun_ &), std::vector<Failure> failures)
{
    const auto live = [](const ISCSILUNInfo &lun) {
        return text(lun.is_action_locked) + text(lun.is_mapped) + std::to_string(lun.extent_size) + " " +
               std::to_string(lun.allocated_size) + lun.status;
    };
    const auto run = [load, live] {
        ISCSILUNInfo lun(0, NORV_LUN_TYPE_NONE, 0, 0, UUID, "", "", false, false, 1, 2, "before");
        _tag_iscsi_lun_ record{};
        const int code = (lun.*load)(record);
        return Outcome{code, lun.toString(), live(lun)};
    };
    failures.push_back({"NORViSCSILunConfigGetByUUID",
                        INJECTED,
                        {std::string(name) + ": Failed to load LUN info from SDK. LUN UUID: " + UUID}});
    return {name, lunSet, run, "falsefalse1 2before", failures};
}

/// Runs a question about the LUN's map file, whose answer on success is not `untouched`.
template <class Answer>
Operation question(const char *name, int (ISCSILUNInfo::*ask)(Answer &), Answer untouched,
                   std::vector<Failure> failures)
{
    const auto shown = [](const Answer &answer) { return testing::PrintToString(answer); };
    const auto run = [ask, untouched, shown] {
        ISCSILUNInfo lun(UUID);
        Answer answer = untouched;
        const int code = (lun.*ask)(answer);
        return Outcome{code, lun.toString(), shown(answer)};
    };
    failures.push_back({"NORViSCSILunConfigGetByUUID",
                        INJECTED,
                        {"loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID,
                         std::string(name) + ": Failed to load LUN info. LUN UUID: " + UUID}});
    return {name, lunSet, run, shown(untouched), failures};
}

Outcome syncProgress()
{
    ISCSILUNInfo lun(UUID);
    _tag_iscsi_lun_ record{};
    unsigned long long first = 77, second = 88;
    const int code = lun.loadSyncProgress(record, first, second);
    return {code, lun.toString(), std::to_string(first) + " " + std::to_string(second)};
}

/// Loading with everything asked for, quietly or not: the loaders' lines, then the record's own.
Operation loadEverything(const char *name, int quiet, Lines not_found)
{
    const auto run = [quiet] {
        ISCSILUNInfo lun(UUID);
        _tag_iscsi_lun_ record{};
        const int code = lun.loadFromConfig(record, 62 | quiet);
        return Outcome{code, lun.toString(), ""};
    };
    return {name,
            lunSet,
            run,
            "",
            {
                {"NORViSCSILunConfigGetByUUID", INJECTED, not_found},
                {"NORViSCSILunIsLocked",
                 INJECTED,
                 {"loadIsActionLocked: Failed to check if LUN is locked. err: {text}, info: {info}",
                  standard("loadFromConfig", "Failed to check if LUN is locked")}},
                {"NORViSCSIConfGet",
                 18990557,
                 {"loadIsMapped: Failed to list LUN's mapping targets. LUN ID: 3",
                  standard("loadFromConfig", "Failed to check if LUN is mapped", "18990557 (Failed to list LUN)")}},
                {"NORVExtentPoolMapFileMappedSizeGet",
                 INJECTED,
                 {std::string("loadAllocatedSize: Failed to get mapped size from ") + PATH,
                  standard("loadFromConfig", "Failed to load LUN's allocate size")}},
                {"NLIBCExec", 0, {}, Failure::STOPS},
                {"NORViSCSILunProgressGet", 0, {}, Failure::CONTINUES},
                {"NORViSCSIFamilyConfGetByLID", 0, {}},
            }};
}

/// The list names the LUNs that are in it; the first LUN's failures leave it empty, the second's do not.
Operation listLUNs()
{
    const auto run = [] {
        std::vector<ISCSILUNInfo> luns{ISCSILUNInfo("before")};
        const int code = ISCSILUNInfo::ListLUN(luns, 62);
        std::string names = "list:";
        for (const auto &lun : luns)
            names += lun.uuid == "before" ? " before" : " " + lun.name;
        // The failing LUN is the one behind those in the list, with the state loaded before its failure.
        ISCSILUNInfo failing(recordOf(luns.size() == 1 ? 4 : 3));
        return Outcome{code, failing.toString(), names};
    };
    const auto state = [](const char *call, Lines lines, int code = INJECTED) {
        return Failure{call, code, lines, Failure::STOPS, call[strlen(call) - 1] == '2' ? "list: vol1" : "list:"};
    };
    const std::string unlocked = "info: {info}";
    return {
        "ListLUN",
        [] {
            twoLUNs();
            // Live state that leaves the records' texts as they are built.
            fake::model().luns.at(3).is_locked = false;
            fake::model().luns.at(3).map_file.mapped_size = 0;
            fake::model().luns.at(4).map_file.mapped_size = 0;
            fake::model().mappings.clear();
        },
        run,
        "list: before",
        {
            {"NORViSCSILunConfigGetAll", 18990557, {"ListLUN: Failed to list LUNs' config."}},
            state("NORViSCSILunIsLocked#1",
                  {"loadIsActionLocked: Failed to check if LUN is locked. err: {text}, info: {info}",
                   standard("ListLUN", "Failed to check if LUN is locked")}),
            state("NORViSCSILunIsLocked#2",
                  {"loadIsActionLocked: Failed to check if LUN is locked. err: {text}, info: {info}",
                   standard("ListLUN", "Failed to check if LUN is locked")}),
            state("NORViSCSIConfGet#1",
                  {"loadIsMapped: Failed to list LUN's mapping targets. LUN ID: 3",
                   standard("ListLUN", "Failed to check if LUN is mapped", "18990557 (Failed to list LUN)")},
                  18990557),
            state("NORViSCSIConfGet#2",
                  {"loadIsMapped: Failed to list LUN's mapping targets. LUN ID: 4",
                   standard("ListLUN", "Failed to check if LUN is mapped", "18990557 (Failed to list LUN)")},
                  18990557),
            state("NORVExtentPoolMapFileMappedSizeGet#1",
                  {std::string("loadAllocatedSize: Failed to get mapped size from ") + PATH,
                   standard("ListLUN", "Failed to load LUN's allocate size")}),
            state("NORVExtentPoolMapFileMappedSizeGet#2", {"loadAllocatedSize: Failed to get mapped size from "
                                                           "/volume1/@iSCSITrg/iSCSI_4_Extent_vol2_000",
                                                           standard("ListLUN", "Failed to load LUN's allocate size")}),
            {"NLIBCExec#1", 0, {}, Failure::CONTINUES, "list: vol1 vol2"},
            {"NLIBCExec#2", 0, {}, Failure::STOPS, "list: vol1 vol2"},
            {"NORViSCSILunProgressGet", 0, {}, Failure::CONTINUES, "list: vol1 vol2"},
            {"NORViSCSIFamilyConfGetByLID#1", 0, {}, Failure::CONTINUES, "list: vol1 vol2"},
            {"NORViSCSIFamilyConfGetByLID#2", 0, {}, Failure::STOPS, "list: vol1 vol2"},
        }};
}

template <class Key, class Value>
Operation lookup(const char *name, int (*look)(Key, Value &), std::decay_t<Key> key, Value untouched,
                 std::vector<Failure> failures)
{
    const auto run = [look, key, untouched] {
        Value value = untouched;
        const int code = look(key, value);
        return Outcome{code, "", testing::PrintToString(value)};
    };
    return {name, twoLUNs, run, testing::PrintToString(untouched), failures};
}

Operation listTargets(const char *name, std::string lun_uuid, std::vector<Failure> failures)
{
    const auto run = [lun_uuid] {
        std::vector<ISCSITargetInfo> targets{ISCSITargetInfo("before", "", 0, 0, 0, 0, 0, 0, 0, "", "", "", "")};
        const int code = ISCSITargetInfo::ListTarget(targets, lun_uuid);
        std::string names = "list:";
        for (const auto &target : targets)
            names += " " + target.name;
        return Outcome{code, ISCSILUNInfo(lun_uuid).toString(), names};
    };
    return {name, lunSet, run, "list:", failures};
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
    loadEverything("loadFromConfig", 0, {"loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID}),
    loadEverything("loadFromConfigQuietly", 1, {}),
    loader("loadIsActionLocked", &ISCSILUNInfo::loadIsActionLocked,
           {{"NORViSCSILunIsLocked",
             INJECTED,
             {"loadIsActionLocked: Failed to check if LUN is locked. err: {text}, info: {info}"}}}),
    loader("loadIsMapped", &ISCSILUNInfo::loadIsMapped,
           {{"NORViSCSIConfGet", 18990557, {"loadIsMapped: Failed to list LUN's mapping targets. LUN ID: 3"}}}),
    loader("loadExtentSize", &ISCSILUNInfo::loadExtentSize, {}),
    loader("loadAllocatedSize", &ISCSILUNInfo::loadAllocatedSize,
           {{"NORVExtentPoolMapFileMappedSizeGet",
             INJECTED,
             {std::string("loadAllocatedSize: Failed to get mapped size from ") + PATH}}}),
    loader("loadStatus", &ISCSILUNInfo::loadStatus,
           {{"NLIBCExec", 0, {}, Failure::STOPS, "falsefalse1 2unavailabling"},
            {"NORViSCSILunProgressGet", 0, {}, Failure::CONTINUES, "falsefalse1 2normal"},
            {"NORViSCSIFamilyConfGetByLID", 0, {}, Failure::STOPS, "falsefalse1 2normal"}}),
    question("getBaseVersion", &ISCSILUNInfo::getBaseVersion, std::string("before"),
             {{"NORVExtentPoolMapFileBaseVersionGet",
               INJECTED,
               {"getBaseVersion: Failed to get LUN base version. LUN UUID: " + UUID}}}),
    question("isModified", &ISCSILUNInfo::isModified, false,
             {{"NORVExtentPoolMapFileVersionInfoGet",
               INJECTED,
               {"isModified: Failed to get LUN version info. LUN UUID: " + UUID}}}),
    question("isSnapshotSentFailed", &ISCSILUNInfo::isSnapshotSentFailed, false,
             {{"NORVExtentPoolMapFileVersionInfoGet",
               INJECTED,
               {"isSnapshotSentFailed: Failed to get LUN's version info. LUN UUID: " + UUID}},
              {"NORVExtentPoolMapFileTotalCountGet",
               INJECTED,
               {"isSnapshotSentFailed: Failed to get LUN's total count. LUN UUID: " + UUID}},
              {"NORVExtentPoolMapFileSyncedCountGet",
               INJECTED,
               {"isSnapshotSentFailed: Failed to get LUN's synced count. LUN UUID: " + UUID}}}),
    {"loadSyncProgress",
     lunSet,
     syncProgress,
     "77 88",
     {{"NORViSCSILunConfigGetByUUID",
       INJECTED,
       {"loadSyncProgress: Failed to load LUN info from SDK. LUN UUID: " + UUID}},
      {"NORViSCSIChildLunSyncProgressGet",
       INJECTED,
       {standard("loadSyncProgress", "Failed to get LUN sync progress")}}}},
    listLUNs(),
    lookup("GetUUIDByLID", &ISCSILUNInfo::GetUUIDByLID, 3, std::string("before"),
           {{"NORViSCSILunGetByLunId", 18990531, {"GetUUIDByLID: No such LUN. LUN ID: 3"}}}),
    lookup("GetUUIDByLUNName", &ISCSILUNInfo::GetUUIDByLUNName, "vol1", std::string("before"),
           {{"NORViSCSILunGetByLunName", 18990531, {"GetUUIDByLUNName: No such LUN. Name: vol1"}}}),
    lookup("GetLIDByLUNName", &ISCSILUNInfo::GetLIDByLUNName, "vol1", -5,
           {{"NORViSCSILunGetByLunName", 18990531, {"GetLIDByLUNName: No such LUN. Name: vol1"}}}),
    lookup(
        "GetLUNUUIDByIndex", &ISCSILUNInfo::GetLUNUUID, "lun#2", std::string("before"),
        {{"NORViSCSILunConfigGetAll", 18990557, {"ListLUN: Failed to list LUNs' config.", ": Failed to list LUNs."}}}),
    lookup("GetLUNUUIDByName", &ISCSILUNInfo::GetLUNUUID, "vol1", std::string("before"),
           {{"NORViSCSILunGetByLunName",
             18990505,
             {"GetUUIDByLUNName: No such LUN. Name: vol1", ": Invalid LUN UUID, name or index. input: vol1"}}}),
    {"TargetLoadFromConfig",
     lunSet,
     loadTarget,
     "before 0",
     {{"NORViSCSIConfGet", 18990722, {"loadFromConfig: Failed to load target info. target ID: 5"}}}},
    listTargets("ListTarget", "", {{"NORViSCSIConfGet", 18990721, {"ListTarget: Failed to list target. LUN UUID: "}}}),
    listTargets("ListTargetOfLUN", UUID,
                {{"NORViSCSILunConfigGetByUUID",
                  INJECTED,
                  {"loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID,
                   "ListTarget: Failed to load LUN info: {info}"}},
                 {"NORViSCSIConfGet", 18990721, {"ListTarget: Failed to list target. LUN UUID: " + UUID}}}),
    lookup("GetTIDByTargetName", &ISCSITargetInfo::GetTIDByTargetName, "five", -5,
           {{"NORViSCSIConfTargetLoad", INJECTED, {"GetTIDByTargetName: Failed to load target config."}}}),
    lookup("GetTIDByIndex", &ISCSITargetInfo::GetTID, "tg#1", -5,
           {{"NORViSCSIConfGet",
             18990721,
             {"ListTarget: Failed to list target. LUN UUID: ", ": Failed to list targets."}}}),
    lookup(
        "GetTIDByName", &ISCSITargetInfo::GetTID, "five", -5,
        {{"NORViSCSIConfTargetLoad",
          18990710,
          {"GetTIDByTargetName: Failed to load target config.", ": Invalid target ID, name or index. input: five"}}}),
};

INSTANTIATE_TEST_SUITE_P(Records, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

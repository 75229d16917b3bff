// What callers of the LUN operations see when a platform call fails.
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const std::string UUID = uuidOf(3);
const std::string NOT_LOADED = "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID;
const std::string LUN_ERROR = "18990557 (Failed to list LUN)";

/// A mapped extent-pool LUN with a snapshot task, a scheduled-snapshot task and a retention policy.
void lunSet()
{
    addLUN(3, "vol1").is_locked = true;
    addTarget(5, "five");
    addTarget(6, "six");
    addMapping(5, 3);
    addMapping(6, 3);
}

void lunToDelete()
{
    addLUN(3, "vol1");
    fake::model().jobs = {{11, {"vol1", 0}}, {12, {"", 3}}};
    fake::model().retention_policies = {{"Lun#", "3"}};
}

/// Runs `act` on the LUN; `act` returns the code and may show outputs.
template <class Act>
std::function<Outcome()> onLUN(Act act)
{
    return [act] {
        ISCSILIBLUN lun(UUID);
        std::string outputs;
        const int code = act(lun, outputs);
        return Outcome{code, lun.info.toString(), outputs};
    };
}

/// What a failing load of the LUN looks like to an operation in the standard form.
Failure notLoaded(const std::string &method)
{
    return {"NORViSCSILunConfigGetByUUID", INJECTED, {NOT_LOADED, standard(method, "Failed to load LUN config")}};
}

/// The same for those that word it differently.
Failure notLoadedFromSDK(const std::string &method)
{
    return {"NORViSCSILunConfigGetByUUID",
            INJECTED,
            {NOT_LOADED, method + ": Failed to load LUN info from SDK info: {info}. error: {err}"}};
}

Outcome create()
{
    ISCSILIBLUN lun("new", NORV_LUN_TYPE_ADV, "/volume1", GIB, 65536);
    const int code = lun.createLUN();
    return {code, lun.info.toString(), lun.info.uuid + std::to_string(lun.info.lun_id)};
}

Failure deleteGoesOn(const char *call, Lines lines = {})
{
    return {call, 0, lines, Failure::CONTINUES};
}

const Operation operations[] = {
    {"loadLUNInfo",
     lunSet,
     onLUN([](auto &lun, auto &) { return lun.loadLUNInfo(0); }),
     "",
     {notLoaded("loadLUNInfo")}},
    {"createLUN",
     lunSet,
     create,
     "0",
     {{"NORViSCSILunCreate", INJECTED, {standard("createLUN", "Failed to create LUN")}}}},
    {"deleteLUN",
     lunToDelete,
     onLUN([](auto &lun, auto &) { return lun.deleteLUN(); }),
     "",
     {notLoaded("deleteLUN"),
      deleteGoesOn("NORViSCSILunTaskGetSchIDByName"),
      deleteGoesOn("NORVSchedTaskRemove#1", {": NORVSchedTaskRemove() fail, schedule id = 11"}),
      deleteGoesOn("ScheduleSnapshotTaskGetIDByLid"),
      deleteGoesOn("NORVSchedTaskRemove#2", {": NORVSchedTaskRemove() fail, schedule id = 12"}),
      deleteGoesOn("NORVRETENTIONRemovePolicy"),
      {"NORViSCSILunDelete", 18990551, {"deleteLUN: Failed to delete LUN: {info}. error code: {code}"}}}},
    {"isLUNLocked",
     lunSet,
     onLUN([](auto &lun, auto &outputs) {
         bool out = false;
         const int code = lun.isLUNLocked(out);
         outputs = out ? "locked" : "untouched";
         return code;
     }),
     "untouched",
     {notLoadedFromSDK("isLUNLocked"),
      {"NORViSCSILunIsLocked", INJECTED, {standard("isLUNLocked", "Failed to check if LUN is locked")}}}},
    {"isLUNMapped",
     lunSet,
     onLUN([](auto &lun, auto &outputs) {
         bool out = false;
         const int code = lun.isLUNMapped(out);
         outputs = out ? "mapped" : "untouched";
         return code;
     }),
     "untouched",
     {notLoaded("isLUNMapped"),
      {"NORViSCSIConfGet", 18990557, {standard("isLUNMapped", "Failed to list LUN's mapping targets", LUN_ERROR)}}}},
    {"loadLUN",
     lunSet,
     onLUN([](auto &lun, auto &) { return lun.loadLUN(true, false); }),
     "",
     {notLoaded("loadLUN"),
      {"NORViSCSILunLoad",
       INJECTED,
       {"loadLUN: Failed to load LUN. is_for_trash: true, is_for_unsync_size: false info: {info}. error: {err}"}}}},
    {"unloadLUN",
     lunSet,
     onLUN([](auto &lun, auto &) { return lun.unloadLUN(false, true); }),
     "",
     {notLoaded("unloadLUN"),
      {"NORViSCSILunUnload",
       INJECTED,
       {"unloadLUN: Failed to unload LUN. is_for_trash: false, is_for_unsync_size: true info: {info}. error: {err}"}}}},
    {"updateLUN",
     [] { addLUN(3, "vol1"); },
     onLUN([](auto &lun, auto &) { return lun.updateLUN("new", 2 * GIB); }),
     "",
     {notLoadedFromSDK("updateLUN"),
      {"NORViSCSILunIsNameExist", INJECTED, {standard("updateLUN", "Failed to query if the LUN name exists")}},
      {"NORViSCSILunUpdate", INJECTED, {standard("updateLUN", "Failed to update LUN")}}}},
    {"LIBLUNListLUN",
     lunSet,
     [] {
         std::vector<ISCSI::ISCSILUNInfo> luns(5);
         const int code = ISCSILIBLUN::ListLUN(luns, 0);
         return Outcome{code, "", std::to_string(luns.size())};
     },
     "5",
     {{"NORViSCSILunConfigGetAll", 18990557, {"ListLUN: Failed to list LUNs' config."}}}},
    {"mapTarget",
     lunSet,
     onLUN([](auto &lun, auto &) {
         return lun.mapTarget({6, 5});
     }),
     "",
     {notLoaded("mapTarget"),
      {"NORViSCSILunMappingsAdd",
       18990570,
       {"mapTarget: Failed to add mappings. targets: 5 6. info: {info}. error: {err}"}}}},
    {"unmapTarget",
     lunSet,
     onLUN([](auto &lun, auto &) { return lun.unmapTarget({5}); }),
     "",
     {notLoaded("unmapTarget"),
      {"NORViSCSILunMappingsRemove",
       18990710,
       {"unmapTarget: Failed to remove mappings. targets: 5. info: {info}. error: {err}"}}}},
};

INSTANTIATE_TEST_SUITE_P(LUNOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

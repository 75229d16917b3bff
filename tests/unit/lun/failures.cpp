// What callers of the LUN operations see when a platform call fails.
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const std::string UUID = uuidOf(3);

void mappedLUN()
{
    addLUN(3, "vol1").is_locked = true;
    for (int tid : {5, 6}) {
        addTarget(tid, "t" + std::to_string(tid));
        addMapping(tid, 3);
    }
}

void scheduledLUN()
{
    addLUN(3, "vol1");
    fake::model().jobs = {{11, {"vol1", 0}}, {12, {"", 3}}};
}

/// Runs `act` on the LUN; the flag that it may set is the output.
template <class... Failures>
Operation onLUN(const char *name, void (*set_up)(), int (*act)(ISCSILIBLUN &, bool &), const Failures &...failures)
{
    const auto run = [act] {
        ISCSILIBLUN lun(UUID);
        bool flag = false;
        const int code = act(lun, flag);
        return Outcome{code, lun.info.toString(), testing::PrintToString(flag)};
    };
    return operation(name, set_up, run, "false", failures...);
}

/// The LUN cannot be loaded; `rest` is how the method words it.
Failure notLoaded(const std::string &method, const std::string &rest = "Failed to load LUN config.")
{
    return stops("NORViSCSILunConfigGetByUUID", INJECTED,
                 "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID,
                 method + ": " + rest + " info: {info}. error: {err}");
}

Outcome create()
{
    ISCSILIBLUN lun("new", NORV_LUN_TYPE_ADV, "/volume1", GIB, 65536);
    const int code = lun.createLUN();
    return {code, lun.info.toString(), lun.info.uuid + std::to_string(lun.info.lun_id)};
}

Outcome list()
{
    std::vector<ISCSI::ISCSILUNInfo> luns(5);
    const int code = ISCSILIBLUN::ListLUN(luns, 0);
    return {code, "", std::to_string(luns.size())};
}

const Operation operations[] = {
    operation("createLUN", mappedLUN, create, "0",
              stops("NORViSCSILunCreate", INJECTED, standard("createLUN", "Failed to create LUN"))),
    operation("LIBLUNListLUN", mappedLUN, list, "5",
              stops("NORViSCSILunConfigGetAll", 18990557, "ListLUN: Failed to list LUNs' config.")),
    onLUN(
        "loadLUNInfo", mappedLUN, [](auto &lun, bool &) { return lun.loadLUNInfo(0); }, notLoaded("loadLUNInfo")),
    onLUN(
        "deleteLUN", scheduledLUN, [](auto &lun, bool &) { return lun.deleteLUN(); }, notLoaded("deleteLUN"),
        goesOn("NORViSCSILunTaskGetSchIDByName"),
        goesOn("NORVSchedTaskRemove#1", ": NORVSchedTaskRemove() fail, schedule id = 11"),
        goesOn("ScheduleSnapshotTaskGetIDByLid"),
        goesOn("NORVSchedTaskRemove#2", ": NORVSchedTaskRemove() fail, schedule id = 12"),
        goesOn("NORVRETENTIONRemovePolicy"),
        stops("NORViSCSILunDelete", 18990551, "deleteLUN: Failed to delete LUN: {info}. error code: {code}")),
    onLUN(
        "isLUNLocked", mappedLUN, [](auto &lun, bool &out) { return lun.isLUNLocked(out); },
        notLoaded("isLUNLocked", "Failed to load LUN info from SDK"),
        stops("NORViSCSILunIsLocked", INJECTED, standard("isLUNLocked", "Failed to check if LUN is locked"))),
    onLUN(
        "isLUNMapped", mappedLUN, [](auto &lun, bool &out) { return lun.isLUNMapped(out); }, notLoaded("isLUNMapped"),
        stops("NORViSCSIConfGet", 18990557,
              standard("isLUNMapped", "Failed to list LUN's mapping targets", "18990557 (Failed to list LUN)"))),
    onLUN(
        "loadLUN", mappedLUN, [](auto &lun, bool &) { return lun.loadLUN(true, false); }, notLoaded("loadLUN"),
        stops("NORViSCSILunLoad", INJECTED,
              "loadLUN: Failed to load LUN. is_for_trash: true, is_for_unsync_size: false info: {info}. error: {err}")),
    onLUN(
        "unloadLUN", mappedLUN, [](auto &lun, bool &) { return lun.unloadLUN(false, true); }, notLoaded("unloadLUN"),
        stops("NORViSCSILunUnload", INJECTED,
              "unloadLUN: Failed to unload LUN. is_for_trash: false, is_for_unsync_size: true"
              " info: {info}. error: {err}")),
    onLUN(
        "updateLUN", [] { addLUN(3, "vol1"); }, [](auto &lun, bool &) { return lun.updateLUN("new", 2 * GIB); },
        notLoaded("updateLUN", "Failed to load LUN info from SDK"),
        stops("NORViSCSILunIsNameExist", INJECTED, standard("updateLUN", "Failed to query if the LUN name exists")),
        stops("NORViSCSILunUpdate", INJECTED, standard("updateLUN", "Failed to update LUN"))),
    onLUN(
        "mapTarget", mappedLUN,
        [](auto &lun, bool &) {
            return lun.mapTarget({6, 5});
        },
        notLoaded("mapTarget"),
        stops("NORViSCSILunMappingsAdd", 18990570,
              "mapTarget: Failed to add mappings. targets: 5 6. info: {info}. error: {err}")),
    onLUN(
        "unmapTarget", mappedLUN, [](auto &lun, bool &) { return lun.unmapTarget({5}); }, notLoaded("unmapTarget"),
        stops("NORViSCSILunMappingsRemove", 18990710,
              "unmapTarget: Failed to remove mappings. targets: 5. info: {info}. error: {err}")),
};

INSTANTIATE_TEST_SUITE_P(LUNOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

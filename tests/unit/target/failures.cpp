// What callers of the target operations see when a platform call fails.
#include "iscsiwebapi/ISCSILIBTarget.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBTarget::ISCSILIBTarget;

Outcome create()
{
    ISCSILIBTarget target("new", "iqn.2000-01.example:new", true, false, false, 262144, 262144, 0, 2, "alice", SECRET,
                          "bob", MUTUAL_SECRET);
    const int code = target.createTarget();
    return {code, target.info.toString(), "tid " + std::to_string(target.info.tid)};
}

Outcome remove()
{
    ISCSILIBTarget target(5);
    const int code = target.deleteTarget();
    return {code, target.info.toString()};
}

void maskedTarget()
{
    addTarget(5, "five").masking = {{"iqn.keep", 1}, {"iqn.change", 1}, {"iqn.drop", 3}};
}

Outcome getMasking()
{
    std::map<std::string, ISCSI_TARGET_AUTHORITY> masking = {{"before", NORV_AUTHORITY_READ}};
    const int code = ISCSILIBTarget::GetTargetMasking(5, masking);
    return {code, "", masking.begin()->first};
}

/// The output is the masking itself: what was applied before the failure stays.
Outcome setMasking()
{
    const int code = ISCSILIBTarget::ACLMasksSet(5, parsed(R"([{"iqn": "iqn.new", "permission": "rw"},
        {"iqn": "iqn.keep", "permission": "r"}, {"iqn": "iqn.change", "permission": "-"}])"));
    std::string masking;
    for (const auto &[iqn, permission] : fake::model().targets.at(5).masking)
        masking += iqn + "=" + std::to_string(permission) + " ";
    return {code, "", masking};
}

Outcome list()
{
    std::vector<ISCSI::ISCSITargetInfo> targets;
    const int code = ISCSILIBTarget::ListTarget(targets, "");
    return {code, "", std::to_string(targets.size())};
}

const Failure no_masking = stops("NORViSCSITargetMaskingGet", INJECTED,
                                 ": GetTargetMasking(): NORViSCSITargetMaskingGet(5, vACLs) failed, err={text}");

const Operation operations[] = {
    operation(
        "createTarget", [] {}, create, "tid 1",
        stops("NORViSCSITargetCreate", 18990714, "createTarget: Failed to create target. target: {info}")
            .leaving("tid 0"),
        stops("NORViSCSIDefaultACLSet", 18990715, "createTarget: Failed to add default masking IQN. target: {info}"),
        stops("NORViSCSITargetEnable", 18990718, "createTarget: Failed to enable target. target: {info}")),
    operation("deleteTarget", maskedTarget, remove, "",
              stops("NORViSCSIConfGet", 18990722, "loadFromConfig: Failed to load target info. target ID: 5",
                    standard("deleteTarget", "Failed to fill ISCSI_TARGET", "18990722 (Failed to load target)")),
              stops("NORViSCSITargetRemove", 18990720,
                    standard("deleteTarget", "Failed to delete target", "18990720 (Failed to delete target)"))),
    operation("LIBTargetListTarget", maskedTarget, list, "0",
              stops("NORViSCSIConfGet", 18990721, "ListTarget: Failed to list target. LUN UUID: ")),
    operation("GetTargetMasking", maskedTarget, getMasking, "before", no_masking),
    operation("ACLMasksSet", maskedTarget, setMasking, "iqn.keep=1 iqn.change=1 iqn.drop=3 ", no_masking,
              stops("NORViSCSIMaskingsCreate", 18990715,
                    "[E] ACLMasksSet: error code: 18990715 (Failed to create ACL masking) "
                    "[norvsdk failed to create acl masking]"),
              stops("NORViSCSIMaskingsUpdate", 18990717,
                    "[E] ACLMasksSet: error code: 18990717 (Failed to update ACL masking) [Failed to update masking]")
                  .leaving("iqn.keep=1 iqn.change=1 iqn.drop=3 iqn.new=3 "),
              stops("NORViSCSIMaskingsRemove", 18990716,
                    "[E] ACLMasksSet: error code: 18990716 (Failed to delete ACL masking) "
                    "[norvsdk failed to delete acl masking]")
                  .leaving("iqn.keep=1 iqn.change=0 iqn.drop=3 iqn.new=3 ")),
};

INSTANTIATE_TEST_SUITE_P(TargetOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

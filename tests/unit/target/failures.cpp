// What callers of the target operations see when a platform call fails.
#include "iscsiwebapi/ISCSILIBTarget.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBTarget::ISCSILIBTarget;

int create(std::string &outputs)
{
    ISCSILIBTarget target("new", "iqn.2000-01.example:new", true, false, false, 262144, 262144, 0, 2, "alice", SECRET,
                          "bob", MUTUAL_SECRET);
    const int code = target.createTarget();
    outputs = "tid " + std::to_string(target.info.tid);
    return code;
}

void maskedTarget()
{
    addTarget(5, "five").masking = {{"iqn.keep", 1}, {"iqn.change", 1}, {"iqn.drop", 3}};
}

int getMasking(std::string &outputs)
{
    std::map<std::string, ISCSI_TARGET_AUTHORITY> masking = {{"before", NORV_AUTHORITY_READ}};
    const int code = ISCSILIBTarget::GetTargetMasking(5, masking);
    outputs = masking.begin()->first;
    return code;
}

/// The output is the masking itself: what was applied before the failure stays.
int setMasking(std::string &outputs)
{
    const int code = ISCSILIBTarget::ACLMasksSet(5, parsed(R"([{"iqn": "iqn.new", "permission": "rw"},
        {"iqn": "iqn.keep", "permission": "r"}, {"iqn": "iqn.change", "permission": "-"}])"));
    outputs.clear();
    for (const auto &[iqn, permission] : fake::model().targets.at(5).masking)
        outputs += iqn + "=" + std::to_string(permission) + " ";
    return code;
}

std::string tagged(const std::string &error, const std::string &detail)
{
    return "[E] ACLMasksSet: error code: " + error + " [" + detail + "]";
}

const Operation operations[] = {
    {"createTarget",
     [] {},
     create,
     "tid 1",
     {Failure("NORViSCSITargetCreate", 18990714, "createTarget: Failed to create target. target: tid: ")
          .leaving("tid 0"),
      {"NORViSCSIDefaultACLSet", 18990715, "createTarget: Failed to add default masking IQN. target: tid: "},
      {"NORViSCSITargetEnable", 18990718, "createTarget: Failed to enable target. target: tid: "}}},
    {"deleteTarget",
     maskedTarget,
     [](auto &) { return ISCSILIBTarget(5).deleteTarget(); },
     "",
     {{"NORViSCSIConfGet", 18990722, "deleteTarget: Failed to fill ISCSI_TARGET."},
      {"NORViSCSITargetRemove", 18990720, "deleteTarget: Failed to delete target."}}},
    {"GetTargetMasking",
     maskedTarget,
     getMasking,
     "before",
     {{"NORViSCSITargetMaskingGet", INJECTED,
       ": GetTargetMasking(): NORViSCSITargetMaskingGet(5, vACLs) failed, err=Unknown error 18990999"}}},
    {"ACLMasksSet",
     maskedTarget,
     setMasking,
     "iqn.keep=1 iqn.change=1 iqn.drop=3 ",
     {{"NORViSCSIMaskingsCreate", 18990715,
       tagged("18990715 (Failed to create ACL masking)", "norvsdk failed to create acl masking")},
      Failure("NORViSCSIMaskingsUpdate", 18990717,
              tagged("18990717 (Failed to update ACL masking)", "Failed to update masking"))
          .leaving("iqn.keep=1 iqn.change=1 iqn.drop=3 iqn.new=3 "),
      Failure("NORViSCSIMaskingsRemove", 18990716,
              tagged("18990716 (Failed to delete ACL masking)", "norvsdk failed to delete acl masking"))
          .leaving("iqn.keep=1 iqn.change=0 iqn.drop=3 iqn.new=3 ")}},
};

INSTANTIATE_TEST_SUITE_P(TargetOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

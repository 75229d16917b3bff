#include "iscsiwebapi/ISCSILIBTarget.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/JsonReader.h"
#include "etc/Text.h"

#include <new>
#include <stdexcept>

namespace ISCSI::LIB::LIBTarget {
namespace {

using Masking = std::map<std::string, ISCSI_TARGET_AUTHORITY>;
using Entries = std::vector<_tag_struct_iscsi_acl_>;

/// Hands one set of masking entries to the platform; an empty set needs no call.
int applyMasking(int tid, const Masking &masking, int (*apply)(const Entries &), int code, const char *failure,
                 Site site = here())
{
    if (masking.empty())
        return 0;
    Entries entries;
    if (int err = ISCSILIBTarget::TargetMaskMap2Vec(tid, masking, entries))
        return err;
    if (apply(entries))
        return failTagged(site, code, failure);
    return 0;
}

} // namespace

ISCSILIBTarget::ISCSILIBTarget(unsigned int tid) : info(tid) {}

ISCSILIBTarget::ISCSILIBTarget(const std::string &name, const std::string &iqn, bool is_enabled,
                               bool has_header_checksum, bool has_data_checksum, unsigned int max_recv_seg_bytes,
                               unsigned int max_send_seg_bytes, unsigned int max_sessions, unsigned int auth_type,
                               const std::string &user, const std::string &password, const std::string &mutual_user,
                               const std::string &mutual_password)
    : info(name, iqn, is_enabled, has_header_checksum, has_data_checksum, max_recv_seg_bytes, max_send_seg_bytes,
           max_sessions, auth_type, user, password, mutual_user, mutual_password)
{
}

ISCSILIBTarget::~ISCSILIBTarget() = default;

int ISCSILIBTarget::createTarget()
{
    if (int err = info.fillISCSITARGET(record))
        return failText(here(), err, "Failed to fill ISCSI_TARGET. target: %s", info.toString().c_str());
    record.enabled = 0;
    if (NORViSCSITargetCreate(&record))
        return failText(here(), ERR_FAILED_TO_CREATE_TARGET, "Failed to create target. target: %s",
                        info.toString().c_str());
    info.tid = static_cast<unsigned int>(record.tid);
    if (NORViSCSIDefaultACLSet(&record, NORV_AUTHORITY_READ_WRITE))
        return failText(here(), ERR_FAILED_TO_CREATE_ACL_MASKING, "Failed to add default masking IQN. target: %s",
                        info.toString().c_str());
    if (NORViSCSITargetEnable(&record))
        return failText(here(), ERR_FAILED_TO_ENABLE_TARGET, "Failed to enable target. target: %s",
                        info.toString().c_str());
    return 0;
}

int ISCSILIBTarget::deleteTarget()
{
    if (int err = info.loadFromConfig(record))
        return fail(err, info, "Failed to fill ISCSI_TARGET");
    if (NORViSCSITargetRemove(&record))
        return fail(ERR_FAILED_TO_DELETE_TARGET, info, "Failed to delete target");
    return 0;
}

int ISCSILIBTarget::ListTarget(std::vector<ISCSITargetInfo> &out, const std::string &lun_uuid)
{
    return ISCSITargetInfo::ListTarget(out, lun_uuid);
}

int ISCSILIBTarget::GetMaskingPermission(const std::string &text, ISCSI_TARGET_AUTHORITY &out)
{
    static const struct {
        const char *text;
        ISCSI_TARGET_AUTHORITY permission;
    } permissions[] = {
        {"rw", NORV_AUTHORITY_READ_WRITE},
        {"r", NORV_AUTHORITY_READ},
        {"-", NORV_AUTHORITY_NONE},
    };
    for (const auto &known : permissions) {
        if (text == known.text) {
            out = known.permission;
            return 0;
        }
    }
    return ERR_BAD_TARGET_AUTH_INFO;
}

int ISCSILIBTarget::GetTargetMasking(int tid, std::map<std::string, ISCSI_TARGET_AUTHORITY> &out)
{
    Entries entries;
    if (int err = NORViSCSITargetMaskingGet(tid, entries))
        return failShort(here(), err, "%s(): NORViSCSITargetMaskingGet(%d, vACLs) failed, err=%s", __func__, tid,
                         ErrorCodeToString(err));
    out.clear();
    for (const auto &entry : entries)
        out.emplace(fieldText(entry.iqn), static_cast<ISCSI_TARGET_AUTHORITY>(entry.permission));
    return 0;
}

int ISCSILIBTarget::TargetMaskMap2Vec(int tid, const std::map<std::string, ISCSI_TARGET_AUTHORITY> &masking,
                                      std::vector<_tag_struct_iscsi_acl_> &out)
{
    Entries entries;
    try {
        entries.resize(masking.size());
    } catch (const std::exception &) {
        failTagged(here(), ERR_OUT_OF_MEMORY, "Failed to alloc acl vector");
        return ERR_BAD_TARGET_ACL;
    }
    auto entry = entries.begin();
    for (const auto &[iqn, permission] : masking) {
        entry->tid = tid;
        if (StringCopy(entry->iqn, iqn)) {
            failTagged(here(), ERR_BAD_TARGET_IQN, "invalid iqn: " + iqn);
            return ERR_BAD_TARGET_ACL;
        }
        entry->permission = permission;
        ++entry;
    }
    out = std::move(entries);
    return 0;
}

int ISCSILIBTarget::ACLMasksSet(int tid, const Json::Value &acls)
{
    if (!acls.isArray())
        return failTagged(here(), ERR_INVALID_INPUT, "acls is not an array");
    Masking current;
    if (int err = GetTargetMasking(tid, current))
        return err;

    Masking create;
    Masking update;
    for (const auto &acl : acls) {
        std::string iqn;
        std::string text;
        if (!JsonReader(acl).optional("iqn", iqn).optional("permission", text).ok())
            return failTagged(here(), ERR_INVALID_INPUT, "an element of acls is not an iqn and a permission");
        ISCSI_TARGET_AUTHORITY permission;
        if (int err = GetMaskingPermission(text, permission))
            return err;
        if (iqn.empty())
            continue;
        const auto known = current.find(iqn);
        if (known == current.end()) {
            create[iqn] = permission;
            continue;
        }
        if (known->second != permission)
            update[iqn] = permission;
        current.erase(known);
    }
    Masking &remove = current;
    remove.erase("");

    if (int err = applyMasking(tid, create, NORViSCSIMaskingsCreate, ERR_FAILED_TO_CREATE_ACL_MASKING,
                               "norvsdk failed to create acl masking"))
        return err;
    if (int err = applyMasking(tid, update, NORViSCSIMaskingsUpdate, ERR_FAILED_TO_UPDATE_ACL_MASKING,
                               "Failed to update masking"))
        return err;
    return applyMasking(tid, remove, NORViSCSIMaskingsRemove, ERR_FAILED_TO_DELETE_ACL_MASKING,
                        "norvsdk failed to delete acl masking");
}

} // namespace ISCSI::LIB::LIBTarget

#include "iscsiwebapi/ISCSITargetInfo.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/PlatformAnswers.h"
#include "etc/Selector.h"
#include "etc/Text.h"
#include "iscsiwebapi/ISCSILUNInfo.h"

#include <cstdlib>

namespace ISCSI {
namespace {

using Key = Json::StaticString; // a key that is not copied

/// What toJsonFormat returns for a record without identity; callers test for non-zero only.
constexpr int NOT_ENOUGH_INFO = 3328;

const SelectorKind SELECTOR = {
    "tg#%u%c",
    "Failed to list targets.",
    "Index of target is out of range. index: %d, #nodes: %zu",
    "Invalid target ID, name or index. input: %s",
    ERR_BAD_TARGET_ID,
};

unsigned int knownAuthType(unsigned int type)
{
    return type > NORV_TARGET_AUTH_MUTUAL_CHAP ? ISCSITargetInfo::AUTH_UNKNOWN : type;
}

} // namespace

ISCSITargetInfo::ISCSITargetInfo(unsigned int tid) : tid(tid) {}

ISCSITargetInfo::ISCSITargetInfo(const std::string &name, const std::string &iqn, bool is_enabled,
                                 bool has_header_checksum, bool has_data_checksum, unsigned int max_recv_seg_bytes,
                                 unsigned int max_send_seg_bytes, unsigned int max_sessions, unsigned int auth_type,
                                 const std::string &user, const std::string &password, const std::string &mutual_user,
                                 const std::string &mutual_password)
    : ISCSITargetInfo(0, name, iqn, 0, is_enabled, has_header_checksum, has_data_checksum, max_recv_seg_bytes,
                      max_send_seg_bytes, max_sessions, auth_type, user, password, mutual_user, mutual_password)
{
}

ISCSITargetInfo::ISCSITargetInfo(unsigned int tid, const std::string &name, const std::string &iqn, int mapping_index,
                                 bool is_enabled, bool has_header_checksum, bool has_data_checksum,
                                 unsigned int max_recv_seg_bytes, unsigned int max_send_seg_bytes,
                                 unsigned int max_sessions, unsigned int auth_type, const std::string &user,
                                 const std::string &password, const std::string &mutual_user,
                                 const std::string &mutual_password)
    : tid(tid), name(name), iqn(iqn), mapping_index(mapping_index), is_enabled(is_enabled),
      has_header_checksum(has_header_checksum), has_data_checksum(has_data_checksum),
      max_recv_seg_bytes(max_recv_seg_bytes), max_send_seg_bytes(max_send_seg_bytes), max_sessions(max_sessions),
      auth_type(auth_type), user(user), password(password), mutual_user(mutual_user), mutual_password(mutual_password)
{
}

ISCSITargetInfo::ISCSITargetInfo(const _tag_iscsi_target_ &record, int index)
    : ISCSITargetInfo(static_cast<unsigned int>(record.tid), fieldText(record.name), fieldText(record.iqn), index,
                      record.enabled, record.header_digest, record.data_digest, record.max_recv_seg_bytes,
                      record.max_send_seg_bytes, record.max_sessions, knownAuthType(record.auth_type),
                      fieldText(record.user), fieldText(record.password), fieldText(record.mutual_user),
                      fieldText(record.mutual_password))
{
}

ISCSITargetInfo::~ISCSITargetInfo() = default;

std::string ISCSITargetInfo::toString() const
{
    return TextLine()
        .add("tid: ", tid)
        .add(" ,name: ", name)
        .add(" ,iqn: ", iqn)
        .add(" ,mapping_index: ", mapping_index)
        .add(" ,is_enabled: ", is_enabled)
        .add(" ,has_header_checksum: ", has_header_checksum)
        .add(" ,has_data_checksum: ", has_data_checksum)
        .addSize(" ,max_recv_seg_bytes: ", max_recv_seg_bytes)
        .addSize(" ,max_send_seg_bytes: ", max_send_seg_bytes)
        .add(" ,max_sessions: ", max_sessions)
        .add(" ,auth_type: ", auth_type)
        .add(" ,user: ", user)
        .add(" ,mutual_user: ", mutual_user)
        .text();
}

int ISCSITargetInfo::fillISCSITARGET(_tag_iscsi_target_ &out) const
{
    if (int err = StringCopy(out.name, name))
        return failText(here(), err, "Failed to copy target name. target: %s", toString().c_str());
    if (int err = StringCopy(out.iqn, iqn))
        return failText(here(), err, "Failed to copy target IQN. target: %s", toString().c_str());
    if (int err = StringCopy(out.user, user))
        return failText(here(), err, "Failed to copy target user name. target: %s", toString().c_str());
    if (int err = SecretCopy(out.password, password))
        return failText(here(), err, "Failed to copy target password. target: %s", toString().c_str());
    if (int err = StringCopy(out.mutual_user, mutual_user))
        return failText(here(), err, "Failed to copy target mutual user name. target: %s", toString().c_str());
    if (int err = SecretCopy(out.mutual_password, mutual_password))
        return failText(here(), err, "Failed to copy target mutual password. target: %s", toString().c_str());
    out.tid = static_cast<int32_t>(tid);
    out.enabled = is_enabled;
    out.header_digest = has_header_checksum;
    out.data_digest = has_data_checksum;
    out.reserved_8 = 0;
    out.max_recv_seg_bytes = max_recv_seg_bytes;
    out.max_send_seg_bytes = max_send_seg_bytes;
    out.max_sessions = max_sessions;
    out.auth_type = knownAuthType(auth_type);
    return 0;
}

int ISCSITargetInfo::loadFromConfig(_tag_iscsi_target_ &out)
{
    _tag_iscsi_conf_query_ query{};
    query.kind = NORV_CONF_TARGET_BY_ID;
    query.tid = static_cast<int32_t>(tid);
    Conf conf;
    if (queryConf(query, conf))
        return failText(here(), ERR_FAILED_TO_LOAD_TARGET, "Failed to load target info. target ID: %d", query.tid);
    if (!conf->targets)
        return failText(here(), ERR_FAILED_TO_LOAD_TARGET, "No such target. target ID: %d", query.tid);
    const _tag_iscsi_target_ &record = *conf->targets;
    ISCSITargetInfo loaded(record, mapping_index);
    // Loading gives the mutual secret the value of the CHAP secret; callers rely on it.
    loaded.mutual_password = loaded.password;
    *this = std::move(loaded);
    out = record;
    return 0;
}

int ISCSITargetInfo::toJsonFormat(Json::Value &value) const
{
    if (name.empty())
        return failText(here(), NOT_ENOUGH_INFO, "Not enough info to create target info in Json format: %s",
                        toString().c_str());
    value = Json::Value(Json::objectValue);
    value[Key("target_id")] = tid;
    value[Key("name")] = name;
    value[Key("iqn")] = iqn;
    value[Key("mapping_index")] = mapping_index;
    value[Key("is_enabled")] = is_enabled;
    value[Key("has_header_checksum")] = has_header_checksum;
    value[Key("has_data_checksum")] = has_data_checksum;
    value[Key("max_recv_seq_bytes")] = max_recv_seg_bytes;
    value[Key("max_send_seq_bytes")] = max_send_seg_bytes;
    value[Key("max_sessions")] = max_sessions;
    value[Key("auth_type")] = auth_type;
    value[Key("user")] = user;
    value[Key("password")] = password;
    value[Key("mutual_user")] = mutual_user;
    value[Key("mutual_password")] = mutual_password;
    return 0;
}

int ISCSITargetInfo::GetTIDByTargetName(const std::string &name, int &tid)
{
    _tag_iscsi_conf_query_ query{};
    query.kind = NORV_CONF_TARGET_BY_NAME;
    query.name = name.c_str();
    _tag_iscsi_conf_ *answer = nullptr;
    const int err = NORViSCSIConfTargetLoad(&query, &answer);
    const Conf conf(answer);
    if (err)
        return failText(here(), err, "Failed to load target config.");
    if (!conf->targets)
        return failText(here(), ERR_NO_SUCH_TARGET, "No such target. Name: %s", name.c_str());
    tid = conf->targets->tid;
    return 0;
}

int ISCSITargetInfo::ListTarget(std::vector<ISCSITargetInfo> &out, const std::string &lun_uuid)
{
    out.clear();
    _tag_iscsi_conf_query_ query{};
    _tag_iscsi_lun_ lun{};
    query.kind = NORV_CONF_ALL_TARGETS;
    if (!lun_uuid.empty()) {
        ISCSILUNInfo info(lun_uuid);
        if (int err = info.loadFromConfig(lun, 0))
            return failText(here(), err, "Failed to load LUN info: %s", info.toString().c_str());
        query.kind = NORV_CONF_TARGETS_OF_LUN;
        query.lun = &lun;
    }
    Conf conf;
    if (queryConf(query, conf))
        return failText(here(), ERR_FAILED_TO_LIST_TARGET, "Failed to list target. LUN UUID: %s", lun_uuid.c_str());
    const _tag_iscsi_mapping_ *mapping = query.lun ? conf->mappings : nullptr;
    for (const _tag_iscsi_target_ *record = conf->targets; record; record = record->next) {
        out.push_back(ISCSITargetInfo(*record, mapping ? mapping->mapping_index : -1));
        mapping = mapping ? mapping->next : nullptr;
    }
    return 0;
}

int ISCSITargetInfo::GetTID(const std::string &selector, int &tid)
{
    const long number = strtol(selector.c_str(), nullptr, 10);
    if (number >= 1 && number <= NORV_TARGET_ID_MAX) {
        tid = static_cast<int>(number);
        return 0;
    }
    return resolveSelector<ISCSITargetInfo>(
        SELECTOR, selector, [](std::vector<ISCSITargetInfo> &targets) { return ListTarget(targets, ""); },
        [&](const ISCSITargetInfo &target) { tid = static_cast<int>(target.tid); },
        [&, site = here()](const std::string &name) {
            return GetTIDByTargetName(name, tid) ? failInvalid(SELECTOR, name, site) : 0;
        });
}

} // namespace ISCSI

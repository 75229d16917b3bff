#include "iscsiwebapi/ISCSIVLUNInfo.h"

#include "etc/Failure.h"
#include "etc/Text.h"
#include "iscsiwebapi/ISCSILUNInfo.h"

namespace ISCSI {
namespace {

/// What toJsonFormat returns for a record without identity; callers test for non-zero only.
constexpr int NOT_ENOUGH_INFO = 3328;

_tag_iscsi_vlun_type knownType(int32_t kind)
{
    return kind >= 1 && kind <= 3 ? static_cast<_tag_iscsi_vlun_type>(kind) : VLUN_TYPE_NONE;
}

} // namespace

ISCSIVLUNInfo::ISCSIVLUNInfo(const std::string &uuid) : uuid(uuid) {}

ISCSIVLUNInfo::ISCSIVLUNInfo(_tag_iscsi_vlun_type type, const std::string &src_lun_uuid)
    : type(type), src_lun_uuid(src_lun_uuid)
{
}

ISCSIVLUNInfo::~ISCSIVLUNInfo() = default;

int ISCSIVLUNInfo::loadFromConfig(_tag_viscsi_virtual_lun_ &out, int flag)
{
    if (uuid.empty())
        return failText(here(), ERR_NO_VLUN_UUID, "No vLUN UUID. vLUN: %s", toString().c_str());
    out = {};
    if (NORViSCSIVirtualLunFillByUUID(uuid.c_str(), &out, flag))
        return failText(here(), ERR_FAILED_TO_LOAD_VLUN_CONFIG, "Failed to load vLUN info from SDK. vLUN: %s",
                        toString().c_str());
    type = knownType(out.kind);
    // A loaded record goes by its source LUN's UUID; callers rely on it.
    if (int err = ISCSILUNInfo::GetUUIDByLID(out.src_lid, uuid))
        return failText(here(), err, "Failed to get source LUN UUID. vLUN: %s", toString().c_str());
    return 0;
}

std::string ISCSIVLUNInfo::toString() const
{
    return TextLine()
        .add("uuid: ", uuid)
        .add(" ,type: ", static_cast<unsigned int>(type))
        .add(" ,src_lun_uuid: ", src_lun_uuid)
        .text();
}

int ISCSIVLUNInfo::toJsonFormat(Json::Value &value) const
{
    if (uuid.empty())
        return failText(here(), NOT_ENOUGH_INFO, "Not enough info to create task info in Json format: %s",
                        toString().c_str());
    if (!value.isObject())
        value = Json::Value(Json::objectValue);
    value["uuid"] = uuid;
    value["type"] = static_cast<int>(type);
    value["src_lun_uuid"] = src_lun_uuid;
    return 0;
}

} // namespace ISCSI

#include "iscsiwebapi/ISCSILUNInfo.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/JsonReader.h"
#include "etc/LUNType.h"
#include "etc/PlatformAnswers.h"
#include "etc/Selector.h"
#include "etc/Text.h"

namespace ISCSI {
namespace {

using Key = Json::StaticString; // a key that is not copied

/// What toJsonFormat returns for a record without identity; callers test for non-zero only.
constexpr int NOT_ENOUGH_INFO = 3328;

const SelectorKind SELECTOR = {
    "lun#%u%c",
    "Failed to list LUNs.",
    "Index of LUN is out of range. index: %d, #LUNs: %zu",
    "Invalid LUN UUID, name or index. input: %s",
    ERR_BAD_LUN_UUID,
};

/// Runs the live-state loaders that the flags ask for, in the order of their bits.
int loadLiveState(ISCSILUNInfo &info, _tag_iscsi_lun_ &record, int flags, Site site)
{
    static const struct {
        int flag;
        int (ISCSILUNInfo::*load)(_tag_iscsi_lun_ &);
        const char *failure;
    } loaders[] = {
        {ISCSILUNInfo::LOAD_LOCKED, &ISCSILUNInfo::loadIsActionLocked, "Failed to check if LUN is locked"},
        {ISCSILUNInfo::LOAD_MAPPED, &ISCSILUNInfo::loadIsMapped, "Failed to check if LUN is mapped"},
        {ISCSILUNInfo::LOAD_EXTENT_SIZE, &ISCSILUNInfo::loadExtentSize, "Failed to load extent size"},
        {ISCSILUNInfo::LOAD_ALLOCATED_SIZE, &ISCSILUNInfo::loadAllocatedSize, "Failed to load LUN's allocate size"},
        {ISCSILUNInfo::LOAD_STATUS, &ISCSILUNInfo::loadStatus, "Failed to load LUN's status"},
    };
    for (const auto &loader : loaders) {
        if (!(flags & loader.flag))
            continue;
        if (int err = (info.*loader.load)(record))
            return fail(err, info, loader.failure, site);
    }
    return 0;
}

bool isKnownType(int type)
{
    switch (type) {
    case NORV_LUN_TYPE_BLOCK:
    case NORV_LUN_TYPE_FILE:
    case NORV_LUN_TYPE_THIN:
    case NORV_LUN_TYPE_ADV:
    case NORV_LUN_TYPE_SINK:
    case NORV_LUN_TYPE_47:
    case NORV_LUN_TYPE_71:
    case NORV_LUN_TYPE_79:
        return true;
    default:
        return false;
    }
}

} // namespace

const char *LUNTypeName(_tag_iscsi_lun_type type)
{
    switch (type) {
    case NORV_LUN_TYPE_BLOCK:
        return "BLOCK";
    case NORV_LUN_TYPE_FILE:
        return "FILE";
    case NORV_LUN_TYPE_THIN:
        return "THIN";
    case NORV_LUN_TYPE_ADV:
        return "ADV";
    case NORV_LUN_TYPE_SINK:
        return "SINK";
    default:
        return "unknown";
    }
}

ISCSILUNInfo::ISCSILUNInfo(const std::string &uuid) : uuid(uuid) {}

ISCSILUNInfo::ISCSILUNInfo(_tag_iscsi_lun_type type, unsigned long long size, const std::string &name,
                           const std::string &location, unsigned int extent_size)
    : type(type), size(size), name(name), location(location), extent_size(extent_size)
{
}

ISCSILUNInfo::ISCSILUNInfo(int lun_id, _tag_iscsi_lun_type type, long restored_time, unsigned long long size,
                           const std::string &uuid, const std::string &name, const std::string &location,
                           bool is_action_locked, bool is_mapped, unsigned int extent_size,
                           unsigned long long allocated_size, const std::string &status)
    : lun_id(lun_id), type(type), restored_time(restored_time), size(size), uuid(uuid), name(name), location(location),
      is_action_locked(is_action_locked), is_mapped(is_mapped), extent_size(extent_size),
      allocated_size(allocated_size), status(status)
{
}

ISCSILUNInfo::ISCSILUNInfo(const _tag_iscsi_lun_ &record)
    : lun_id(record.lid), type(static_cast<_tag_iscsi_lun_type>(record.type)), restored_time(record.restored_time),
      size(record.size), uuid(fieldText(record.uuid)), name(fieldText(record.name)),
      location(fieldText(record.location)), extent_size(record.extent_size)
{
}

ISCSILUNInfo::~ISCSILUNInfo() = default;

bool ISCSILUNInfo::isInvalid() const
{
    return uuid.empty();
}

std::string ISCSILUNInfo::toString() const
{
    return TextLine()
        .add("uuid: ", uuid)
        .add(" ,lun_id: ", lun_id)
        .add(" ,name: ", name)
        .add(" ,type: ", LUNTypeName(type))
        .add(" ,location: ", location)
        .add(" ,is_action_locked: ", is_action_locked)
        .add(" ,is_mapped: ", is_mapped)
        .addSize(" ,size: ", size)
        .addSize(" ,extent_size: ", extent_size)
        .addSize(" ,allocated_size: ", allocated_size)
        .add(" ,status: ", status)
        .addTime(" ,restored_time: ", restored_time)
        .text();
}

int ISCSILUNInfo::fillISCSILUN(_tag_iscsi_lun_ &record)
{
    record = {};
    record.size = size;
    record.lid = lun_id;
    record.restored_time = static_cast<int32_t>(restored_time);
    record.type = type;
    record.extent_size = extent_size;
    if (int err = StringCopy(record.uuid, uuid))
        return failText(here(), err, "Failed to copy LUN UUID. lun: %s", toString().c_str());
    if (int err = StringCopy(record.location, location))
        return failText(here(), err, "Failed to copy LUN location. lun: %s", toString().c_str());
    if (int err = StringCopy(record.name, name))
        return failText(here(), err, "Failed to copy LUN name. lun: %s", toString().c_str());
    return 0;
}

int ISCSILUNInfo::loadFromConfig(_tag_iscsi_lun_ &record, int flags)
{
    if (uuid.empty())
        return failText(here(), ERR_NO_LUN_UUID, "No LUN UUID");
    record = {};
    if (int err = NORViSCSILunConfigGetByUUID(uuid.c_str(), &record, flags)) {
        if (flags & LOAD_QUIET)
            return err;
        return failText(here(), err, "Failed to load LUN info from SDK. LUN UUID: %s", uuid.c_str());
    }
    size = record.size;
    lun_id = record.lid;
    type = static_cast<_tag_iscsi_lun_type>(record.type);
    restored_time = record.restored_time;
    uuid = fieldText(record.uuid);
    name = fieldText(record.name);
    location = fieldText(record.location);
    return loadLiveState(*this, record, flags, here());
}

int ISCSILUNInfo::toJsonFormat(Json::Value &out) const
{
    if (isInvalid())
        return failText(here(), NOT_ENOUGH_INFO, "Not enough info to create LUN info in Json format: %s",
                        toString().c_str());
    if (!out.isObject())
        out = Json::Value(Json::objectValue);
    out[Key("lun_id")] = lun_id;
    out[Key("type")] = static_cast<int>(type);
    out[Key("restored_time")] = static_cast<Json::Int64>(restored_time);
    out[Key("size")] = static_cast<Json::UInt64>(size);
    out[Key("uuid")] = uuid;
    out[Key("name")] = name;
    out[Key("location")] = location;
    out[Key("is_action_locked")] = is_action_locked;
    out[Key("is_mapped")] = is_mapped;
    out[Key("extent_size")] = extent_size;
    out[Key("allocated_size")] = static_cast<Json::UInt64>(allocated_size);
    out[Key("status")] = status;
    return 0;
}

int ISCSILUNInfo::loadFromJson(const Json::Value &in)
{
    ISCSILUNInfo read = *this;
    int number = 0;
    JsonReader reader(in);
    reader.required("lun_id", read.lun_id)
        .required("type", number)
        .required("restored_time", read.restored_time)
        .required("size", read.size)
        .required("uuid", read.uuid)
        .required("name", read.name)
        .required("location", read.location)
        .optional("is_action_locked", read.is_action_locked)
        .optional("is_mapped", read.is_mapped)
        .optional("extent_size", read.extent_size)
        .optional("allocated_size", read.allocated_size)
        .optional("status", read.status);
    if (!reader.ok())
        return failText(here(), ERR_INVALID_INPUT, "Failed to get LUN info from Json.");
    read.type = isKnownType(number) ? static_cast<_tag_iscsi_lun_type>(number) : NORV_LUN_TYPE_NONE;
    *this = std::move(read);
    return 0;
}

int ISCSILUNInfo::ListLUN(std::vector<ISCSILUNInfo> &out, int filter)
{
    _tag_iscsi_lun_ *list = nullptr;
    size_t count = 0;
    if (NORViSCSILunConfigGetAll(&list, &count))
        return failText(here(), ERR_FAILED_TO_LIST_LUN, "Failed to list LUNs' config.");
    const LUNRecords records(list);
    out.clear();
    out.reserve(count);
    for (size_t i = 0; i < count; ++i) {
        ISCSILUNInfo info(records[i]);
        if (int err = loadLiveState(info, records[i], filter, here()))
            return err;
        out.push_back(std::move(info));
    }
    return 0;
}

int ISCSILUNInfo::GetUUIDByLID(int lun_id, std::string &uuid)
{
    _tag_iscsi_lun_ record{};
    if (NORViSCSILunGetByLunId(lun_id, &record))
        return failText(here(), ERR_NO_SUCH_LUN, "No such LUN. LUN ID: %d", lun_id);
    uuid = fieldText(record.uuid);
    return 0;
}

int ISCSILUNInfo::GetUUIDByLUNName(const std::string &name, std::string &uuid)
{
    _tag_iscsi_lun_ record{};
    if (NORViSCSILunGetByLunName(name.c_str(), &record))
        return failText(here(), ERR_NO_SUCH_LUN, "No such LUN. Name: %s", name.c_str());
    uuid = fieldText(record.uuid);
    return 0;
}

int ISCSILUNInfo::GetLIDByLUNName(const std::string &name, int &lun_id)
{
    _tag_iscsi_lun_ record{};
    if (NORViSCSILunGetByLunName(name.c_str(), &record))
        return failText(here(), ERR_NO_SUCH_LUN, "No such LUN. Name: %s", name.c_str());
    lun_id = record.lid;
    return 0;
}

int ISCSILUNInfo::GetLUNUUID(const std::string &selector, std::string &uuid)
{
    if (selector.empty() || isUUID(selector)) {
        uuid = selector;
        return 0;
    }
    return resolveSelector<ISCSILUNInfo>(
        SELECTOR, selector, [](std::vector<ISCSILUNInfo> &luns) { return ListLUN(luns, 0); },
        [&](const ISCSILUNInfo &lun) { uuid = lun.uuid; },
        [&, site = here()](const std::string &name) {
            return GetUUIDByLUNName(name, uuid) ? failInvalid(SELECTOR, name, site) : 0;
        });
}

} // namespace ISCSI

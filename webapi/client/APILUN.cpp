#include "webapi/client/APILUN.h"

#include "etc/JsonReader.h"

#include <algorithm>

namespace ISCSI::WebAPI::APILUN {
namespace {

Json::Value creation(const std::string &name, _tag_iscsi_lun_type type, const std::string &location,
                     unsigned long long size, unsigned int extent_size)
{
    Json::Value body(Json::objectValue);
    body["name"] = name;
    body["type"] = static_cast<int>(type);
    body["location"] = location;
    body["size"] = Json::UInt64(size);
    body["extent_size"] = extent_size;
    return body;
}

Json::Value changes(const std::string &name, unsigned long long size)
{
    Json::Value body(Json::objectValue);
    if (!name.empty())
        body["name"] = name;
    if (size != 0)
        body["size"] = Json::UInt64(size);
    return body;
}

Json::Value taking(bool is_app_consistent, bool is_user_locked, const std::string &name, const std::string &description,
                   const std::string &taken_by, long snapshot_time, bool is_scheduled)
{
    Json::Value body(Json::objectValue);
    if (!name.empty())
        body["name"] = name;
    body["description"] = description;
    if (!taken_by.empty())
        body["taken_by"] = taken_by;
    body["snapshot_time"] = Json::Int64(snapshot_time);
    body["is_app_consistent"] = is_app_consistent;
    body["is_user_locked"] = is_user_locked;
    body["is_scheduled"] = is_scheduled;
    return body;
}

} // namespace

WebAPIClientLUNCreate::WebAPIClientLUNCreate(const ISCSINodeInfo &node, const std::string &name,
                                             _tag_iscsi_lun_type type, const std::string &location,
                                             unsigned long long size, unsigned int extent_size)
    : Client(node, "POST", "/luns", creation(name, type, location, size, extent_size))
{
}

bool WebAPIClientLUNCreate::readResponse(const Json::Value &response)
{
    return JsonReader(response).required("uuid", lun_uuid).ok() && !lun_uuid.empty();
}

WebAPIClientLUNDelete::WebAPIClientLUNDelete(const ISCSINodeInfo &node, const std::string &lun_uuid)
    : Client(node, "DELETE", "/luns/" + segment(lun_uuid))
{
}

WebAPIClientLUNSet::WebAPIClientLUNSet(const ISCSINodeInfo &node, const std::string &lun_uuid, const std::string &name,
                                       unsigned long long size)
    : Client(node, "PATCH", "/luns/" + segment(lun_uuid), changes(name, size))
{
}

StateClient::StateClient(const ISCSINodeInfo &node, std::string path, const std::vector<std::string> &additional)
    : Client(node, "GET", std::move(path)), additional(additional)
{
}

bool StateClient::readResponse(const Json::Value &response)
{
    const auto asked = [this](const char *field) {
        return std::find(additional.begin(), additional.end(), field) != additional.end();
    };
    JsonReader reader(response);
    if (asked("is_action_locked"))
        reader.required("is_action_locked", is_action_locked);
    if (asked("sync_progress"))
        reader.required("sync_progress", sync_progress);
    return reader.ok();
}

WebAPIClientLUNGet::WebAPIClientLUNGet(const ISCSINodeInfo &node, const std::string &lun_uuid,
                                       const std::vector<std::string> &additional)
    : StateClient(node, "/luns/" + segment(lun_uuid), additional)
{
}

WebAPIClientLUNGetSnapshot::WebAPIClientLUNGetSnapshot(const ISCSINodeInfo &node, const std::string &snapshot_uuid,
                                                       const std::vector<std::string> &additional)
    : StateClient(node, "/snapshots/" + segment(snapshot_uuid), additional)
{
}

WebAPIClientLUNTakeSnapshot::WebAPIClientLUNTakeSnapshot(const ISCSINodeInfo &node, const std::string &lun_uuid,
                                                         bool is_app_consistent, bool is_user_locked,
                                                         const std::string &name, const std::string &description,
                                                         const std::string &taken_by, long snapshot_time,
                                                         bool is_scheduled)
    : Client(node, "POST", "/luns/" + segment(lun_uuid) + "/snapshots",
             taking(is_app_consistent, is_user_locked, name, description, taken_by, snapshot_time, is_scheduled))
{
}

bool WebAPIClientLUNTakeSnapshot::readResponse(const Json::Value &response)
{
    return JsonReader(response).required("uuid", snapshot_uuid).ok() && !snapshot_uuid.empty();
}

} // namespace ISCSI::WebAPI::APILUN

#include "iscsiwebapi/ISCSITaskInfo.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/PlatformAnswers.h"
#include "etc/Selector.h"
#include "etc/Text.h"

namespace ISCSI {
namespace {

const SelectorKind SELECTOR = {
    "rep#%u%c",
    "Failed to list tasks.",
    "Index of task is out of range. index: %d, #nodes: %zu",
    "Invalid task UUID or index. input: %s",
    ERR_BAD_TASK_UUID,
};

bool isComplete(const ISCSITaskInfo &task)
{
    return (task.is_source || !task.uuid.empty()) && !task.src_lun.isInvalid() && !task.dst_lun.isInvalid() &&
           !task.src_node.isInvalid(false) && !task.dst_node.isInvalid(false) && !task.root_path.empty();
}

/// The task of an SDK record; LUNs and nodes by UUID only.
ISCSITaskInfo fromRecord(const _tag_iscsi_task_ &record)
{
    return ISCSITaskInfo(fieldText(record.uuid), record.is_source, ISCSILUNInfo(fieldText(record.src_lun_uuid)),
                         ISCSILUNInfo(fieldText(record.dst_lun_uuid)), ISCSINodeInfo(fieldText(record.src_node_uuid)),
                         ISCSINodeInfo(fieldText(record.dst_node_uuid)), fieldText(record.root_path),
                         fieldText(record.parent_task_uuid));
}

} // namespace

ISCSITaskInfo::ISCSITaskInfo(const std::string &uuid) : uuid(uuid) {}

ISCSITaskInfo::ISCSITaskInfo(const std::string &uuid, bool is_source, const ISCSILUNInfo &src_lun,
                             const ISCSILUNInfo &dst_lun, const ISCSINodeInfo &src_node, const ISCSINodeInfo &dst_node,
                             const std::string &root_path, const std::string &parent_task_uuid)
    : uuid(uuid), is_source(is_source), src_lun(src_lun), dst_lun(dst_lun), src_node(src_node), dst_node(dst_node),
      root_path(root_path), parent_task_uuid(parent_task_uuid)
{
}

ISCSITaskInfo::~ISCSITaskInfo() = default;

int ISCSITaskInfo::loadFromConfig(_tag_iscsi_task_ &record, bool strict)
{
    if (uuid.empty())
        return failText(here(), ERR_BAD_REPLICATION_TASK_INFO, "Bad task info. UUID is empty");
    record = {};
    if (int err = NORViSCSIReplicationTaskConfGetByUUID(uuid.c_str(), &record))
        return failText(here(), err, "Failed to load replication task: %s", uuid.c_str());
    const std::string selected = uuid;
    *this = fromRecord(record);
    uuid = selected;

    // A LUN that is gone is told below, or no failure.
    _tag_iscsi_lun_ lun{};
    if (int err = (is_source ? src_lun : dst_lun).loadFromConfig(lun, ISCSILUNInfo::LOAD_QUIET); err && strict)
        return failText(here(), err,
                        is_source ? "Failed to load source LUN. task: %s" : "Failed to load destination LUN. task: %s",
                        uuid.c_str());
    if (int err = src_node.loadFromDRNode()) {
        failText(here(), err, "Failed to load source node. task: %s", uuid.c_str());
        if (strict)
            return err;
    }
    if (int err = dst_node.loadFromDRNode()) {
        failText(here(), err, "Failed to load destination node. task: %s", uuid.c_str());
        if (strict)
            return err;
    }
    return 0;
}

std::string ISCSITaskInfo::getLockPath() const
{
    return uuid.empty() ? "" : std::string("/tmp/iscsi") + "/TASK_" + uuid + ".lock";
}

std::string ISCSITaskInfo::toString() const
{
    return TextLine()
        .add("uuid: ", uuid)
        .add(" ,is_source: ", is_source)
        .add(" ,src_lun_uuid: ", src_lun.uuid)
        .add(" ,dst_lun_uuid: ", dst_lun.uuid)
        .add(" ,src_node_uuid: ", src_node.uuid)
        .add(" ,dst_node_uuid: ", dst_node.uuid)
        .add(" ,root_path: ", root_path)
        .add(" ,parent_task_uuid: ", parent_task_uuid)
        .text();
}

int ISCSITaskInfo::toJsonFormat(Json::Value &out) const
{
    if (!isComplete(*this))
        return failText(here(), ERR_BAD_REPLICATION_TASK_INFO, "Not enough info to create task info in Json format: %s",
                        toString().c_str());
    out = Json::Value(Json::objectValue);
    out["uuid"] = uuid;
    out["is_source"] = is_source;
    out["src_lun_uuid"] = src_lun.uuid;
    out["dst_lun_uuid"] = dst_lun.uuid;
    out["src_node_uuid"] = src_node.uuid;
    out["dst_node_uuid"] = dst_node.uuid;
    out["root_path"] = root_path;
    out["parent_task_uuid"] = parent_task_uuid;
    return 0;
}

int ISCSITaskInfo::fillVISCSITask(_tag_iscsi_task_ &record)
{
    if (!isComplete(*this))
        return failText(here(), ERR_BAD_REPLICATION_TASK_INFO, "Bad task info: %s", toString().c_str());
    record = {};
    record.is_source = is_source;
    const struct {
        char (&field)[37];
        const std::string &value;
    } uuids[] = {
        {record.uuid, uuid},
        {record.src_lun_uuid, src_lun.uuid},
        {record.dst_lun_uuid, dst_lun.uuid},
        {record.src_node_uuid, src_node.uuid},
        {record.dst_node_uuid, dst_node.uuid},
    };
    for (const auto &copy : uuids) {
        if (int err = StringCopy(copy.field, copy.value))
            return failText(here(), err, "Failed to copy UUID. task: %s", toString().c_str());
    }
    if (int err = StringCopy(record.root_path, root_path))
        return failText(here(), err, "Failed to copy UUID. task: %s", toString().c_str());
    if (int err = StringCopy(record.parent_task_uuid, parent_task_uuid))
        return failText(here(), err, "Failed to copy parent task UUID. task: %s", toString().c_str());
    return 0;
}

int ISCSITaskInfo::ListTask(std::vector<ISCSITaskInfo> &out)
{
    const _tag_iscsi_task_selection_ all{};
    int count = 0;
    TaskRecords list;
    if (int err = NORViSCSIReplicationTaskConfLoad(&all, &count, &list.head, 0))
        return failText(here(), err, "Failed to list task. error: %s", ErrorCodeToString(err));
    while (const TaskRecord record = list.takeFirst())
        out.push_back(fromRecord(*record));
    return 0;
}

int ISCSITaskInfo::GetTaskUUID(const std::string &input, std::string &uuid)
{
    if (input.empty() || isUUID(input)) {
        uuid = input;
        return 0;
    }
    return resolveSelector<ISCSITaskInfo>(
        SELECTOR, input, ListTask, [&](const ISCSITaskInfo &task) { uuid = task.uuid; },
        [site = here()](const std::string &text) { return failInvalid(SELECTOR, text, site); });
}

} // namespace ISCSI

#include "iscsiwebapi/ISCSISnapshotInfo.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/JsonReader.h"
#include "etc/PlatformAnswers.h"
#include "etc/ProgressFile.h"
#include "etc/Selector.h"
#include "etc/Text.h"
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "platform/extent_pool.h"

#include <cstdio>

namespace ISCSI {
namespace {

const SelectorKind SELECTOR = {
    "sn#%u%c",
    "Failed to list snapshots.",
    "Index of snapshot is out of range. index: %d, #snapshots: %zu",
    "Invalid snapshot UUID, name or index. input: %s",
    ERR_BAD_SNAPSHOT_UUID,
};

/// Loads a fresh SDK record; the caller logs.
int loadFresh(const std::string &uuid, _tag_iscsi_snapshot_ &record)
{
    record = {};
    return NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &record);
}

int failToLoad(const ISCSISnapshotInfo &info, int err, Site site = here())
{
    return failText(site, err, "Failed to load snapshot. err: %s, info: %s", ErrorCodeToString(err),
                    info.toString().c_str());
}

/// Fills the record of the snapshot unless it holds one.
int loadRecord(const ISCSISnapshotInfo &info, _tag_iscsi_snapshot_ &record, Site site)
{
    if (record.snap_id >= 1 && record.snap_id <= NORV_SNAPSHOT_ID_MAX)
        return 0;
    if (int err = loadFresh(info.uuid, record))
        return failToLoad(info, err, site);
    return 0;
}

/// Replaces `keys` by the application keys that lock the snapshot; those read before a failure stay.
int queryLockedAppKeys(const _tag_iscsi_snapshot_ &record, const std::string &uuid, std::set<std::string> &keys,
                       Site site)
{
    constexpr int KEYS_MAX = 512;
    const TextList list(NLIBCSzListAlloc(KEYS_MAX));
    if (!list)
        return failText(site, ERR_OUT_OF_MEMORY, "Failed to allocate memory for list.");
    if (int err = NORViSCSISnapshotLockedAppKeysGet(&record, list.get()))
        return failText(site, err, "Failed to get locked app key for snapshot: %s.", uuid.c_str());
    keys.clear();
    for (int i = 0; i < list->count; ++i) {
        const char *key = NLIBCSzListGet(list.get(), i);
        if (!key)
            return failShort(site, ERR_FAILED_TO_GET_FROM_LIST, "Failed to get line from list. index: %d", i);
        keys.insert(key);
    }
    return 0;
}

/// The directory that holds a snapshot's data; what does not fit the platform's limit is cut.
BoundedText<320> dataPath(const _tag_iscsi_snapshot_ &record)
{
    const std::string root = fieldText(record.root_path);
    const std::string name = fieldText(record.name);
    if (record.flags & NORV_SNAPSHOT_TRASH)
        return BoundedText<320>("%s/@EP_trash/SNAPSHOT_L%d_S%d_%s", root.c_str(), record.lid, record.snap_id,
                                name.c_str());
    return BoundedText<320>("%s/@Snapshot/SNAPSHOT_L%d_S%d_%s", root.c_str(), record.lid, record.snap_id, name.c_str());
}

/// Splits "lun_snapshot" at its first underscore; the snapshot's name ends at the first blank.
bool splitName(const std::string &input, std::string &lun, std::string &snapshot)
{
    static const char blanks[] = " \t\n\v\f\r";
    const size_t underscore = input.find('_');
    if (underscore == std::string::npos || underscore == 0)
        return false;
    const size_t start = input.find_first_not_of(blanks, underscore + 1);
    if (start == std::string::npos)
        return false;
    lun = input.substr(0, underscore);
    snapshot = input.substr(start, input.find_first_of(blanks, start) - start);
    return true;
}

} // namespace

ISCSISnapshotInfo::ISCSISnapshotInfo(const std::string &uuid) : uuid(uuid) {}

ISCSISnapshotInfo::ISCSISnapshotInfo(const _tag_iscsi_snapshot_ &record)
    : snapshot_id(record.snap_id), parent_lun_id(record.lid), total_size(record.total_size),
      mapped_size(record.mapped_size), create_time(record.create_time), snapshot_time(record.snap_time),
      is_app_consistent(record.app_consistent), is_user_locked(record.user_locked), name(fieldText(record.name)),
      status(fieldText(record.status)), description(fieldText(record.desc)), root_path(fieldText(record.root_path)),
      taken_by(fieldText(record.taken_by)), uuid(fieldText(record.uuid)), version(fieldText(record.version))
{
}

ISCSISnapshotInfo::ISCSISnapshotInfo(int snapshot_id, int parent_lun_id, unsigned long long total_size,
                                     unsigned long long mapped_size, long create_time, long snapshot_time,
                                     bool is_app_consistent, bool is_user_locked, const std::string &name,
                                     const std::string &status, const std::string &description,
                                     const std::string &root_path, const std::string &taken_by, const std::string &uuid,
                                     const std::string &version, bool is_action_locked,
                                     const std::set<std::string> &locked_app_keys)
    : snapshot_id(snapshot_id), parent_lun_id(parent_lun_id), total_size(total_size), mapped_size(mapped_size),
      create_time(create_time), snapshot_time(snapshot_time), is_app_consistent(is_app_consistent),
      is_user_locked(is_user_locked), name(name), status(status), description(description), root_path(root_path),
      taken_by(taken_by), uuid(uuid), version(version), is_action_locked(is_action_locked),
      locked_app_keys(locked_app_keys)
{
}

ISCSISnapshotInfo::~ISCSISnapshotInfo() = default;

int ISCSISnapshotInfo::loadFromJson(const Json::Value &in)
{
    ISCSISnapshotInfo read = *this;
    read.is_action_locked = false;
    JsonReader reader(in);
    reader.required("snapshot_id", read.snapshot_id)
        .required("parent_lun_id", read.parent_lun_id)
        .required("total_size", read.total_size)
        .required("mapped_size", read.mapped_size)
        .required("create_time", read.create_time)
        .required("snapshot_time", read.snapshot_time)
        .required("is_app_consistent", read.is_app_consistent)
        .required("is_user_locked", read.is_user_locked)
        .required("name", read.name)
        .required("status", read.status)
        .required("description", read.description)
        .required("root_path", read.root_path)
        .required("taken_by", read.taken_by)
        .required("uuid", read.uuid)
        .required("version", read.version)
        .optional("is_action_locked", read.is_action_locked)
        .addTexts("locked_app_keys", read.locked_app_keys);
    if (!reader.ok())
        return failText(here(), ERR_INVALID_INPUT, "Failed to get snapshot info from Json.");
    *this = std::move(read);
    return 0;
}

int ISCSISnapshotInfo::toJsonFormat(Json::Value &out) const
{
    if (snapshot_id < 0)
        return failText(here(), ERR_INVALID_INPUT, "Not enough info to create snapshot info in Json format: %s",
                        toString().c_str());
    out = Json::Value(Json::objectValue);
    out["snapshot_id"] = snapshot_id;
    out["parent_lun_id"] = parent_lun_id;
    out["total_size"] = static_cast<Json::UInt64>(total_size);
    out["mapped_size"] = static_cast<Json::UInt64>(mapped_size);
    out["create_time"] = static_cast<int>(create_time);
    out["snapshot_time"] = static_cast<int>(snapshot_time);
    out["is_app_consistent"] = is_app_consistent;
    out["is_user_locked"] = is_user_locked;
    out["name"] = name;
    out["status"] = status;
    out["description"] = description;
    out["root_path"] = root_path;
    out["taken_by"] = taken_by;
    out["uuid"] = uuid;
    out["version"] = version;
    out["is_action_locked"] = is_action_locked;
    Json::Value &keys = out["locked_app_keys"] = Json::Value(Json::arrayValue);
    for (const auto &key : locked_app_keys)
        keys.append(key);
    return 0;
}

std::string ISCSISnapshotInfo::toString() const
{
    std::string keys;
    for (const auto &key : locked_app_keys)
        keys += (keys.empty() ? "" : " ") + key;
    return TextLine()
        .add("uuid: ", uuid)
        .add(" ,snapshot_id: ", snapshot_id)
        .add(" ,parent_lun_id: ", parent_lun_id)
        .addSize(" ,total_size: ", total_size)
        .addSize(" ,mapped_size: ", mapped_size)
        .add(" ,is_action_locked: ", is_action_locked)
        .add(" ,is_app_consistent: ", is_app_consistent)
        .add(" ,is_user_locked: ", is_user_locked)
        .add(" ,name: ", name)
        .add(" ,status: ", status)
        .add(" ,description: ", description)
        .add(" ,root_path: ", root_path)
        .add(" ,taken_by: ", taken_by)
        .add(" ,version: ", version)
        .addTime(" ,create_time: ", create_time)
        .addTime(" ,snapshot_time: ", snapshot_time)
        .add(" ,locked_app_keys: ", keys)
        .text();
}

int ISCSISnapshotInfo::loadFromConfig(int flags)
{
    if (uuid.empty())
        return failText(here(), ERR_INVALID_INPUT, "Snapshot UUID is empty.");
    _tag_iscsi_snapshot_ record;
    if (int err = loadFresh(uuid, record))
        return failText(here(), err, "Failed to load snapshot config. UUID: %s", uuid.c_str());
    ISCSISnapshotInfo loaded(record);
    loaded.uuid = uuid;
    loaded.is_action_locked = is_action_locked;
    loaded.locked_app_keys = std::move(locked_app_keys);
    *this = std::move(loaded);
    if (flags & LOAD_ACTION_LOCK) {
        if (int err = loadActionLock(record))
            return fail(err, *this, "Failed to check if snapshot is locked");
    }
    if (flags & LOAD_LOCKED_APP_KEYS) {
        if (int err = loadLockedAppKeys(record))
            return fail(err, *this, "Failed to load locked app keys");
    }
    return 0;
}

int ISCSISnapshotInfo::loadActionLock(_tag_iscsi_snapshot_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    if (int err = NORViSCSIIsSnapshotLocked(&record, &is_action_locked))
        return failText(here(), err, "Failed to check if snapshot is locked. err: %s, info: %s", ErrorCodeToString(err),
                        toString().c_str());
    return 0;
}

int ISCSISnapshotInfo::loadLockedAppKeys(_tag_iscsi_snapshot_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    return queryLockedAppKeys(record, uuid, locked_app_keys, here());
}

int ISCSISnapshotInfo::lockSnapshotByAppKey(const std::string &app_key) const
{
    _tag_iscsi_snapshot_ record;
    if (int err = loadFresh(uuid, record))
        return failToLoad(*this, err);
    char key[128];
    if (int err = StringCopy(key, app_key))
        return failText(here(), err, "Failed to copy app key: %s.", app_key.c_str());
    if (int err = NORViSCSISnapshotLockByAppKey(&record, key))
        return failText(here(), err, "Failed to lock snapshot by app key: %s.", app_key.c_str());
    return 0;
}

int ISCSISnapshotInfo::unlockSnapshotByAppKey(const std::string &app_key) const
{
    _tag_iscsi_snapshot_ record;
    if (int err = loadFresh(uuid, record))
        return failToLoad(*this, err);
    char key[128];
    if (int err = StringCopy(key, app_key))
        return failText(here(), err, "Failed to copy app key: %s.", app_key.c_str());
    if (int err = NORViSCSISnapshotUnlockByAppKey(&record, key))
        return failText(here(), err, "Failed to unlock snapshot by app key: %s.", app_key.c_str());
    return 0;
}

int ISCSISnapshotInfo::loadSyncProgress(unsigned long long &done, unsigned long long &total)
{
    _tag_iscsi_snapshot_ record;
    if (int err = loadFresh(uuid, record))
        return fail(err, *this, "Failed to load snapshot");
    const auto path = dataPath(record);
    uint64_t done_bytes = 0;
    uint64_t total_bytes = 0;
    if (int err = NORViSCSIChildLunSyncProgressGet(path.c_str(), &done_bytes, &total_bytes))
        return fail(err, *this, "Failed to get snapshot sync progress");
    done = done_bytes;
    total = total_bytes;
    return 0;
}

int ISCSISnapshotInfo::getExportProgress(unsigned long long &done_bytes, unsigned long long &total_bytes, int &step)
{
    constexpr int DETECT_BASE = 0;
    _tag_iscsi_snapshot_ record;
    if (int err = loadFresh(uuid, record))
        return failToLoad(*this, err);
    const BoundedText<320> path("/tmp/iscsi/L%d_S%d.export_progress", record.lid, record.snap_id);
    if (!NLIBCFileExist(path.c_str())) {
        done_bytes = total_bytes = 0;
        step = ERR_NOW_IS_NOT_EXPORTING;
        return 0;
    }
    if (const char *key = readProgressFile(path.c_str(), DETECT_BASE, done_bytes, total_bytes, step))
        return failShort(here(), ERR_FAILED_TO_GET_FILE_SESSION, "Failed to get export progress from '%s': key = %s",
                         path.c_str(), key);
    return 0;
}

int ISCSISnapshotInfo::ListSnapshot(int lid, std::vector<ISCSISnapshotInfo> &out, long time, int filter)
{
    constexpr int ALL_LUNS = -1;
    _tag_iscsi_snapshot_query_ query{};
    if (lid != ALL_LUNS) {
        query.query_flags = NORV_SNAPSHOT_QUERY_LID;
        query.query_lid = lid;
    }
    if (time != 0) {
        query.query_flags |= NORV_SNAPSHOT_QUERY_TIME;
        query.query_time = static_cast<int32_t>(time);
    }
    SnapshotRecords list;
    if (int err = NORViSCSISnapshotConfLoad(&query, &list.head))
        return failShort(here(), ERR_FAILED_TO_LOAD_SNAPSHOT_CONFIG, "NORViSCSISnapshotConfLoad(%p, %p) failed, err%s",
                         static_cast<void *>(&query), static_cast<void *>(&list.head), ErrorCodeToString(err));
    out.clear();
    if (list.head.count > 0)
        out.reserve(static_cast<size_t>(list.head.count));
    while (const SnapshotRecord record = list.takeFirst()) {
        bool locked = false;
        if (filter & LOAD_ACTION_LOCK) {
            if (int err = NORViSCSIIsSnapshotLocked(record.get(), &locked))
                return failText(here(), err, "Failed to check if snapshot is locked. err: %d (%s)", err,
                                ErrorCodeToString(err));
        }
        std::set<std::string> keys;
        if (filter & LOAD_LOCKED_APP_KEYS) {
            if (int err = queryLockedAppKeys(*record, fieldText(record->uuid), keys, here()))
                return err;
        }
        out.emplace_back(*record);
        out.back().is_action_locked = locked;
        out.back().locked_app_keys = std::move(keys);
    }
    return 0;
}

int ISCSISnapshotInfo::GetUUIDByLIDAndSnapshotName(int lid, const std::string &name, std::string &uuid)
{
    _tag_iscsi_snapshot_ record{};
    if (int err = NORViSCSISnapshotConfGetByLIDAndName(lid, name.c_str(), &record))
        return failText(here(), err, "No such snapshot. lid: %d, name: %s", lid, name.c_str());
    uuid = fieldText(record.uuid);
    return 0;
}

int ISCSISnapshotInfo::GetSnapshotUUID(const std::string &input, std::string &uuid)
{
    if (isUUID(input)) {
        uuid = input;
        return 0;
    }
    const auto by_name = [&, site = here()](const std::string &text) {
        std::string lun;
        std::string snapshot;
        int lid = 0;
        if (!splitName(text, lun, snapshot))
            return failInvalid(SELECTOR, text, site);
        if (ISCSILUNInfo::GetLIDByLUNName(lun, lid))
            return failShort(site, ERR_BAD_SNAPSHOT_UUID, "Failed to get lid by LUN name: %s.", lun.c_str());
        if (GetUUIDByLIDAndSnapshotName(lid, snapshot, uuid))
            return failShort(site, ERR_BAD_SNAPSHOT_UUID,
                             "Failed to get snapshot UUID by lid and snapshot name. lid: %d, name: %s", lid,
                             snapshot.c_str());
        return 0;
    };
    return resolveSelector<ISCSISnapshotInfo>(
        SELECTOR, input, [](std::vector<ISCSISnapshotInfo> &snapshots) { return ListSnapshot(-1, snapshots, 0, 0); },
        [&](const ISCSISnapshotInfo &snapshot) { uuid = snapshot.uuid; }, by_name);
}

bool ISCSISnapshotInfo::CompareBySnapshotTime(ISCSISnapshotInfo first, ISCSISnapshotInfo second)
{
    return first.snapshot_time > second.snapshot_time;
}

} // namespace ISCSI

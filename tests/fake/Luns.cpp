// LUNs and their mappings on the fake's model.
#include "platform/error.h"
#include "tests/fake/Script.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

using namespace fake;

namespace {

LUN *byUUID(const char *uuid)
{
    return firstOf(model().luns, [&](const auto &record) { return strcmp(record.uuid, uuid) == 0; });
}

LUN *byName(const char *name)
{
    return firstOf(model().luns, [&](const auto &record) { return strcmp(record.name, name) == 0; });
}

LUN *byID(int lid)
{
    return valueOf(model().luns, lid);
}

bool isMapped(int lid)
{
    const auto &mappings = model().mappings;
    return std::any_of(mappings.begin(), mappings.end(), [&](const auto &mapping) { return mapping.lid == lid; });
}

bool isType(int type)
{
    const auto types = {NORV_LUN_TYPE_BLOCK, NORV_LUN_TYPE_FILE, NORV_LUN_TYPE_THIN, NORV_LUN_TYPE_ADV,
                        NORV_LUN_TYPE_SINK,  NORV_LUN_TYPE_47,   NORV_LUN_TYPE_71,   NORV_LUN_TYPE_79};
    return std::find(types.begin(), types.end(), type) != types.end();
}

bool isSize(uint64_t size)
{
    return size != 0 && size % 512 == 0 && size <= INT64_MAX;
}

int judge(const _tag_iscsi_lun_ &lun)
{
    if (!isType(lun.type))
        return NORV_ERR_LUN_TYPE;
    if (!isName(lun.name, sizeof(lun.name) - 1))
        return NORV_ERR_LUN_NAME;
    if (lun.type != NORV_LUN_TYPE_BLOCK && model().volumes.count(lun.location) == 0)
        return NORV_ERR_LUN_LOCATION;
    if (!isSize(lun.size))
        return NORV_ERR_LUN_SIZE;
    return byName(lun.name) ? NORV_ERR_LUN_NAME_EXISTS : 0;
}

int freeID()
{
    int lid = 1;
    while (byID(lid))
        ++lid;
    return lid;
}

/// The LUN number that a new mapping of the target gets; 0 is the target's own.
int freeIndex(int tid)
{
    const auto &mappings = model().mappings;
    int index = 1;
    while (std::any_of(mappings.begin(), mappings.end(),
                       [&](const auto &mapping) { return mapping.tid == tid && mapping.mapping_index == index; }))
        ++index;
    return index;
}

auto findMapping(int tid, int lid)
{
    auto &mappings = model().mappings;
    return std::find_if(mappings.begin(), mappings.end(),
                        [&](const auto &mapping) { return mapping.tid == tid && mapping.lid == lid; });
}

std::string idList(const int ids[], int count)
{
    std::string text;
    for (int i = 0; i < count; ++i)
        text += (i ? " " : "") + std::to_string(ids[i]);
    return text;
}

/// Loads or unloads; with the trash option the LUN also leaves or enters the trash.
int setLoaded(const char *name, const _tag_iscsi_lun_ &record, bool is_loaded)
{
    LUN *lun = byUUID(record.uuid);
    if (auto failure = calledOn(lun, name, record.uuid, record.options))
        return *failure;
    const uint32_t trash = record.options & NORV_LUN_OPTION_TRASH;
    lun->record.options = is_loaded ? lun->record.options & ~trash : lun->record.options | trash;
    return 0;
}

} // namespace

LUN *fake::findLUN(const char *uuid)
{
    return byUUID(uuid);
}

int fake::createLUN(_tag_iscsi_lun_ &lun)
{
    if (int err = judge(lun))
        return err;
    lun.lid = freeID();
    lun.options = 0;
    lun.restored_time = 0;
    makeUUID(lun.uuid);
    model().luns[lun.lid].record = lun;
    return 0;
}

int NORViSCSILunConfigGetByUUID(const char *uuid, _tag_iscsi_lun_ *lun, int flags)
{
    return answerRecord(byUUID(uuid), lun, __func__, uuid, flags);
}

int NORViSCSILunConfigGetAll(_tag_iscsi_lun_ **luns, size_t *count)
{
    if (auto failure = called(__func__))
        return *failure;
    const auto &known = model().luns;
    *luns = nullptr;
    *count = known.size();
    if (known.empty())
        return 0;
    auto *records = static_cast<_tag_iscsi_lun_ *>(malloc(known.size() * sizeof(_tag_iscsi_lun_)));
    *luns = records;
    for (const auto &[lid, lun] : known)
        *records++ = lun.record;
    return 0;
}

int NORViSCSILunGetByLunId(int lid, _tag_iscsi_lun_ *lun)
{
    return answerRecord(byID(lid), lun, __func__, lid);
}

int NORViSCSILunGetByLunName(const char *name, _tag_iscsi_lun_ *lun)
{
    return answerRecord(byName(name), lun, __func__, name);
}

int NORViSCSILunIsNameExist(const char *name, bool *exists)
{
    NOTE_CALL(name);
    *exists = byName(name) != nullptr;
    return 0;
}

int NORViSCSILunCreate(_tag_iscsi_lun_ *lun)
{
    NOTE_CALL(lun->name, lun->type, lun->location, lun->size, lun->extent_size);
    return createLUN(*lun);
}

int NORViSCSILunDelete(_tag_iscsi_lun_ *lun)
{
    const LUN *known = byUUID(lun->uuid);
    NOTE_CALL_ON(known, lun->uuid);
    if (isMapped(known->record.lid))
        return NORV_ERR_LUN_MAPPED;
    model().luns.erase(known->record.lid);
    return 0;
}

int NORViSCSILunUpdate(_tag_iscsi_lun_ *lun)
{
    LUN *known = byUUID(lun->uuid);
    NOTE_CALL_ON(known, lun->uuid, lun->name, lun->size);
    if (!isName(lun->name, sizeof(lun->name) - 1))
        return NORV_ERR_LUN_NAME;
    if (const LUN *other = byName(lun->name); other && other != known)
        return NORV_ERR_LUN_NAME_EXISTS;
    if (!isSize(lun->size) || lun->size < known->record.size)
        return NORV_ERR_LUN_SIZE;
    put(known->record.name, lun->name);
    known->record.size = lun->size;
    return 0;
}

int NORViSCSILunLoad(_tag_iscsi_lun_ *lun)
{
    return setLoaded(__func__, *lun, true);
}

int NORViSCSILunUnload(_tag_iscsi_lun_ *lun)
{
    return setLoaded(__func__, *lun, false);
}

int NORViSCSILunIsLocked(const _tag_iscsi_lun_ *lun, bool *locked)
{
    const LUN *known = byID(lun->lid);
    NOTE_CALL_ON(known, lun->lid);
    *locked = answerOf(__func__, known->is_locked) != 0;
    return 0;
}

int NORViSCSILunProgressGet(const _tag_iscsi_lun_ *lun, _tag_iscsi_lun_progress_ *progress)
{
    const LUN *known = byID(lun->lid);
    NOTE_CALL_ON(known, lun->lid);
    progress->st = static_cast<int32_t>(answerOf(__func__, known->progress));
    progress->percent = -1;
    return 0;
}

int NORViSCSIFamilyConfGetByLID(int lid, _tag_iscsi_family_ *family)
{
    NOTE_CALL(lid);
    const LUN *known = byID(lid);
    if (!known)
        return NORV_ERR_NO_SUCH_FAMILY;
    family->lid = lid;
    put(family->status, known->health);
    return 0;
}

int NORViSCSILunMappingsAdd(const int target_ids[], int lid, int count)
{
    NOTE_CALL(idList(target_ids, count), lid, count);
    for (int i = 0; i < count; ++i) {
        if (model().targets.count(target_ids[i]) == 0)
            return NORV_ERR_NO_SUCH_TARGET;
    }
    for (int i = 0; i < count; ++i) {
        if (findMapping(target_ids[i], lid) == model().mappings.end())
            model().mappings.push_back({target_ids[i], lid, freeIndex(target_ids[i]), nullptr});
    }
    return 0;
}

int NORViSCSILunMappingsRemove(const int target_ids[], int lid, int count)
{
    NOTE_CALL(idList(target_ids, count), lid, count);
    for (int i = 0; i < count; ++i) {
        if (findMapping(target_ids[i], lid) == model().mappings.end())
            return NORV_ERR_NO_SUCH_MAPPING;
    }
    for (int i = 0; i < count; ++i)
        model().mappings.erase(findMapping(target_ids[i], lid));
    return 0;
}

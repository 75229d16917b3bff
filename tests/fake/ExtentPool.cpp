// Map files: found by their path, so that a caller with a wrong path finds none.
#include "platform/error.h"
#include "platform/extent_pool.h"
#include "tests/fake/Script.h"

using namespace fake;

namespace {

MapFile *byPath(const char *path)
{
    LUN *lun = firstOf(model().luns, [&](const auto &record) { return mapFilePath(record) == path; });
    return lun ? &lun->map_file : nullptr;
}

int countOf(const char *name, const char *path, uint64_t MapFile::*count, uint64_t *out)
{
    const MapFile *file = byPath(path);
    if (auto failure = calledOn(file, name, path))
        return *failure;
    *out = static_cast<uint64_t>(answerOf(name, static_cast<long>(file->*count)));
    return 0;
}

} // namespace

std::string fake::mapFilePath(const _tag_iscsi_lun_ &lun)
{
    const bool is_extent_pool = (lun.type & 15) == 15;
    const bool has_long_number = (lun.type & 71) == 71;
    return textOf(lun.location) + (lun.options & 1 ? "/@EP_trash" : "/@iSCSITrg") + "/iSCSI_" +
           std::to_string(lun.lid) + (is_extent_pool ? "_Extent_" : "_") + textOf(lun.name) +
           (has_long_number ? "_00000" : "_000");
}

std::string fake::dataPath(const _tag_iscsi_snapshot_ &snapshot)
{
    return textOf(snapshot.root_path) + (snapshot.flags & NORV_SNAPSHOT_TRASH ? "/@EP_trash" : "/@Snapshot") +
           "/SNAPSHOT_L" + std::to_string(snapshot.lid) + "_S" + std::to_string(snapshot.snap_id) + "_" +
           textOf(snapshot.name);
}

int NORVExtentPoolMapFileMappedSizeGet(const char *path, const char *location, uint64_t *size)
{
    const MapFile *file = byPath(path);
    NOTE_CALL_ON(file, path, location);
    *size = file->mapped_size;
    return 0;
}

int NORVExtentPoolMapFileBaseVersionGet(const char *path, char *version)
{
    const MapFile *file = byPath(path);
    NOTE_CALL_ON(file, path);
    snprintf(version, 37, "%s", file->base_version.c_str());
    return 0;
}

int NORVExtentPoolMapFileVersionInfoGet(const char *path, _tag_map_file_version_ *info)
{
    const MapFile *file = byPath(path);
    NOTE_CALL_ON(file, path);
    put(info->base_version, file->base_version);
    put(info->current_version, file->current_version);
    return 0;
}

int NORVExtentPoolMapFileTotalCountGet(const char *path, uint64_t *count)
{
    return countOf(__func__, path, &MapFile::total_count, count);
}

int NORVExtentPoolMapFileSyncedCountGet(const char *path, uint64_t *count)
{
    return countOf(__func__, path, &MapFile::synced_count, count);
}

int NORViSCSIChildLunSyncProgressGet(const char *path, uint64_t *done, uint64_t *total)
{
    NOTE_CALL(path);
    if (auto *snapshot = firstOf(model().snapshots, [&](const auto &record) { return dataPath(record) == path; })) {
        *done = snapshot->copied;
        *total = snapshot->to_copy;
        return 0;
    }
    const MapFile *file = byPath(path);
    if (!file)
        return NORV_ERR_FILE_NOT_FOUND;
    *done = file->copied;
    *total = file->to_copy;
    return 0;
}

#include "platform/extent_pool.h"

#include "host/core/LastError.h"
#include "host/storage/MapFile.h"
#include "host/storage/Versions.h"
#include "platform/error.h"

#include <cerrno>
#include <cstring>
#include <sys/stat.h>

using namespace norvhost;

namespace {

int missingArgument(const char *function)
{
    return fail(NORV_ERR_NULL_POINTER, "%s: an argument is missing", function);
}

void copyVersion(char *field, const std::string &version)
{
    memcpy(field, version.c_str(), version.size() + 1);
}

} // namespace

int NORVExtentPoolMapFileMappedSizeGet(const char *path, const char *location, uint64_t *size)
{
    if (!path || !location || !size)
        return missingArgument(__func__);
    if (strncmp(path, location, strlen(location)) != 0)
        return fail(NORV_ERR_MAPPED_SIZE, "%s does not lie on the volume %s", path, location);
    struct stat status;
    if (lstat(path, &status) != 0)
        return failErrno(errno == ENOENT ? NORV_ERR_FILE_NOT_FOUND : NORV_ERR_MAPPED_SIZE, errno, "cannot look at %s",
                         path);
    if (!S_ISREG(status.st_mode))
        return fail(NORV_ERR_BAD_MAP_FILE, "%s is no regular file", path);
    *size = static_cast<uint64_t>(status.st_blocks) * 512;
    return 0;
}

int NORVExtentPoolMapFileBaseVersionGet(const char *path, char *version)
{
    if (!path || !version)
        return missingArgument(__func__);
    Versions versions;
    if (int err = readVersions(path, versions))
        return err;
    copyVersion(version, versions.base);
    return 0;
}

int NORVExtentPoolMapFileVersionInfoGet(const char *path, _tag_map_file_version_ *info)
{
    if (!path || !info)
        return missingArgument(__func__);
    Versions versions;
    if (int err = readVersions(path, versions))
        return err;
    *info = _tag_map_file_version_();
    copyVersion(info->base_version, versions.base);
    copyVersion(info->current_version, versions.current);
    return 0;
}

int NORVExtentPoolMapFileTotalCountGet(const char *path, uint64_t *count)
{
    if (!path || !count)
        return missingArgument(__func__);
    TransferCount sending;
    if (int err = readTransferCount(path, Transfer::sending, sending))
        return err;
    *count = sending.total;
    return 0;
}

int NORVExtentPoolMapFileSyncedCountGet(const char *path, uint64_t *count)
{
    if (!path || !count)
        return missingArgument(__func__);
    TransferCount sending;
    if (int err = readTransferCount(path, Transfer::sending, sending))
        return err;
    *count = sending.done;
    return 0;
}

int NORViSCSIChildLunSyncProgressGet(const char *path, uint64_t *done, uint64_t *total)
{
    if (!path || !done || !total)
        return missingArgument(__func__);
    struct stat status;
    const bool of_snapshot = lstat(path, &status) == 0 && S_ISDIR(status.st_mode);
    TransferCount copying;
    if (int err = readTransferCount(of_snapshot ? snapshotDataPath(path) : path, Transfer::copying, copying))
        return err;
    *done = copying.done;
    *total = copying.total;
    return 0;
}

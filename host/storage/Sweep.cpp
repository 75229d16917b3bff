#include "host/storage/Sweep.h"

#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/Restore.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Transfers.h"
#include "host/storage/Volumes.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdio>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <sys/stat.h>

namespace norvhost {
namespace {

/// A map file or a snapshot folder.
struct Found {
    int lid;
    std::string path;
    bool is_snapshot;
};

int listFolder(const std::string &folder, std::vector<Found> &found)
{
    const std::unique_ptr<DIR, int (*)(DIR *)> opened(opendir(folder.c_str()), closedir);
    if (!opened)
        return errno == ENOENT ? 0 : failErrno(NORV_ERR_READ_FILE, errno, "cannot list %s", folder.c_str());
    int lid;
    while (const dirent *entry = readdir(opened.get())) {
        const bool is_snapshot = parseSnapshotFolderName(entry->d_name, lid);
        if (is_snapshot || parseMapFileName(entry->d_name, lid))
            found.push_back({lid, folder + "/" + entry->d_name, is_snapshot});
    }
    return 0;
}

int listVolumes(std::vector<Found> &found, std::vector<std::string> *skipped)
{
    std::vector<VolumeRow> volumes;
    if (int err = loadVolumes(volumes))
        return err;
    for (const VolumeRow &volume : volumes) {
        int err = checkMounted(volume);
        for (const char *folder : {data_folder, snapshot_folder, trash_folder})
            if (!err)
                err = listFolder(volume.path + "/" + folder, found);
        if (err && skipped)
            skipped->push_back(lastError());
    }
    return 0;
}

enum class Verdict {
    keep,
    remove,
    mend,
    foreign,
};

bool sameFile(const std::string &path, const struct stat &other)
{
    struct stat status;
    return lstat(path.c_str(), &status) == 0 && status.st_ino == other.st_ino && status.st_dev == other.st_dev;
}

bool isEmptyFolder(const std::string &path)
{
    std::error_code error;
    return std::filesystem::is_empty(path, error) && !error;
}

/// What becomes of a snapshot folder, and for one to be mended the path that its row says.
int judgeSnapshot(const Found &folder, const std::string &our_store, Verdict &verdict, std::string &named_path)
{
    std::vector<SnapshotRow> rows;
    if (int err = loadSnapshotsOfLun(folder.lid, rows))
        return err;
    verdict = Verdict::keep;
    for (const SnapshotRow &row : rows)
        if (snapshotFolder(row.record) == folder.path)
            return 0;

    verdict = Verdict::foreign;
    struct stat status;
    if (lstat(folder.path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode))
        return 0;
    // Made first and filled last, so that one without any file bears no mark yet.
    if (isEmptyFolder(folder.path)) {
        verdict = Verdict::remove;
        return 0;
    }
    const FileMark mark = readFileMark(snapshotDataPath(folder.path));
    if (mark.store != our_store || mark.snapshot.empty())
        return 0;
    SnapshotRow row;
    const int err = loadSnapshotByUuid(mark.snapshot, row);
    if (err && err != NORV_ERR_NO_SUCH_SNAPSHOT)
        return err;
    if (err) {
        verdict = Verdict::remove;
        return 0;
    }
    named_path = snapshotFolder(row.record);
    if (lstat(named_path.c_str(), &status) != 0 && errno == ENOENT && row.record.lid == folder.lid)
        verdict = Verdict::mend;
    return 0;
}

/// As judgeSnapshot(), for a map file and its LUN's row.
int judgeMapFile(const Found &file, const std::string &our_store, Verdict &verdict, std::string &named_path)
{
    LunRow row;
    int err = loadLunByLid(file.lid, row);
    if (err && err != NORV_ERR_NO_SUCH_LUN)
        return err;
    verdict = Verdict::keep;
    if (!err && dataPath(row.record) == file.path)
        return 0;

    const FileMark mark = readFileMark(file.path);
    verdict = Verdict::foreign;
    if (mark.store != our_store || mark.uuid.empty())
        return 0;
    err = loadLunByUuid(mark.uuid, row);
    if (err && err != NORV_ERR_NO_SUCH_LUN)
        return err;
    if (err || file.path == importPath(row.record)) {
        verdict = Verdict::remove;
        return 0;
    }
    named_path = dataPath(row.record);
    struct stat named;
    if (lstat(named_path.c_str(), &named) == 0) {
        if (sameFile(file.path, named))
            verdict = Verdict::remove;
    } else if (errno == ENOENT && row.record.lid == file.lid) {
        verdict = Verdict::mend;
    }
    return 0;
}

int sweepOne(const Found &found, const std::string &our_store, SweepResult &result)
{
    struct stat status;
    if (lstat(found.path.c_str(), &status) != 0 && errno == ENOENT)
        return 0; // who held the LUN when it was listed took it away
    Verdict verdict;
    std::string named_path;
    const auto judge = found.is_snapshot ? judgeSnapshot : judgeMapFile;
    if (int err = judge(found, our_store, verdict, named_path))
        return err;
    switch (verdict) {
    case Verdict::keep:
        return 0;
    case Verdict::foreign:
        result.foreign.push_back(found.path);
        return 0;
    case Verdict::remove:
        if (int err = found.is_snapshot ? removeSnapshotFolder(found.path) : removeDataFile(found.path))
            return err;
        result.removed.push_back(found.path);
        return 0;
    case Verdict::mend:
        if (renameat2(AT_FDCWD, found.path.c_str(), AT_FDCWD, named_path.c_str(), RENAME_NOREPLACE) != 0)
            return failErrno(NORV_ERR_RENAME_FILE, errno, "cannot rename %s to %s", found.path.c_str(),
                             named_path.c_str());
        result.mended.push_back(named_path);
        return 0;
    }
    return 0;
}

} // namespace

int sweepVolumes(SweepResult &result)
{
    result = SweepResult();
    std::string our_store;
    if (int err = storeIdentity(our_store))
        return err;
    std::vector<Found> all;
    if (int err = listVolumes(all, &result.failed))
        return err;
    for (const Found &found : all) {
        LunLock lock;
        const int err = lock.take(found.lid, NORV_LUN_PROCESSING);
        if (err == NORV_ERR_LUN_LOCKED)
            continue; // the action that holds it knows what it does
        if (err)
            return err;
        if (sweepOne(found, our_store, result) != 0)
            result.failed.push_back(lastError());
    }
    if (sweepTransfers() != 0)
        result.failed.push_back(lastError());
    return mendRestores();
}

int sweepLun(int lid)
{
    std::string our_store;
    if (int err = storeIdentity(our_store))
        return err;
    std::vector<Found> all;
    if (int err = listVolumes(all, nullptr))
        return err;
    SweepResult result;
    for (const Found &found : all)
        if (found.lid == lid)
            if (int err = sweepOne(found, our_store, result))
                return err;
    return 0;
}

} // namespace norvhost

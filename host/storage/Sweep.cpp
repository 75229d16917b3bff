#include "host/storage/Sweep.h"

#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/Volumes.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdio>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>

namespace norvhost {
namespace {

struct MapFile {
    int lid;
    std::string path;
};

int listFolder(const std::string &folder, std::vector<MapFile> &files)
{
    const std::unique_ptr<DIR, int (*)(DIR *)> opened(opendir(folder.c_str()), closedir);
    if (!opened)
        return errno == ENOENT ? 0 : failErrno(NORV_ERR_READ_FILE, errno, "cannot list %s", folder.c_str());
    int lid;
    while (const dirent *entry = readdir(opened.get()))
        if (parseMapFileName(entry->d_name, lid))
            files.push_back({lid, folder + "/" + entry->d_name});
    return 0;
}

int listMapFiles(std::vector<MapFile> &files, std::vector<std::string> *skipped)
{
    std::vector<VolumeRow> volumes;
    if (int err = loadVolumes(volumes))
        return err;
    for (const VolumeRow &volume : volumes) {
        int err = checkMounted(volume);
        for (const char *folder : {data_folder, trash_folder})
            if (!err)
                err = listFolder(volume.path + "/" + folder, files);
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

/// What becomes of a map file, and for one to be mended the path that its LUN's row says.
int judge(const MapFile &file, const std::string &our_store, Verdict &verdict, std::string &named_path)
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
    if (err) {
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

int sweepFile(const MapFile &file, const std::string &our_store, SweepResult &result)
{
    Verdict verdict;
    std::string named_path;
    if (int err = judge(file, our_store, verdict, named_path))
        return err;
    switch (verdict) {
    case Verdict::keep:
        return 0;
    case Verdict::foreign:
        result.foreign.push_back(file.path);
        return 0;
    case Verdict::remove:
        if (int err = removeDataFile(file.path))
            return err;
        result.removed.push_back(file.path);
        return 0;
    case Verdict::mend:
        if (renameat2(AT_FDCWD, file.path.c_str(), AT_FDCWD, named_path.c_str(), RENAME_NOREPLACE) != 0)
            return failErrno(NORV_ERR_RENAME_FILE, errno, "cannot rename %s to %s", file.path.c_str(),
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
    std::vector<MapFile> files;
    if (int err = listMapFiles(files, &result.failed))
        return err;
    for (const MapFile &file : files) {
        LunLock lock;
        const int err = lock.take(file.lid, NORV_LUN_PROCESSING);
        if (err == NORV_ERR_LUN_LOCKED)
            continue; // the action that holds it knows what it does
        if (err)
            return err;
        if (sweepFile(file, our_store, result) != 0)
            result.failed.push_back(lastError());
    }
    return 0;
}

int sweepLun(int lid)
{
    std::string our_store;
    if (int err = storeIdentity(our_store))
        return err;
    std::vector<MapFile> files;
    if (int err = listMapFiles(files, nullptr))
        return err;
    SweepResult result;
    for (const MapFile &file : files)
        if (file.lid == lid)
            if (int err = sweepFile(file, our_store, result))
                return err;
    return 0;
}

} // namespace norvhost

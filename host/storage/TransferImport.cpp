/// The platform's import of export folders into LUNs.
///
/// The LUN's new data is made in a file of its own, which takes the place of the old one when it is complete: whatever
/// ends an import on the way, the LUN has its old data.
#include "host/core/LastError.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/ExportFolder.h"
#include "host/storage/FileClone.h"
#include "host/storage/LunActions.h"
#include "host/storage/MapFile.h"
#include "host/storage/Transfers.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <syslog.h>
#include <unistd.h>

using namespace norvhost;

namespace {

int refuseMapped(int lid)
{
    int mappings;
    if (int err = countMappings(lid, mappings))
        return err;
    if (mappings > 0)
        return fail(NORV_ERR_LUN_MAPPED,
                    "the LUN is mapped to %d target(s), whose initiators would keep its old data: "
                    "unmap it first",
                    mappings);
    return 0;
}

/// An import: prepared in the caller's process, carried out in a worker.
struct LunImport {
    LunLock lock; ///< the first, so that it goes last
    LunRow row;
    std::string folder;
    ExportFacts facts;
    uint64_t data_bytes = 0;
    FileDescriptor source;
    TransferJob job;

    int prepare(const _tag_iscsi_lun_ *lun, const char *source_folder);
    void undo() { job.drop(); }
    void run();

private:
    int check();
    int fill(int fd);
    int replace();
    int makeAndReplace();
};

int LunImport::prepare(const _tag_iscsi_lun_ *lun, const char *source_folder)
{
    folder = source_folder;
    if (folder.empty() || folder[0] != '/')
        return fail(NORV_ERR_EXPORT_LOCATION, "'%s' is no absolute path", source_folder);
    if (int err = openExport(folder, facts, source))
        return err;
    if (int err = countData(source.get(), data_bytes))
        return err;
    if (int err = lockLun(lun, NORV_LUN_PROCESSING, lock, row))
        return err;
    if (int err = check())
        return err;
    if (int err = removeDataFile(importPath(row.record))) // of an import that was killed
        return err;
    const int err = job.begin({row.record.lid, 0}, folder, false, data_bytes);
    if (err) {
        const KeptError kept;
        undo();
    }
    return err;
}

int LunImport::check()
{
    if (isBlock(row.record.type))
        return fail(NORV_ERR_LUN_TYPE, "a block device is not imported into");
    if (isInTrash(row.record))
        return fail(NORV_ERR_LUN_NOT_LOADED, "the LUN lies in the trash");
    if (int err = refuseMapped(row.record.lid))
        return err;
    if (facts.size > row.record.size)
        return fail(NORV_ERR_LUN_SIZE, "the export has %llu bytes, the LUN %llu: grow it first",
                    static_cast<unsigned long long>(facts.size), static_cast<unsigned long long>(row.record.size));
    if (int err = checkData(row.record))
        return err;
    return requireWhole(row, lock);
}

int LunImport::fill(int fd)
{
    if (int err = sizeDataFile(fd, row.record, 0, row.record.size, lock))
        return err;
    // Shared blocks would take the place of those that are allocated.
    bool shared = false;
    if (!isFullyAllocated(row.record.type))
        if (int err = shareBlocks(source.get(), fd, shared))
            return err;
    if (shared)
        return 0;
    return copyData(source.get(), fd, [this](uint64_t done) {
        job.tell(done);
        lock.tell(static_cast<int>(done / (data_bytes / 100 + 1)));
        return lock.stopRequested() ? transferStopped() : 0;
    });
}

int LunImport::replace()
{
    const std::string path = dataPath(row.record);
    if (int err = job.finishing([this] { return refuseMapped(row.record.lid); }))
        return err;
    if (rename(importPath(row.record).c_str(), path.c_str()) != 0)
        return failErrno(NORV_ERR_RENAME_FILE, errno, "cannot replace %s", path.c_str());
    return flushFolder(mapFileFolder(row.record));
}

int LunImport::makeAndReplace()
{
    const auto make = [this](int fd) {
        const int err = writeFileMark(fd, row.record.uuid, "");
        return err ? err : fill(fd);
    };
    if (int err = makeFile(importPath(row.record), make))
        return err;
    const int err = replace();
    if (err)
        unlink(importPath(row.record).c_str());
    return err;
}

void LunImport::run()
{
    const int err = makeAndReplace();
    if (err)
        syslog(err == -ECANCELED ? LOG_INFO : LOG_ERR, "import of %s into the LUN '%s' ended: %s", folder.c_str(),
               row.record.name, lastError());
    job.end(err);
}

} // namespace

int NORViSCSILunImport(const _tag_iscsi_lun_ *lun, const char *source)
{
    if (!lun || !source)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record or no folder to import");
    LunImport work;
    if (int err = work.prepare(lun, source))
        return err;
    return startWorker(work);
}

int NORViSCSILunImportCancel(const _tag_iscsi_lun_ *lun)
{
    if (!lun)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    LunRow row;
    if (int err = loadLunByUuid(lun->uuid, row))
        return err;
    if (int err = cancelTransfer({row.record.lid, 0}))
        return err;
    return requestLunStop(row.record.lid);
}

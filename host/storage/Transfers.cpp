#include "host/storage/Transfers.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/state/Database.h"
#include "host/storage/ExportFolder.h"
#include "platform/error.h"

#include <cerrno>
#include <ctime>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>
#include <syslog.h>
#include <vector>

namespace norvhost {
namespace {

enum TransferState {
    running = 0,
    to_stop = 1,
    finishing_state = 2,
};

/// How long the outcome of a transfer can be read. Whoever waits for its end looks when the action's lock is free.
constexpr time_t outcome_seconds = 60;

struct TransferRow {
    TransferId id;
    std::string folder;
    bool made_folder = false;
};

std::string lockName(const TransferId &id)
{
    const std::string lun = std::to_string(id.lid);
    return id.isExport() ? "export-" + lun + "-" + std::to_string(id.snap_id) : "import-" + lun;
}

std::string progressPath(const TransferId &id)
{
    return progressFolder() + "/" + progressFileName(id);
}

int loadTransfers(std::vector<TransferRow> &rows)
{
    Query query("SELECT lid, snap_id, folder, made_folder FROM transfers");
    while (query.next())
        rows.push_back({{query.integer(0), query.integer(1)}, std::string(query.text(2)), query.integer(3) != 0});
    return query.error();
}

int removeRow(const TransferId &id)
{
    Query query("DELETE FROM transfers WHERE lid = ?1 AND snap_id = ?2");
    return query.bind(id.lid).bind(id.snap_id).run();
}

/// Moves the row on from state `running`; `moved` is false when it is not there or in another state.
int leaveRunning(const TransferId &id, TransferState state, bool &moved)
{
    Query query("UPDATE transfers SET state = ?3 WHERE lid = ?1 AND snap_id = ?2 AND state = ?4");
    const int err =
        query.bind(id.lid).bind(id.snap_id).bind(static_cast<int>(state)).bind(static_cast<int>(running)).run();
    moved = !err && changedRows() != 0;
    return err;
}

void removeProgressFile(const FileDescriptor &folder, const TransferId &id)
{
    if (folder)
        unlinkat(folder.get(), progressFileName(id).c_str(), 0);
}

/// Removes what the row's worker left, unless it works.
int sweepRow(const TransferRow &row, const FileDescriptor &progress_folder)
{
    NamedLock alive;
    if (int err = alive.tryTake(lockName(row.id)))
        return err;
    if (!alive.held())
        return 0;
    // It may have ended, and another one begun, since the rows were read.
    std::vector<TransferRow> rows;
    if (int err = loadTransfers(rows))
        return err;
    for (const TransferRow &now : rows) {
        if (now.id.lid != row.id.lid || now.id.snap_id != row.id.snap_id)
            continue;
        if (now.id.isExport() && removeHalfExport(now.folder, now.made_folder) != 0)
            syslog(LOG_WARNING, "an unfinished export stays: %s", lastError());
        removeProgressFile(progress_folder, now.id);
        return removeRow(now.id);
    }
    return 0;
}

bool endedLately(const FileDescriptor &folder, const char *name)
{
    struct stat status;
    if (fstatat(folder.get(), name, &status, AT_SYMLINK_NOFOLLOW) != 0)
        return false;
    const time_t now = time(nullptr);
    return status.st_mtime <= now && now - status.st_mtime < outcome_seconds;
}

/// Removes the progress files of transfers that ended a while ago.
void sweepOutcomes(FileDescriptor &folder)
{
    const std::unique_ptr<DIR, int (*)(DIR *)> listing(fdopendir(dup(folder.get())), closedir);
    TransferId id;
    while (const dirent *entry = listing ? readdir(listing.get()) : nullptr) {
        if (!parseProgressFileName(entry->d_name, id))
            continue;
        NamedLock alive; // before the look at the file: until it is removed no other transfer of that name ends
        if (alive.tryTake(lockName(id)) == 0 && alive.held() && !endedLately(folder, entry->d_name))
            removeProgressFile(folder, id);
    }
}

} // namespace

int transferStopped()
{
    return fail(-ECANCELED, "it was stopped");
}

int TransferJob::begin(const TransferId &transfer, const std::string &folder, bool made_folder, uint64_t total)
{
    // Only a sweep can hold it, for a moment: the transfer's action holds the LUN's or the snapshot's lock.
    if (int err = alive.take(lockName(transfer)))
        return err;
    if (int err = removeRow(transfer))
        return err;
    Query insert("INSERT INTO transfers (lid, snap_id, folder, made_folder) VALUES (?1, ?2, ?3, ?4)");
    const int err = insert.bind(transfer.lid).bind(transfer.snap_id).bind(folder).bind(made_folder).run();
    if (insert.violates("transfers.folder"))
        return fail(NORV_ERR_FILE_EXISTS, "another export writes into %s", folder.c_str());
    if (err)
        return err;
    id = transfer;
    return progress.begin(id, total);
}

int TransferJob::finishing(const std::function<int()> &check)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    bool moved;
    if (int err = leaveRunning(id, finishing_state, moved))
        return err;
    if (!moved)
        return transferStopped();
    if (int err = check())
        return err;
    return transaction.commit();
}

void TransferJob::end(int code)
{
    const int interrupt = id.isExport() ? NORV_ERR_EXPORT_INTERRUPT : NORV_ERR_IMPORT_INTERRUPT;
    progress.finish(code == -ECANCELED ? interrupt : code);
    forgetRow();
}

void TransferJob::drop()
{
    if (!id.lid)
        return;
    progress.remove();
    forgetRow();
}

void TransferJob::forgetRow()
{
    if (removeRow(id) != 0)
        syslog(LOG_WARNING, "left to the next sweep: %s", lastError());
}

int cancelTransfer(const TransferId &id)
{
    if (int err = sweepTransfers())
        return err;
    bool moved;
    if (int err = leaveRunning(id, to_stop, moved))
        return err;
    if (moved)
        return 0;
    return id.isExport() ? fail(NORV_ERR_NOT_EXPORTING, "the snapshot is not being exported")
                         : fail(NORV_ERR_NOT_IMPORTING, "nothing is being imported into the LUN");
}

bool importHasProgressFile(int lid)
{
    return access(progressPath({lid, 0}).c_str(), F_OK) == 0;
}

void forgetTransfer(const TransferId &id)
{
    unlink(progressPath(id).c_str());
}

int sweepTransfers()
{
    std::vector<TransferRow> rows;
    if (int err = loadTransfers(rows))
        return err;
    FileDescriptor progress_folder;
    const int err = openProgressFolder(progress_folder);
    for (const TransferRow &row : rows)
        if (int failed = sweepRow(row, progress_folder))
            return failed;
    if (progress_folder)
        sweepOutcomes(progress_folder);
    return err;
}

} // namespace norvhost

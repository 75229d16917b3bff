/// Exports and imports under way: rows of the state store, by which one is stopped, and found again when its worker
/// was killed.
#pragma once

#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/state/Database.h"
#include "host/storage/TransferProgress.h"
#include "platform/core.h"
#include "platform/error.h"

#include <functional>
#include <string>
#include <unistd.h>
#include <utility>

namespace norvhost {

/// What a stopped transfer ends with.
int transferStopped();

/// One transfer, from its beginning in the caller's process to its end in the worker's.
class TransferJob {
public:
    /// Stores the row and shows the progress file. `folder` is the export's, `made_folder` whether it goes with it.
    /// NORV_ERR_FILE_EXISTS while another export writes into the folder.
    int begin(const TransferId &transfer, const std::string &folder, bool made_folder, uint64_t total);

    void tell(uint64_t done) { progress.tell(done); }

    /// From here on it cannot be stopped: transferStopped() when somebody was faster. `check` runs in the same
    /// transaction.
    int finishing(const std::function<int()> &check);

    /// Ends it with this code. Its progress file stays for a while and tells how it ended: a reader, who opens it once
    /// for each value, would otherwise find it gone between two of them.
    void end(int code);

    /// Forgets one that did not come to run.
    void drop();

private:
    void forgetRow();

    TransferId id;   ///< empty until it has a row
    NamedLock alive; ///< held as long as somebody works on it
    TransferProgress progress;
};

/// Tells a running transfer to stop. NORV_ERR_NOT_EXPORTING or NORV_ERR_NOT_IMPORTING when there is none, or when it is
/// too late; else its action is still to be told, by the lock that it holds.
int cancelTransfer(const TransferId &id);

/// Removes what killed workers left: the files of half exports, rows and progress files; and progress files that tell
/// of an end a while ago.
int sweepTransfers();

/// Whether an import into the LUN left its progress file: it runs, has ended, or was killed.
bool importHasProgressFile(int lid);

/// Removes the outcome of a transfer whose LUN or snapshot goes: the next one with its number has none.
void forgetTransfer(const TransferId &id);

/// Forks a worker that runs `work` and lets go of all that it holds, of its lock last. Returns at once; when there is
/// no worker, NORV_ERR_FORK and the work undone.
template <class Work>
int startWorker(Work &work)
{
    const int child = NLIBCProcForkChildNoWait();
    if (child == 0) {
        {
            Work mine(std::move(work));
            mine.run();
            closeDatabase();
        }
        _exit(0);
    }
    if (child < 0) {
        const KeptError kept;
        work.undo();
        return NORV_ERR_FORK;
    }
    work.lock.leaveToChild();
    return 0;
}

} // namespace norvhost

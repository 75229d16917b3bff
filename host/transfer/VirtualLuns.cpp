/// The platform's virtual LUNs: a LUN at one point in time, sent to a sink by a worker that outlives the caller.
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/core/Paths.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/FileClone.h"
#include "host/storage/LunActions.h"
#include "host/storage/MapFile.h"
#include "host/storage/Transfers.h"
#include "host/target/Wait.h"
#include "host/transfer/PeerSink.h"
#include "host/transfer/VirtualLunStore.h"
#include "platform/error.h"
#include "platform/virtual_lun.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <poll.h>
#include <syslog.h>
#include <unistd.h>

using namespace norvhost;

namespace {

using namespace std::chrono_literals;

constexpr int kind_send = 1;

/// Counted when the sink has become an ordinary LUN, so that the counters are never equal before, and never 0.
constexpr uint64_t last_step = 4096;

/// A sender notices within a tenth of a second that it is to stop; what it may hang in after that moves no data.
constexpr auto stop_limit = 5s;

/// How long the peer's web server is tried when everything was sent; shorter than a sink stays open without a session.
constexpr auto complete_limit = 150s; // more than two requests that nobody answers

std::string lockName(const std::string &uuid)
{
    return "vlun-" + uuid;
}

/// Where a sender tells how far it is: in the run folder, because the state store flushes each change to the disk.
std::string countersPath(const std::string &uuid)
{
    return runFolder() + "/vlun-" + uuid;
}

struct Counters {
    uint64_t moved = 0;
    uint64_t total = 0;
};

void tellCounters(const FileDescriptor &file, const Counters &counters)
{
    // Display only: a transfer does not fail because its progress cannot be told.
    (void)!pwrite(file.get(), &counters, sizeof counters, 0);
}

Counters readCounters(const std::string &uuid)
{
    Counters counters;
    const FileDescriptor file(open(countersPath(uuid).c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    return pread(file.get(), &counters, sizeof counters, 0) == sizeof counters ? counters : Counters();
}

/// The errno value that says best what a code of ours or of a peer means.
int stateOf(int code)
{
    if (code < 0)
        return -code;
    switch (code) {
    case 0:
        return 0;
    case NORV_ERR_OUT_OF_SPACE:
        return ENOSPC;
    case NORV_ERR_OUT_OF_MEMORY:
        return ENOMEM;
    case NORV_ERR_NO_PERMISSION:
        return EACCES;
    case NORV_ERR_READ_FILE:
        return EIO;
    default:
        return EREMOTEIO;
    }
}

/// The LUN's data of now, in a file without a name beside it.
int cloneSource(int lid, LunRow &lun, FileDescriptor &clone)
{
    LunLock lock;
    if (int err = loadLunByLid(lid, lun))
        return err;
    if (isBlock(lun.record.type))
        return fail(NORV_ERR_LUN_TYPE, "the LUN '%s' is a block device, which has no clone at one point in time",
                    lun.record.name);
    const _tag_iscsi_lun_ record = lun.record;
    if (int err = lockLun(&record, NORV_LUN_BE_CLONING, lock, lun))
        return err;
    if (int err = requireWhole(lun, lock))
        return err;
    const std::string path = dataPath(lun.record);
    const FileDescriptor source(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    if (!source)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the LUN's file %s", path.c_str());
    clone.reset(open(parentOf(path).c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
    if (!clone)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot make a file beside %s", path.c_str());
    return cloneLunData(lun, source.get(), clone.get(), [&](int percent) { return lock.tell(percent), 0; });
}

/// After a transfer that did not come to its end.
void closeSinkOf(const VirtualLunRow &row)
{
    if (row.sink_iqn.empty())
        return;
    const int err = closePeerSink(row.node, row.sink, row.sink_iqn, false);
    if (err && err != NORV_ERR_NO_SUCH_TARGET)
        syslog(LOG_WARNING, "the sink %s stays open for a while: %s", row.sink.c_str(), lastError());
    forgetSink(row.uuid, row.sink_iqn);
}

/// One transfer, from its beginning in the caller's process to its end in the worker's.
struct SenderJob {
    NamedLock lock; ///< held as long as somebody works on it
    VirtualLunRow row;
    PeerSink sink;
    FileDescriptor clone, counters;
    uint64_t size = 0; ///< of the LUN

    int prepare(const char *portal, const char *node_uuid, const char *sink_uuid);
    void run();
    void undo();

private:
    int send(uint64_t &moved);
    int goOn(uint64_t moved) const;
    int complete(uint64_t moved) const;
    bool sinkIsFull() const;
};

int SenderJob::prepare(const char *portal, const char *node_uuid, const char *sink_uuid)
{
    int lock_err = 0;
    // Who has told its end lets go of the lock soon.
    waitFor(row.ended ? stop_limit : 0s, [&] { return (lock_err = lock.tryTake(lockName(row.uuid))) || lock.held(); });
    if (lock_err)
        return lock_err;
    if (!lock.held())
        return fail(NORV_ERR_LUN_LOCKED, "the virtual LUN is sending already");
    LunRow lun;
    uint64_t data = 0;
    if (int err = cloneSource(row.lid, lun, clone))
        return err;
    size = lun.record.size;
    if (int err = countData(clone.get(), data))
        return err;
    counters.reset(open(countersPath(row.uuid).c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!counters)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot make %s", countersPath(row.uuid).c_str());
    if (int err = openPeerSink(node_uuid, sink_uuid, portal, sink))
        return err;
    row.node = node_uuid;
    row.sink = sink_uuid;
    row.portal = sink.unit.portal;
    row.sink_iqn = sink.sink.iqn;
    row.total = data + last_step;
    tellCounters(counters, {0, row.total});
    const int err = sink.sink.size < size
                        ? fail(NORV_ERR_LUN_SIZE, "the LUN has %llu bytes, the sink %llu only",
                               static_cast<unsigned long long>(size), static_cast<unsigned long long>(sink.sink.size))
                        : bindVirtualLun(row);
    if (err) {
        const KeptError kept;
        closeSinkOf(row);
    }
    return err;
}

/// There is no worker.
void SenderJob::undo()
{
    endVirtualLun(row.uuid, EAGAIN, 0, row.total);
    closeSinkOf(row);
}

void SenderJob::run()
{
    uint64_t moved = 0;
    int code = send(moved);
    if (code == 0)
        code = complete(moved);
    if (code == -EIO && sinkIsFull())
        code = fail(-ENOSPC, "the sink's volume is full");
    if (code != 0 && code != -ECANCELED)
        syslog(LOG_ERR, "the virtual LUN %s stopped sending: %s", row.uuid.c_str(), lastError());
    if (endVirtualLun(row.uuid, stateOf(code), code ? moved : row.total, row.total) != 0)
        syslog(LOG_ERR, "the virtual LUN %s: %s", row.uuid.c_str(), lastError());
    clone.reset();       // nothing keeps the volume busy once the lock is free
    lock.leaveToChild(); // whoever removes it closes the sink then, or we do
    if (code == 0)
        forgetSink(row.uuid, row.sink_iqn);
    else if (code != -ECANCELED)
        closeSinkOf(row);
}

int SenderJob::send(uint64_t &moved)
{
    Sending sending;
    sending.to = sink.unit;
    sending.from = clone.get();
    sending.next = fileRanges(clone.get(), 0, size);
    sending.to_zeros = sink.sink.blank;
    sending.progress = [&](uint64_t bytes) { return goOn(moved = bytes); };
    return sendRanges(sending);
}

int SenderJob::goOn(uint64_t moved) const
{
    tellCounters(counters, {std::min(moved, row.total - last_step), row.total});
    VirtualLunRow now;
    const int err = loadVirtualLun(row.uuid, now);
    if (err && err != NORV_ERR_VLUN_UUID)
        return err;
    return err || now.ended || now.sink_iqn != row.sink_iqn ? transferStopped() : 0;
}

/// All is there: a web server that happens to be down must not make it vain.
int SenderJob::complete(uint64_t moved) const
{
    const auto deadline = std::chrono::steady_clock::now() + complete_limit;
    for (;;) {
        const int err = closePeerSink(row.node, row.sink, row.sink_iqn, true);
        if (err != NORV_ERR_SEND_REQUEST || std::chrono::steady_clock::now() > deadline)
            return err;
        for (int i = 0; i < 10; ++i) { // one second, looking whether we are to stop
            poll(nullptr, 0, 100);
            if (int stop = goOn(moved))
                return stop;
        }
    }
}

/// Closes it, too.
bool SenderJob::sinkIsFull() const
{
    const KeptError kept;
    bool full = false;
    closePeerSink(row.node, row.sink, row.sink_iqn, false, &full);
    return full;
}

int loadNamed(const char *uuid, VirtualLunRow &row)
{
    return uuid ? loadVirtualLun(uuid, row) : fail(NORV_ERR_NULL_POINTER, "no UUID of a virtual LUN");
}

/// What the row and a sender that may run say.
int readState(const char *uuid, _tag_viscsi_virtual_lun_stats_ &stats)
{
    VirtualLunRow row;
    bool running = false;
    if (int err = loadNamed(uuid, row))
        return err;
    if (!row.ended && !row.sink.empty()) {
        if (int err = namedLockHeld(lockName(row.uuid), running))
            return err;
        if (int err = running ? 0 : loadVirtualLun(uuid, row)) // it may have ended just now
            return err;
    }
    stats = {};
    if (row.sink.empty())
        return 0;
    const Counters counters = row.ended ? Counters{row.moved, row.total} : readCounters(row.uuid);
    stats.first = counters.moved;
    stats.second = row.total;
    stats.state = row.ended || running ? row.state : EPIPE; // its sender was killed
    return 0;
}

} // namespace

int NORViSCSIVirtualLunCreate(const char *src_lun_uuid, int mode, char *uuid, int)
{
    if (!src_lun_uuid || !uuid)
        return fail(NORV_ERR_NULL_POINTER, "no LUN, or no room for a UUID");
    if (mode != NORV_VLUN_MODE_SEND)
        return fail(NORV_ERR_BAD_PARAMETER, "a virtual LUN of the mode %d cannot be made", mode);
    LunRow lun;
    if (int err = loadLunByUuid(src_lun_uuid, lun))
        return err;
    VirtualLunRow row;
    row.uuid = newUuid();
    row.lid = lun.record.lid;
    row.kind = kind_send;
    if (int err = insertVirtualLun(row))
        return err;
    memcpy(uuid, row.uuid.c_str(), row.uuid.size() + 1);
    return 0;
}

int NORViSCSIVirtualLunBindSink(const char *uuid, const char *portal, const char *node_uuid, const char *dst_lun_uuid)
{
    if (!portal || !node_uuid || !dst_lun_uuid)
        return fail(NORV_ERR_NULL_POINTER, "no portal, no node or no sink LUN");
    SenderJob job;
    if (int err = loadNamed(uuid, job.row))
        return err;
    if (!isUuid(dst_lun_uuid))
        return fail(NORV_ERR_LUN_UUID, "the sink LUN's UUID is none");
    if (int err = job.prepare(portal, node_uuid, dst_lun_uuid))
        return err;
    return startWorker(job);
}

int NORViSCSIVirtualLunStatsGet(const char *uuid, _tag_viscsi_virtual_lun_stats_ *stats, int)
{
    if (!stats)
        return fail(NORV_ERR_NULL_POINTER, "no statistics record");
    return readState(uuid, *stats);
}

int NORViSCSIVirtualLunRemove(const char *uuid)
{
    VirtualLunRow row;
    _tag_viscsi_virtual_lun_stats_ stats;
    if (int err = readState(uuid, stats))
        return err;
    if (int err = loadNamed(uuid, row))
        return err;
    const int state = stats.state ? stats.state : ECANCELED;
    if (int err = endVirtualLun(row.uuid, state, stats.first, stats.second))
        return err;
    NamedLock lock;
    int err = 0;
    waitFor(stop_limit, [&] { return (err = lock.tryTake(lockName(row.uuid))) || lock.held(); });
    if (err)
        return err;
    if (int failed = loadVirtualLun(row.uuid, row))
        return failed;
    closeSinkOf(row);
    unlink(countersPath(row.uuid).c_str());
    return deleteVirtualLun(row.uuid);
}

int NORViSCSIVirtualLunFillByUUID(const char *uuid, _tag_viscsi_virtual_lun_ *vlun, int)
{
    VirtualLunRow row;
    if (!vlun)
        return fail(NORV_ERR_NULL_POINTER, "no virtual-LUN record");
    if (int err = loadNamed(uuid, row))
        return err;
    vlun->src_lid = row.lid;
    vlun->kind = row.kind;
    return 0;
}

#include "host/replication/Sending.h"

#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/peer/Address.h"
#include "host/peer/NodeApi.h"
#include "host/replication/Difference.h"
#include "host/state/Fields.h"
#include "host/storage/LunStore.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "host/target/Sinks.h"
#include "host/target/Stunnel.h"
#include "host/transfer/PeerSink.h"
#include "host/transfer/Tunnel.h"
#include "iscsihost/node.h"
#include "iscsihost/replication.h"
#include "platform/core.h"
#include "platform/dr_node.h"
#include "platform/error.h"
#include "platform/event_log.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <future>
#include <json/value.h>
#include <memory>
#include <syslog.h>
#include <thread>
#include <unistd.h>
#include <utility>

namespace norvhost {
namespace {

using iscsihost::PairedNode;
using Clock = std::chrono::steady_clock;

constexpr int RUNNING = -EINPROGRESS; // stored while a sender works: with its lock free it was killed
constexpr int KILLED = -EPIPE;
constexpr int STOPPED = -ENODEV;
constexpr uint64_t UNIT = 512; // what is said to be sent where nothing differs
constexpr int FINAL = -EPROTO; // trying again is of no use, and nobody does
constexpr unsigned EVENT_DESTINATION = 0x13d0000d;

/// How often the peer is told how far it has been flushed, so that it needs not be sent again.
constexpr auto NOTE_INTERVAL = std::chrono::seconds(5);

std::string lockName(const char *task_uuid)
{
    return std::string("sending-") + task_uuid;
}

std::string textOf(const char *text)
{
    return text ? text : "";
}

/// How data is to get to the peer, as far as the caller says.
struct Route {
    std::string host; ///< empty: the one that the peer gives
    uint16_t port = 0;
    bool encrypted = false; ///< the port is one that TLS is spoken on
};

/// The sink that the peer has opened. Unless the sending was completed, it is given up when the object ends.
class OpenSink {
public:
    OpenSink() = default;
    OpenSink(const OpenSink &) = delete;
    ~OpenSink()
    {
        const KeptError kept;
        giveUp();
    }

    int enter(const PairedNode &peer, const TaskRow &task, const Json::Value &opened, const std::string &rod_key,
              const Route &route)
    {
        if (int err = enterPeerSink(peer, rod_key, task.record.dst_lun_uuid, opened, sink))
            return err;
        is_open = true;
        return follow(route, rod_key);
    }

    int giveUp(bool *volume_full = nullptr)
    {
        if (!is_open)
            return 0;
        is_open = false;
        return closePeerSink(sink.node, sink.lun, sink.sink.iqn, false, volume_full);
    }

    void completed() { is_open = false; }

    const IscsiUnit &unit() const { return sink.unit; }
    /// After a failure to send there.
    int explain(int failure) const { return tunnel.explain(failure); }

private:
    int follow(const Route &route, const std::string &rod_key)
    {
        std::string host;
        uint16_t port = 0;
        if (!parseAuthority(sink.unit.portal, host, port))
            return fail(NORV_ERR_BAD_RESPONSE, "the peer gives no data address");
        if (!route.host.empty())
            host = route.host;
        if (route.encrypted && sink.sink.tls_port == 0)
            return fail(NORV_ERR_BAD_PARAMETER,
                        "encrypted: the peer takes no encrypted sendings: 'iscsi-host status' there says why");
        if (route.encrypted)
            port = static_cast<uint16_t>(sink.sink.tls_port);
        if (route.port != 0)
            port = route.port;
        sink.unit.portal = authority(host, port);
        if (!route.encrypted)
            return 0;
        if (int err = tunnel.open(host, port, rod_key))
            return err;
        sink.unit.portal = tunnel.portal();
        return 0;
    }

    PeerSink sink;
    Tunnel tunnel;
    bool is_open = false;
};

/// Whether the peer has no task any more that takes it.
bool isFinal(int err)
{
    return err == NORV_ERR_NOT_A_DESTINATION_TASK || err == NORV_ERR_NO_SUCH_TASK;
}

int codeToStore(int err)
{
    return err == -ENOSPC ? NORV_ERR_OUT_OF_SPACE : isFinal(err) ? FINAL : err;
}

/// What became of telling the peer how far it has been flushed.
struct Noted {
    uint64_t place = 0;
    int err = 0;
    std::string reason;
};

/// After a sending that ended so.
bool mayBeTriedAgain(int error)
{
    return error && error != STOPPED && error != FINAL;
}

/// One sending: prepared in the caller's process, carried out in a worker.
class Sender {
public:
    /// The `next_try` heeds a stop that was asked for since the one before.
    int prepare(const _tag_iscsi_task_ &task, const char *snapshot_uuid, const char *base_version, bool next_try);
    void run();
    /// After a fork(), in the caller: the locks are the worker's.
    void leaveToChild()
    {
        snapshot_lock.leaveToChild();
        base_lock.leaveToChild();
    }

    Route route;
    std::string rod_key;

private:
    int send();
    int findCause(OpenSink &sink, int err);
    int adapt(const Json::Value &reception);
    int sendAll(const OpenSink &sink);
    int complete(OpenSink &sink);
    int note(uint64_t place) const;
    int noteOften(std::future<Noted> &noting);
    int tell(uint64_t moved);
    int checkStop() const;
    std::string arrivalPath() const { return std::string("/replications/") + task.record.uuid + "/arrival"; }

    NamedLock lock;
    SnapshotLock snapshot_lock, base_lock;
    TaskRow task;
    LunRow lun;
    SnapshotRow snapshot, base;
    FileDescriptor file, base_file;
    PairedNode peer;
    std::vector<DataRange> ranges;
    uint64_t total = 0, moved_before = 0;
    uint64_t flushed = 0;  ///< what lies below it is flushed on the peer
    uint64_t offset = 0;   ///< ... and the peer was told so
    std::string sink_name; ///< of the peer's opening
    bool to_zeros = false;
    bool was_full = false; ///< the peer's volume, when it was tried last
    Clock::time_point told{}, noted{};
};

int findByVersion(int lid, const std::string &version, SnapshotRow &row)
{
    std::vector<SnapshotRow> rows;
    if (int err = loadSnapshotsOfLun(lid, rows))
        return err;
    const auto found =
        std::find_if(rows.begin(), rows.end(), [&](const SnapshotRow &one) { return one.record.version == version; });
    if (found == rows.end())
        return fail(NORV_ERR_BASE_SNAPSHOT, "the LUN has no snapshot of the version %s any more", version.c_str());
    row = *found;
    return 0;
}

int Sender::prepare(const _tag_iscsi_task_ &wanted, const char *snapshot_uuid, const char *base_version, bool next_try)
{
    if (int err = loadTask(fieldText(wanted.uuid), task))
        return err;
    if (!task.record.is_source)
        return fail(NORV_ERR_NOT_A_SOURCE_TASK, "the task %s is a destination here", task.record.uuid);
    if (int err = lock.tryTake(lockName(task.record.uuid)))
        return err;
    if (!lock.held())
        return fail(NORV_ERR_TASK_LOCKED, "the task %s is sending a snapshot already", task.record.uuid);
    if (int err = loadLunByUuid(task.localLun(), lun))
        return err;
    if (int err = loadSnapshotByUuid(snapshot_uuid, snapshot))
        return err;
    if (snapshot.record.lid != lun.record.lid)
        return fail(NORV_ERR_NO_SUCH_SNAPSHOT, "the snapshot '%s' is not one of LUN '%s'", snapshot.record.name,
                    lun.record.name);
    if (int err = snapshot_lock.take(lun.record.lid, snapshot.record.snap_id, NORV_LUN_PROCESSING))
        return err;
    if (int err = openSnapshotData(snapshot.record, file))
        return err;
    if (base_version) {
        if (int err = findByVersion(lun.record.lid, base_version, base))
            return err;
        if (base.record.snap_id != snapshot.record.snap_id) {
            if (int err = base_lock.take(lun.record.lid, base.record.snap_id, NORV_LUN_PROCESSING))
                return err;
        }
        if (int err = openSnapshotData(base.record, base_file))
            return err;
    }
    if (int err = iscsihost::describePairedNode(task.remoteNode(), peer))
        return err;
    if (int err = next_try ? 0 : requestStop(task.record.uuid, false))
        return err;
    was_full = task.progress.error == NORV_ERR_OUT_OF_SPACE;
    task.progress.sent_size = task.progress.send_total_size = task.progress.progress_value = 0;
    task.progress.error = RUNNING;
    if (int err = updateReason(task.record.uuid, ""))
        return err;
    return updateProgress(task.progress);
}

void Sender::run()
{
    task.progress.error = codeToStore(send());
    if (task.progress.error && task.progress.error != STOPPED) {
        const std::string reason = lastError();
        syslog(LOG_ERR, "sending the snapshot '%s' failed: %s", snapshot.record.name, reason.c_str());
        updateReason(task.record.uuid, reason);
    }
    if (task.progress.error == NORV_ERR_OUT_OF_SPACE && !was_full)
        NORVLogSet1(9, 1, EVENT_DESTINATION, lun.record.name, "Out of volume space", nullptr, nullptr);
    if (!mayBeTriedAgain(task.progress.error))
        requestStop(task.record.uuid, false); // the next sending is another one
    updateProgress(task.progress);
}

/// The connection or its unit failed: the peer's web API knows why.
int Sender::findCause(OpenSink &sink, int err)
{
    const std::string reason = lastError();
    const int told = note(flushed); // and a peer that wants no more of it says so
    if (isFinal(told))
        return told;
    bool full = false;
    if (err == -EIO && sink.giveUp(&full) == 0 && full)
        return fail(NORV_ERR_OUT_OF_SPACE, "the peer's volume is full");
    return fail(err, "%s", reason.c_str());
}

int Sender::send()
{
    // Before the peer opens its sink, which nobody enters meanwhile: comparing contents takes its time.
    if (int err = findDifference(base_file ? base_file.get() : -1, file.get(), snapshot.record.total_size, ranges))
        return err;
    Json::Value body(Json::objectValue), reception;
    body["version"] = snapshot.record.version;
    body["base"] = base_file ? base.record.version : "";
    body["name"] = snapshot.record.name;
    if (int err = askNode(peer, "POST", arrivalPath(), body, reception))
        return err;
    if (!reception.isObject())
        return fail(NORV_ERR_BAD_RESPONSE, "%s does not say where its sink is", peer.host.c_str());
    OpenSink sink;
    if (int err = sink.enter(peer, task, reception["sink"], rod_key, route))
        return err;
    sink_name = sink.unit().target;
    if (int err = adapt(reception))
        return err;
    if (int err = sendAll(sink))
        return err < 0 && err != STOPPED ? findCause(sink, err) : err;
    if (int err = checkStop())
        return err;
    if (int err = complete(sink))
        return err;
    task.progress.sent_size = task.progress.send_total_size = total;
    task.progress.progress_value = 100;
    return 0;
}

/// What is to be sent depends on what the peer's LUN holds.
int Sender::adapt(const Json::Value &reception)
{
    const Json::Value &holding = reception["holding"];
    if (!holding.isString() || !reception["offset"].isUInt64())
        return fail(NORV_ERR_BAD_RESPONSE, "the peer does not say what its LUN holds");
    to_zeros = holding == "zeros";
    offset = flushed = reception["offset"].asUInt64();
    if (holding != (base_file ? "base" : "zeros")) {
        if (int err = describeWhole(file.get(), snapshot.record.total_size, ranges))
            return err;
    }
    total = std::max(dataBytes(ranges), UNIT);
    moved_before = dataBelow(ranges, offset);
    return tell(0);
}

int Sender::sendAll(const OpenSink &sink)
{
    const std::vector<DataRange> left = rangesFrom(ranges, offset);
    if (left.empty())
        return 0;
    auto next = left.begin();
    std::future<Noted> noting;
    noted = Clock::now();
    norvhost::Sending sending;
    sending.to = sink.unit();
    sending.from = file.get();
    sending.to_zeros = to_zeros;
    sending.next = [&](DataRange &range) {
        range = next == left.end() ? DataRange() : *next++;
        return 0;
    };
    sending.flushed = [&](uint64_t place) { flushed = place; };
    sending.progress = [&](uint64_t moved) {
        const int err = noteOften(noting);
        return err ? err : tell(moved);
    };
    if (int err = sendRanges(sending))
        return sink.explain(err);
    flushed = snapshot.record.total_size;
    return 0;
}

/// All has arrived: the peer makes it its own.
int Sender::complete(OpenSink &sink)
{
    Json::Value body(Json::objectValue), answer;
    body["version"] = snapshot.record.version;
    body["iqn"] = sink_name;
    body["total"] = Json::UInt64(total);
    if (int err = askNode(peer, "POST", arrivalPath() + "/end", body, answer)) {
        const KeptError kept;
        note(flushed); // the next try needs not send it again
        return err;
    }
    sink.completed();
    return 0;
}

/// What lies below the place is flushed on the peer.
int Sender::note(uint64_t place) const
{
    Json::Value body(Json::objectValue), answer;
    body["version"] = snapshot.record.version;
    body["iqn"] = sink_name;
    body["offset"] = Json::UInt64(place);
    body["moved"] = Json::UInt64(dataBelow(ranges, place));
    body["total"] = Json::UInt64(total);
    return askNode(peer, "PATCH", arrivalPath(), body, answer);
}

/// In a thread of its own: on a long way, or of a busy peer, an answer takes as long as megabytes of data.
int Sender::noteOften(std::future<Noted> &noting)
{
    if (noting.valid()) {
        if (noting.wait_for(std::chrono::seconds(0)) != std::future_status::ready)
            return 0;
        const Noted heard = noting.get();
        // A web server that is away for a moment is no reason to stop: the next note says it too.
        if (heard.err && heard.err != NORV_ERR_SEND_REQUEST)
            return fail(heard.err, "%s", heard.reason.c_str());
        offset = heard.err ? offset : heard.place;
    }
    if (flushed > offset && Clock::now() - noted > NOTE_INTERVAL) {
        noted = Clock::now();
        noting = std::async([this, place = flushed] {
            const int err = note(place);
            return Noted{place, err, lastError()};
        });
    }
    return 0;
}

int Sender::checkStop() const
{
    bool stop = false;
    if (int err = stopRequested(task.record.uuid, stop))
        return err;
    return stop ? fail(STOPPED, "the sending was stopped") : 0;
}

int Sender::tell(uint64_t moved)
{
    const auto now = Clock::now();
    if (now - told < std::chrono::milliseconds(500))
        return 0;
    told = now;
    if (int err = checkStop())
        return err;
    // Until the peer has made the state its own, one byte is left.
    task.progress.sent_size = std::min(moved_before + moved, total - 1);
    task.progress.send_total_size = total;
    task.progress.progress_value = task.progress.sent_size * 100 / total;
    return updateProgress(task.progress);
}

} // namespace

namespace {

/// Whether this process, or the one that it was split off from, has sent for the task before.
bool isNextTry(const std::string &task_uuid)
{
    static std::string begun;
    return std::exchange(begun, task_uuid) == task_uuid;
}

/// Stopped between two tries.
int endStopped(const char *task_uuid)
{
    TaskRow task;
    if (int err = loadTask(task_uuid, task))
        return err;
    if (int err = requestStop(task.record.uuid, false))
        return err;
    task.progress.error = STOPPED;
    return updateProgress(task.progress);
}

} // namespace

bool isSending(const char *task_uuid)
{
    bool held = false;
    return namedLockHeld(lockName(task_uuid), held) == 0 && held;
}

int stopSending(const TaskRow &task)
{
    if (!isSending(task.record.uuid))
        return 0;
    if (int err = requestStop(task.record.uuid, true))
        return err;
    const auto limit = Clock::now() + std::chrono::seconds(60); // it may be waiting for its peer
    while (isSending(task.record.uuid)) {
        if (Clock::now() > limit)
            return fail(NORV_ERR_TIMEOUT, "the sender of the task %s does not stop", task.record.uuid);
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    return 0;
}

int readProgress(const TaskRow &task, _tag_iscsi_task_progress_ &progress)
{
    // A sender stores its end before it lets go of its lock, and takes the lock before it stores its beginning.
    for (TaskRow row = task;;) {
        if (row.progress.error == RUNNING && !isSending(row.record.uuid)) {
            if (int err = loadTask(row.record.uuid, row))
                return err;
            if (row.progress.error == RUNNING && isSending(row.record.uuid))
                continue;
            if (row.progress.error == RUNNING)
                row.progress.error = KILLED;
        }
        progress = row.progress;
        if (progress.error == RUNNING)
            progress.error = 0;
        return 0;
    }
}

} // namespace norvhost

using namespace norvhost;

int iscsihost::sendingFailure(const std::string &task_uuid, std::string &reason)
{
    TaskRow task;
    _tag_iscsi_task_progress_ progress;
    if (int err = loadTask(task_uuid, task))
        return err;
    if (int err = readProgress(task, progress))
        return err;
    if (progress.error == KILLED)
        reason = "the sending process was killed";
    else
        return loadReason(task.record.uuid, reason);
    return 0;
}

int NORViSCSIReplicationTaskSendSnapshot(const _tag_iscsi_task_ *task, const char *address, const char *rod_key,
                                         const char *snapshot_uuid, const char *base_version, unsigned int port,
                                         bool full_sync, bool encrypted, bool /*last_try*/)
{
    if (!task || !snapshot_uuid || !rod_key)
        return fail(NORV_ERR_NULL_POINTER, "a task, a ROD key and a snapshot are needed");
    bool stop = false;
    const bool next_try = isNextTry(task->uuid);
    if (int err = next_try ? stopRequested(task->uuid, stop) : 0)
        return err;
    if (stop)
        return endStopped(task->uuid);
    Sender sender;
    sender.rod_key = rod_key;
    if (encrypted)
        if (int err = requireStunnel())
            return err;
    if (port > UINT16_MAX)
        return fail(NORV_ERR_TASK_ADDRESS, "port: is no port");
    const std::string host = textOf(address);
    if (!host.empty() && !isHost(host))
        return fail(NORV_ERR_TASK_ADDRESS, "address: is no host name and no address");
    sender.route = {host, static_cast<uint16_t>(port), encrypted};
    if (int err = sender.prepare(*task, snapshot_uuid, full_sync ? nullptr : base_version, next_try))
        return err;
    const int child = NLIBCProcForkChildNoWait();
    if (child < 0)
        return NORV_ERR_FORK;
    if (child > 0)
        return sender.leaveToChild(), 0;
    sender.run();
    _exit(0);
}

int NORViSCSIReplicationTaskStopSendingSnapshot(const _tag_iscsi_task_ *task)
{
    if (!task)
        return fail(NORV_ERR_NULL_POINTER, "no task record");
    TaskRow row;
    _tag_iscsi_task_progress_ progress;
    if (int err = loadTask(task->uuid, row))
        return err;
    if (int err = readProgress(row, progress))
        return err;
    if (!mayBeTriedAgain(progress.error) && !isSending(task->uuid))
        return fail(NORV_ERR_TASK_NOT_RUNNING, "the task %s is not sending", task->uuid);
    return requestStop(task->uuid, true);
}

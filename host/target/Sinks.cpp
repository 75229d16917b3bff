#include "host/target/Sinks.h"

#include "host/core/Crypto.h"
#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/FileClone.h"
#include "host/storage/LunActions.h"
#include "host/storage/MapFile.h"
#include "host/target/Change.h"
#include "host/target/Exports.h"
#include "host/target/Portals.h"
#include "host/target/Tgtd.h"
#include "host/target/TlsServer.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <cerrno>
#include <ctime>
#include <fcntl.h>
#include <sys/statvfs.h>
#include <syslog.h>
#include <unistd.h>

namespace norvhost {
namespace {

constexpr int first_sink_tid = 10000;
constexpr time_t abandoned_seconds = 60;

/// Whoever opened a sink comes within this time.
constexpr time_t arrival_seconds = 15;

/// Of a volume whose files cannot grow any more; a file system keeps a little for itself.
constexpr uint64_t full_volume_bytes = 1 << 20;

constexpr size_t secret_bytes = 24;
constexpr size_t rod_key_size = 256;

struct OpenSink {
    int lid = 0;
    std::string iqn;
    int64_t seen = 0;
};

int loadOpenSinks(std::vector<OpenSink> &sinks)
{
    std::vector<OpenSink> found;
    Query query("SELECT lid, iqn, seen FROM sinks ORDER BY lid");
    while (query.next())
        found.push_back({query.integer(0), std::string(query.text(1)), query.number(2)});
    if (query.error())
        return query.error();
    sinks = std::move(found);
    return 0;
}

int loadIqn(int lid, std::string &iqn)
{
    Query query("SELECT iqn FROM sinks WHERE lid = ?1");
    if (query.bind(lid).next()) {
        iqn = query.text(0);
        return 0;
    }
    return query.error() ? query.error() : fail(NORV_ERR_NO_SUCH_TARGET, "LUN %d is no open sink", lid);
}

std::string deriveSecret(const std::string &rod_key, const char *label, const std::string &uuid)
{
    return toHex(hmacSha256(rod_key, label + uuid).substr(0, secret_bytes));
}

std::string senderName(const std::string &uuid)
{
    return "iqn.2001-01.norv:sender-" + uuid;
}

/// Where peers reach the read-write daemon.
int sinkPortals(std::vector<std::string> &portals)
{
    std::vector<std::string> addresses;
    if (int err = portalAddresses(addresses))
        return err;
    for (const std::string &address : addresses) {
        const bool any = address == "0.0.0.0" || address == "::";
        portals.push_back(any ? ":" + std::to_string(read_write_port) : portalName(address, read_write_port));
    }
    return 0;
}

int checkSink(const LunRow &row)
{
    if (row.record.type != NORV_LUN_TYPE_SINK)
        return fail(NORV_ERR_LUN_TYPE, "the LUN '%s' is no sink: its kind is %d", row.record.name, row.record.type);
    if (!row.loaded || isInTrash(row.record))
        return fail(NORV_ERR_LUN_NOT_LOADED, "the LUN '%s' is not loaded", row.record.name);
    return checkData(row.record);
}

int storeOpening(int lid, const std::string &iqn)
{
    Query query("INSERT INTO sinks (lid, iqn, seen) VALUES (?1, ?2, ?3) "
                "ON CONFLICT (lid) DO UPDATE SET iqn = excluded.iqn, seen = excluded.seen");
    return query.bind(lid).bind(iqn).bind(time(nullptr)).run();
}

int removeOpening(int lid, const std::string &iqn)
{
    Query query("DELETE FROM sinks WHERE lid = ?1 AND iqn = ?2");
    if (int err = query.bind(lid).bind(iqn).run())
        return err;
    return changedRows() > 0 ? 0 : fail(NORV_ERR_NO_SUCH_TARGET, "the sink was closed or opened anew meanwhile");
}

int isDestination(std::string_view lun_uuid, bool &is)
{
    Query query("SELECT 1 FROM replication_tasks WHERE dst_lun = ?1 AND NOT is_source");
    is = query.bind(lun_uuid).next();
    return query.error();
}

/// A replication's destination stays a sink.
int makeOrdinary(int lid)
{
    Query query("UPDATE luns SET type = ?2 WHERE lid = ?1 AND type = ?3 AND NOT EXISTS "
                "(SELECT 1 FROM replication_tasks WHERE dst_lun = luns.uuid AND NOT is_source)");
    return query.bind(lid).bind(static_cast<int>(NORV_LUN_TYPE_ADV)).bind(static_cast<int>(NORV_LUN_TYPE_SINK)).run();
}

int openData(const _tag_iscsi_lun_ &lun, FileDescriptor &file)
{
    const std::string path = dataPath(lun);
    file.reset(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    return file ? 0 : failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the LUN's file %s", path.c_str());
}

int flushData(const _tag_iscsi_lun_ &lun)
{
    FileDescriptor file;
    if (int err = openData(lun, file))
        return err;
    return fsync(file.get()) == 0 ? 0 : failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush the LUN's file");
}

bool isVolumeFull(const _tag_iscsi_lun_ &lun)
{
    struct statvfs volume;
    return statvfs(lun.location, &volume) == 0 && uint64_t{volume.f_bavail} * volume.f_frsize < full_volume_bytes;
}

/// Closes a sink that its peer has left. One that was closed or opened anew meanwhile is no failure.
int abandon(const OpenSink &sink)
{
    syslog(LOG_WARNING, "LUN %d: the peer that was writing to it is gone", sink.lid);
    const auto change = [&](std::vector<int> &tids) {
        tids = {sinkTid(sink.lid)};
        return removeOpening(sink.lid, sink.iqn);
    };
    const int err = changeRunning(change);
    return err == NORV_ERR_NO_SUCH_TARGET ? 0 : err;
}

bool hasSession(const Tgtd &daemon, int tid)
{
    std::vector<TgtdConnection> connections;
    return daemon.showConnections(tid, connections) == 0 && !connections.empty();
}

} // namespace

SinkLogIn sinkLogIn(const std::string &rod_key, const std::string &lun_uuid)
{
    const std::string uuid = lowerCase(lun_uuid);
    SinkLogIn log_in;
    log_in.initiator = senderName(uuid);
    log_in.user = "sender-" + uuid;
    log_in.secret = deriveSecret(rod_key, "norv sink: sender ", uuid);
    log_in.mutual_user = "sink-" + uuid;
    log_in.mutual_secret = deriveSecret(rod_key, "norv sink: receiver ", uuid);
    return log_in;
}

int sinkTid(int lid)
{
    return first_sink_tid + lid;
}

bool isSinkTid(int tid)
{
    return tid > first_sink_tid && tid <= first_sink_tid + NORV_LUN_ID_MAX;
}

int loadSinkTarget(int tid, _tag_iscsi_target_ &target)
{
    LunRow row;
    std::string iqn;
    char rod_key[rod_key_size] = {};
    if (int err = loadIqn(tid - first_sink_tid, iqn))
        return err;
    if (int err = loadLunByLid(tid - first_sink_tid, row))
        return err;
    if (int err = NORVExtentPoolRODKeyGet(rod_key, sizeof rod_key))
        return err;
    const SinkLogIn log_in = sinkLogIn(rod_key, row.record.uuid);
    target = {};
    target.tid = tid;
    copyText(target.iqn, iqn);
    target.enabled = 1;
    target.max_sessions = 1; // a sender that vanished without a word is noticed
    target.auth_type = NORV_TARGET_AUTH_MUTUAL_CHAP;
    copyText(target.user, log_in.user);
    copyText(target.password, log_in.secret);
    copyText(target.mutual_user, log_in.mutual_user);
    copyText(target.mutual_password, log_in.mutual_secret);
    return 0;
}

int loadSinkTargetByIqn(const std::string &iqn, _tag_iscsi_target_ &target)
{
    int lid = 0;
    {
        Query query("SELECT lid FROM sinks WHERE iqn = ?1");
        if (query.bind(iqn).next())
            lid = query.integer(0);
        if (query.error())
            return query.error();
    }
    return loadSinkTarget(sinkTid(lid), target);
}

int loadSinkTargets(std::vector<_tag_iscsi_target_> &targets)
{
    std::vector<OpenSink> sinks;
    if (int err = loadOpenSinks(sinks))
        return err;
    for (const OpenSink &sink : sinks) {
        _tag_iscsi_target_ target;
        if (int err = loadSinkTarget(sinkTid(sink.lid), target))
            return err;
        targets.push_back(target);
    }
    return 0;
}

int loadSinkMasking(int tid, Masking &masking)
{
    LunRow row;
    if (int err = loadLunByLid(tid - first_sink_tid, row))
        return err;
    masking = Masking();
    masking.named[senderName(row.record.uuid)] = NORV_AUTHORITY_READ_WRITE;
    return 0;
}

int loadSinkLun(int tid, MappedLun &lun)
{
    LunRow row;
    if (int err = loadLunByLid(tid - first_sink_tid, row))
        return err;
    // Of a kind that is written, which a sink in other targets is not.
    lun = {row.record.lid,
           sink_lun_number,
           NORV_LUN_TYPE_ADV,
           row.record.uuid,
           row.record.size,
           dataPath(row.record),
           true,
           false};
    return 0;
}

int refuseOpenSink(int lid)
{
    std::vector<OpenSink> sinks;
    if (int err = loadOpenSinks(sinks))
        return err;
    for (const OpenSink &sink : sinks)
        if (sink.lid == lid) {
            if (hasSession(Tgtd(Access::read_write), sinkTid(lid)) || time(nullptr) - sink.seen < arrival_seconds)
                return fail(NORV_ERR_LUN_LOCKED, "a peer is writing to the LUN");
            return abandon(sink);
        }
    return 0;
}

int forgetOpenSinks()
{
    Query query("DELETE FROM sinks");
    return query.run();
}

int closeAbandonedSinks()
{
    std::vector<OpenSink> sinks;
    if (int err = loadOpenSinks(sinks))
        return err;
    const Tgtd daemon(Access::read_write);
    for (const OpenSink &sink : sinks) {
        const time_t now = time(nullptr);
        if (hasSession(daemon, sinkTid(sink.lid))) {
            Query query("UPDATE sinks SET seen = ?3 WHERE lid = ?1 AND iqn = ?2");
            if (int err = query.bind(sink.lid).bind(sink.iqn).bind(now).run())
                return err;
        } else if (now - sink.seen > abandoned_seconds || now < sink.seen) {
            if (int err = abandon(sink))
                return err;
        }
    }
    return 0;
}

int openSinkFor(const LunRow &lun, iscsihost::Sink &sink)
{
    LunLock lock;
    LunRow row;
    if (int err = lockLun(lun.record.lid, NORV_LUN_PROCESSING, lock, row))
        return err;
    if (int err = requireWhole(row, lock))
        return err;
    if (int err = checkSink(row))
        return err;
    iscsihost::Sink opened;
    if (int err = sinkPortals(opened.portals))
        return err;
    opened.iqn = "iqn.2001-01.norv:sink-" + newUuid();
    opened.lun = sink_lun_number;
    opened.tls_port = tlsProcess() > 0 ? tls_port : 0;
    opened.size = row.record.size;
    const int lid = row.record.lid;
    const int err = changeTargets([&](std::vector<int> &tids) {
        tids = {sinkTid(lid)};
        return storeOpening(lid, opened.iqn);
    });
    if (err)
        return err;
    // Asked now that nobody else writes any more.
    FileDescriptor file;
    if (int failed = openData(row.record, file))
        return failed;
    if (int failed = isBlank(file.get(), row.record.size, opened.blank))
        return failed;
    sink = opened;
    return 0;
}

int checkOpening(int lid, const std::string &iqn)
{
    std::string opening;
    if (int err = loadIqn(lid, opening))
        return err;
    return iqn == opening ? 0 : fail(NORV_ERR_NO_SUCH_TARGET, "the sink was opened anew meanwhile");
}

} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int openSink(const std::string &lun_uuid, Sink &sink)
{
    LunRow row;
    bool is_destination = false;
    if (int err = loadLunByUuid(lun_uuid, row))
        return err;
    if (int err = isDestination(row.record.uuid, is_destination))
        return err;
    if (is_destination)
        return fail(NORV_ERR_LUN_LOCKED, "the LUN '%s' is a replication's destination: nothing else writes to it",
                    row.record.name);
    return openSinkFor(row, sink);
}

int closeSink(const std::string &lun_uuid, const std::string &iqn, bool complete, bool *volume_full)
{
    LunRow row;
    if (int err = loadLunByUuid(lun_uuid, row))
        return err;
    const int lid = row.record.lid;
    std::string opening;
    if (int err = loadIqn(lid, opening)) {
        const bool was_completed = complete && err == NORV_ERR_NO_SUCH_TARGET && row.record.type == NORV_LUN_TYPE_ADV;
        return was_completed ? 0 : err; // whoever did not hear it asks again
    }
    if (!iqn.empty() && iqn != opening)
        return fail(NORV_ERR_NO_SUCH_TARGET, "the sink was opened anew meanwhile");
    if (complete)
        if (int err = flushData(row.record))
            return err;
    if (volume_full)
        *volume_full = isVolumeFull(row.record);
    return changeRunning([&](std::vector<int> &tids) {
        if (int err = removeOpening(lid, opening))
            return err;
        tids = {sinkTid(lid)};
        if (!complete)
            return 0;
        std::vector<Mapping> mappings;
        if (int err = loadMappingsOfLun(lid, mappings))
            return err;
        for (const Mapping &mapping : mappings)
            tids.push_back(mapping.tid);
        return makeOrdinary(lid);
    });
}

} // namespace iscsihost

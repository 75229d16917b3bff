#include "host/target/Reconcile.h"

#include "host/core/LastError.h"
#include "host/target/ExportLinks.h"
#include "host/target/Reopen.h"
#include "host/target/Sinks.h"
#include "host/target/TargetStore.h"
#include "host/target/Wait.h"
#include "platform/error.h"
#include "platform/iscsi_lun.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <set>
#include <syslog.h>
#include <unistd.h>

namespace norvhost {
namespace {

using namespace std::chrono_literals;

constexpr auto session_end_limit = 2s;
constexpr auto unit_end_limit = 5s;

/// When nobody sends commands any more: a busy disk takes its time to write what a flush asks for.
constexpr auto last_commands_limit = 30s;

/// What tgtd takes for our 0, the default; larger than its own 8 KiB, which costs a third of the write speed.
constexpr uint32_t default_segment = 262144;

constexpr const char *ping_interval_seconds = "10", *pings_unanswered = "3";

/// What a target is to be on one daemon.
struct Wanted {
    _tag_iscsi_target_ target = {};
    Masking masking;
    std::vector<MappedLun> luns;
};

template <class Container, class Value>
bool contains(const Container &container, const Value &value)
{
    return std::find(container.begin(), container.end(), value) != container.end();
}

/// Everything that is done to one daemon.
class Reconciler {
public:
    explicit Reconciler(const Tgtd &daemon) : daemon(daemon), permission(static_cast<int>(daemon.access())) {}

    int load();
    int reconcile(int tid);
    int removeUnusedUsers();
    std::set<int> shownTids() const;

private:
    /// `carried` is false when the daemon is not to have the target.
    int loadWanted(int tid, Wanted &wanted, bool &carried) const;

    int remove(const TgtdTarget &shown);
    int create(const Wanted &wanted);
    int adjust(const Wanted &wanted, const TgtdTarget &shown);

    int unbindInitiators(const Wanted &wanted, const TgtdTarget &shown);
    int bindInitiators(const Wanted &wanted, const TgtdTarget &shown);
    int endSessions(const Wanted &wanted);
    int closeAll(int tid, const std::vector<TgtdConnection> &connections) const;
    int adjustUsers(const Wanted &wanted, const TgtdTarget &shown, bool &ready);
    int ensureUser(const std::string &user, const std::string &secret);
    int adjustParameters(const Wanted &wanted);
    int adjustUnits(const Wanted &wanted, const TgtdTarget &shown);
    int adjustUnit(const Wanted &wanted, const MappedLun &lun, const TgtdUnit *shown);
    int createUnit(int tid, const MappedLun &lun);
    int removeUnit(int tid, uint64_t lun);

    const Tgtd &daemon;
    const int permission;
    std::vector<TgtdTarget> targets;
    std::vector<std::string> users;
};

bool letsIn(const Wanted &wanted, const std::string &initiator, int permission)
{
    return wanted.target.enabled && (wanted.masking.isOpen(permission) || wanted.masking.of(initiator) == permission);
}

/// A sink is written by its peer alone, through a target of its own.
bool isReadOnly(const MappedLun &lun, Access access)
{
    return lun.read_only || lun.type == NORV_LUN_TYPE_SINK || access == Access::read;
}

std::string scsiId(const MappedLun &lun)
{
    // tgtd makes the NAA identifier of 128 bits from the hexadecimal digits, so that a LUN has the same one
    // in every target, on both daemons and after every restart.
    std::string digits = lun.uuid;
    digits.erase(std::remove(digits.begin(), digits.end(), '-'), digits.end());
    return digits;
}

bool isThin(const MappedLun &lun)
{
    return lun.type != NORV_LUN_TYPE_BLOCK && lun.type != NORV_LUN_TYPE_FILE;
}

int Reconciler::load()
{
    int err = daemon.showTargets(targets);
    if (err == NORV_ERR_GET_CONFIG) {
        // An initiator put lines of its own into the answer: end all sessions, their texts end with them.
        syslog(LOG_WARNING, "%s: ending all of its sessions", lastError());
        for (int tid = 1; tid <= NORV_TARGET_ID_MAX; ++tid) {
            std::vector<TgtdConnection> connections;
            if (!daemon.showConnections(tid, connections))
                closeAll(tid, connections);
        }
        waitFor(session_end_limit, [&] { return (err = daemon.showTargets(targets)) != NORV_ERR_GET_CONFIG; });
    }
    return err ? err : daemon.showUsers(users);
}

std::set<int> Reconciler::shownTids() const
{
    std::set<int> tids;
    for (const TgtdTarget &target : targets)
        tids.insert(target.tid);
    return tids;
}

int Reconciler::loadWanted(int tid, Wanted &wanted, bool &carried) const
{
    carried = false;
    const bool sink = isSinkTid(tid);
    if (int err = sink ? loadSinkTarget(tid, wanted.target) : loadTarget(tid, wanted.target))
        return err == NORV_ERR_NO_SUCH_TARGET ? 0 : err;
    if (int err = sink ? loadSinkMasking(tid, wanted.masking) : loadMasking(tid, wanted.masking))
        return err;
    wanted.luns.resize(sink);
    if (int err = sink ? loadSinkLun(tid, wanted.luns.front()) : loadMappedLuns(tid, wanted.luns))
        return err;
    if (sink) {
        carried = daemon.access() == Access::read_write;
        return 0;
    }
    carried = daemon.access() == Access::read_write || wanted.masking.gives(permission);
    return 0;
}

int Reconciler::reconcile(int tid)
{
    Wanted wanted;
    bool carried;
    if (int err = loadWanted(tid, wanted, carried))
        return err;
    const auto shown = std::find_if(targets.begin(), targets.end(), [=](const auto &t) { return t.tid == tid; });
    const bool there = shown != targets.end();
    if (there && carried && shown->iqn == wanted.target.iqn)
        return adjust(wanted, *shown);
    if (there)
        if (int err = remove(*shown))
            return err;
    return carried ? create(wanted) : 0;
}

int Reconciler::remove(const TgtdTarget &shown)
{
    for (const std::string &name : shown.names)
        if (int err = daemon.unbindInitiator(shown.tid, name))
            return err;
    if (int err = daemon.setReady(shown.tid, false))
        return err;
    std::vector<TgtdConnection> connections;
    if (int err = daemon.showConnections(shown.tid, connections))
        return err;
    if (int err = closeAll(shown.tid, connections))
        return err;
    // Users first: deleting a target forgets them, but not that their accounts are in use.
    for (const std::string &user : shown.users) {
        const size_t mark = user.find(" (outgoing)");
        if (int err = daemon.unbindUser(shown.tid, user.substr(0, mark), mark != user.npos))
            return err;
    }
    int err = 0;
    bool busy = true;
    waitFor(last_commands_limit, [&] { return (err = daemon.deleteTarget(shown.tid, busy)) || !busy; });
    if (!err && busy)
        err = fail(NORV_ERR_TIMEOUT, "commands of its initiators keep the target %s busy", shown.iqn.c_str());
    return err;
}

int Reconciler::create(const Wanted &wanted)
{
    // It has no initiators yet: nobody gets in before the end.
    TgtdTarget fresh;
    fresh.tid = wanted.target.tid;
    fresh.iqn = wanted.target.iqn;
    fresh.ready = true;
    if (int err = daemon.createTarget(fresh.tid, fresh.iqn))
        return err;
    return adjust(wanted, fresh);
}

int Reconciler::adjust(const Wanted &wanted, const TgtdTarget &shown)
{
    const int tid = wanted.target.tid;
    bool ready = shown.ready;
    if (int err = unbindInitiators(wanted, shown))
        return err;
    if (ready && !wanted.target.enabled) {
        if (int err = daemon.setReady(tid, false))
            return err;
        ready = false;
    }
    if (!shown.nexuses.empty())
        if (int err = endSessions(wanted))
            return err;
    if (int err = adjustUsers(wanted, shown, ready))
        return err;
    if (int err = adjustParameters(wanted))
        return err;
    if (int err = adjustUnits(wanted, shown))
        return err;
    if (!ready && wanted.target.enabled)
        if (int err = daemon.setReady(tid, true))
            return err;
    return bindInitiators(wanted, shown);
}

int Reconciler::unbindInitiators(const Wanted &wanted, const TgtdTarget &shown)
{
    const bool open = wanted.masking.isOpen(permission);
    for (const std::string &name : shown.names) {
        // tgtd lets in whom either list allows: the address list holds everybody or nothing, never both.
        const bool kept =
            name == any_address ? open && wanted.target.enabled : !open && letsIn(wanted, name, permission);
        if (!kept)
            if (int err = daemon.unbindInitiator(shown.tid, name))
                return err;
    }
    return 0;
}

int Reconciler::bindInitiators(const Wanted &wanted, const TgtdTarget &shown)
{
    if (!wanted.target.enabled)
        return 0;
    std::set<std::string> names;
    if (wanted.masking.isOpen(permission)) {
        names.insert(any_address);
    } else {
        for (const auto &[name, given] : wanted.masking.named)
            if (given == permission)
                names.insert(name);
        // Whoever is in by the default entry stays able to come back after a break of the connection.
        std::vector<TgtdConnection> connections;
        if (!shown.nexuses.empty())
            if (int err = daemon.showConnections(shown.tid, connections))
                return err;
        for (const TgtdConnection &connection : connections)
            if (letsIn(wanted, connection.initiator, permission))
                names.insert(connection.initiator);
    }
    for (const std::string &name : names)
        if (!contains(shown.names, name))
            if (int err = daemon.bindInitiator(shown.tid, name))
                return err;
    return 0;
}

int Reconciler::endSessions(const Wanted &wanted)
{
    const int tid = wanted.target.tid;
    std::vector<TgtdConnection> connections;
    if (int err = daemon.showConnections(tid, connections))
        return err;
    connections.erase(std::remove_if(connections.begin(), connections.end(),
                                     [&](const auto &c) { return letsIn(wanted, c.initiator, permission); }),
                      connections.end());
    return closeAll(tid, connections);
}

int Reconciler::closeAll(int tid, const std::vector<TgtdConnection> &connections) const
{
    if (connections.empty())
        return 0;
    for (const TgtdConnection &connection : connections)
        if (int err = daemon.closeConnection(tid, connection))
            return err;
    // What is closed does nothing any more; it vanishes at its next event.
    int err = 0;
    waitFor(session_end_limit, [&] {
        std::vector<TgtdConnection> left;
        err = daemon.showConnections(tid, left);
        return err || std::none_of(left.begin(), left.end(), [&](const auto &c) {
                   return std::any_of(connections.begin(), connections.end(),
                                      [&](const auto &closed) { return closed.session == c.session; });
               });
    });
    return err;
}

int Reconciler::adjustUsers(const Wanted &wanted, const TgtdTarget &shown, bool &ready)
{
    const _tag_iscsi_target_ &target = wanted.target;
    const std::string outgoing = " (outgoing)";
    std::vector<std::string> names;
    if (target.auth_type != NORV_TARGET_AUTH_NONE)
        names.push_back(target.user);
    if (target.auth_type == NORV_TARGET_AUTH_MUTUAL_CHAP)
        names.push_back(target.mutual_user + outgoing);
    if (names == shown.users)
        return 0;

    // Off line meanwhile: between two accounts the target would ask for none. And never two accounts at
    // once: tgtd ends itself when it is to show what is left of two of which the first was unbound.
    if (ready)
        if (int err = daemon.setReady(target.tid, false))
            return err;
    ready = false;
    for (const std::string &name : shown.users) {
        const size_t mark = name.find(outgoing);
        if (int err = daemon.unbindUser(target.tid, name.substr(0, mark), mark != name.npos))
            return err;
    }
    if (target.auth_type != NORV_TARGET_AUTH_NONE) {
        if (int err = ensureUser(target.user, target.password))
            return err;
        if (int err = daemon.bindUser(target.tid, target.user, false))
            return err;
    }
    if (target.auth_type != NORV_TARGET_AUTH_MUTUAL_CHAP)
        return 0;
    if (int err = ensureUser(target.mutual_user, target.mutual_password))
        return err;
    return daemon.bindUser(target.tid, target.mutual_user, true);
}

int Reconciler::ensureUser(const std::string &user, const std::string &secret)
{
    if (contains(users, user))
        return 0;
    if (int err = daemon.createUser(user, secret))
        return err;
    users.push_back(user);
    return 0;
}

int Reconciler::removeUnusedUsers()
{
    std::map<std::string, std::string> wanted;
    if (int err = loadUsers(wanted))
        return err;
    for (const std::string &user : users)
        if (wanted.count(user) == 0)
            if (int err = daemon.deleteUser(user))
                return err;
    return 0;
}

int Reconciler::adjustParameters(const Wanted &wanted)
{
    const _tag_iscsi_target_ &target = wanted.target;
    const auto length = [](uint32_t bytes) { return std::to_string(bytes ? bytes : default_segment); };
    const auto digest = [](bool on) { return std::string(on ? "CRC32C" : "None"); };
    std::vector<std::pair<const char *, std::string>> parameters = {
        {"HeaderDigest", digest(target.header_digest)},
        {"DataDigest", digest(target.data_digest)},
        {"MaxRecvDataSegmentLength", length(target.max_recv_seg_bytes)},
        {"MaxXmitDataSegmentLength", length(target.max_send_seg_bytes)},
        // Where sessions are counted, one whose initiator vanished must not hold its place for ever.
        {"nop_interval", target.max_sessions ? ping_interval_seconds : "0"},
        {"nop_count", target.max_sessions ? pings_unanswered : "0"},
    };
    // A sender's requests bring their data along, which makes it faster by a half.
    if (isSinkTid(target.tid))
        parameters.insert(parameters.end(), {{"InitialR2T", "No"},
                                             {"FirstBurstLength", std::to_string(default_segment)},
                                             {"MaxBurstLength", std::to_string(4 * default_segment)}});
    std::map<std::string, std::string> shown;
    if (int err = daemon.showParameters(target.tid, shown))
        return err;
    for (const auto &[key, value] : parameters)
        if (shown[key] != value)
            if (int err = daemon.setParameter(target.tid, key, value))
                return err;
    return 0;
}

int Reconciler::adjustUnits(const Wanted &wanted, const TgtdTarget &shown)
{
    const auto lunAt = [&](uint64_t index) {
        return std::find_if(wanted.luns.begin(), wanted.luns.end(), [&](const MappedLun &lun) {
            return static_cast<uint64_t>(lun.index) == index && lun.shown;
        });
    };
    std::map<uint64_t, const TgtdUnit *> kept;
    for (const TgtdUnit &unit : shown.units) {
        const auto lun = lunAt(unit.lun);
        // A killed process may leave a unit without its serial number.
        if (lun != wanted.luns.end() && lun->uuid == unit.serial)
            kept[unit.lun] = &unit;
        else if (int err = removeUnit(wanted.target.tid, unit.lun))
            return err;
    }
    for (const MappedLun &lun : wanted.luns) {
        if (!lun.shown)
            continue;
        const auto unit = kept.find(static_cast<uint64_t>(lun.index));
        if (int err = adjustUnit(wanted, lun, unit == kept.end() ? nullptr : unit->second))
            return err;
    }
    return 0;
}

int Reconciler::adjustUnit(const Wanted &wanted, const MappedLun &lun, const TgtdUnit *shown)
{
    if (access(lun.path.c_str(), R_OK) != 0) {
        // One LUN without its data must not keep the others from being served.
        syslog(LOG_ERR, "LUN %d is not served: %s: %s", lun.lid, lun.path.c_str(), strerror(errno));
        return 0;
    }
    if (int err = placeExportLink(lun))
        return err;
    if (!shown)
        return createUnit(wanted.target.tid, lun);
    if (shown->path != exportLink(lun))
        if (int err = reopenUnit(daemon, wanted.target, shown->lun, exportLink(lun)))
            return err;
    const bool read_only = isReadOnly(lun, daemon.access());
    if (shown->read_only != read_only) // a sink has become an ordinary LUN, or the reverse
        return daemon.updateUnit(wanted.target.tid, shown->lun, read_only ? "readonly=1" : "readonly=0");
    return 0;
}

int Reconciler::createUnit(int tid, const MappedLun &lun)
{
    const auto index = static_cast<uint64_t>(lun.index);
    // In one request with the path last: it is never there in another state than the one wanted.
    const std::string settings = std::string("removable=0,vendor_id=NORV,product_id=iSCSI Storage,readonly=") +
                                 (isReadOnly(lun, daemon.access()) ? "1" : "0") + ",scsi_id=" + scsiId(lun) +
                                 ",scsi_sn=" + lun.uuid + ",thin_provisioning=" + (isThin(lun) ? "1" : "0") +
                                 ",path=" + exportLink(lun);
    if (int err = daemon.createUnit(tid, index))
        return err;
    return daemon.updateUnit(tid, index, settings);
}

int Reconciler::removeUnit(int tid, uint64_t lun)
{
    int err = 0;
    bool busy = true;
    const auto removed = [&] { return (err = daemon.deleteUnit(tid, lun, busy)) || !busy; };
    // tgtd does not delete a unit with commands under way. Without a medium it refuses new ones; an
    // initiator may have prevented that, and loses its session for it.
    daemon.updateUnit(tid, lun, "removable=1,online=0");
    if (waitFor(unit_end_limit, removed))
        return err;
    std::vector<TgtdConnection> connections;
    if ((err = daemon.showConnections(tid, connections)) || (err = closeAll(tid, connections)))
        return err;
    if (waitFor(last_commands_limit, removed))
        return err;
    return fail(NORV_ERR_TIMEOUT, "commands of its initiators keep unit %llu of target %d busy",
                static_cast<unsigned long long>(lun), tid);
}

} // namespace

int reconcileTargets(const Tgtd &daemon, const std::vector<int> &tids)
{
    Reconciler reconciler(daemon);
    if (int err = reconciler.load())
        return err;
    for (int tid : tids)
        if (int err = reconciler.reconcile(tid))
            return err;
    return reconciler.removeUnusedUsers();
}

int reconcileDaemon(const Tgtd &daemon)
{
    Reconciler reconciler(daemon);
    if (int err = reconciler.load())
        return err;
    std::vector<_tag_iscsi_target_> stored;
    if (int err = loadTargets(stored))
        return err;
    if (int err = loadSinkTargets(stored))
        return err;
    std::set<int> tids = reconciler.shownTids();
    // What is to go goes first: a new target may bear the name of an old one.
    for (int tid : std::set<int>(tids))
        if (std::none_of(stored.begin(), stored.end(), [=](const auto &target) { return target.tid == tid; })) {
            if (int err = reconciler.reconcile(tid))
                return err;
            tids.erase(tid);
        }
    for (const _tag_iscsi_target_ &target : stored)
        if (int err = reconciler.reconcile(target.tid))
            return err;
    return reconciler.removeUnusedUsers();
}

} // namespace norvhost

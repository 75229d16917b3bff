#include "host/target/portal/StoreDirectory.h"

#include "host/core/LastError.h"
#include "host/target/Name.h"
#include "host/target/ServiceLock.h"
#include "host/target/Sinks.h"
#include "host/target/TargetStore.h"
#include "platform/error.h"

#include <algorithm>
#include <syslog.h>

namespace norvhost::portal {
namespace {

using Clock = std::chrono::steady_clock;
using namespace std::chrono_literals;

/// A daemon that answers later than this is as good as none: the portal serves others too.
constexpr int daemon_timeout_ms = 2000;

/// Names per target and daemon that stand in no entry of their own.
constexpr size_t learned_max = 256;

/// How long a redirected initiator may take until its session shows.
constexpr auto redirect_limit = 3s;

Decision refused(LoginStatus status)
{
    Decision decision;
    decision.status = status;
    return decision;
}

Decision later()
{
    Decision decision;
    decision.later = true;
    return decision;
}

/// The daemon for a permission; false for none.
bool accessFor(int permission, Access &access)
{
    access = permission == NORV_AUTHORITY_READ_WRITE ? Access::read_write : Access::read;
    return permission == NORV_AUTHORITY_READ_WRITE || permission == NORV_AUTHORITY_READ;
}

/// The target that the initiator may use with the permission that it has; login_not_found hides the others.
LoginStatus look(const std::string &initiator, const std::string &wanted, _tag_iscsi_target_ &target, Masking &masking)
{
    std::string name;
    if (!normaliseTargetName(wanted, name))
        return login_not_found;
    int err = loadTargetByIqn(name, target);
    if (err == NORV_ERR_NO_SUCH_TARGET)
        err = loadSinkTargetByIqn(name, target);
    if (err)
        return err == NORV_ERR_NO_SUCH_TARGET ? login_not_found : login_service_unavailable;
    if (isSinkTid(target.tid) ? loadSinkMasking(target.tid, masking) : loadMasking(target.tid, masking))
        return login_service_unavailable;
    Access access;
    if (!accessFor(masking.of(initiator), access))
        return login_not_found;
    return target.enabled ? login_ok : login_service_unavailable;
}

/// Whether the name is bound by reconciling, without us.
bool isListed(const Masking &masking, const std::string &initiator, int permission)
{
    const auto entry = masking.named.find(initiator);
    return masking.isOpen(permission) || (entry != masking.named.end() && entry->second == permission);
}

int countSessions(const Tgtd &daemon, int tid, std::vector<TgtdConnection> &connections)
{
    std::vector<TgtdConnection> found;
    const int err = daemon.showConnections(tid, found);
    if (err && err != NORV_ERR_NO_SUCH_TARGET)
        return err;
    connections.insert(connections.end(), found.begin(), found.end());
    return 0;
}

} // namespace

std::vector<std::string> StoreDirectory::targetsFor(const std::string &initiator)
{
    std::vector<std::string> names;
    std::vector<_tag_iscsi_target_> targets;
    if (loadTargets(targets))
        syslog(LOG_ERR, "no discovery: %s", lastError());
    for (const _tag_iscsi_target_ &target : targets) {
        Masking masking;
        Access access;
        if (target.enabled && !loadMasking(target.tid, masking) && accessFor(masking.of(initiator), access))
            names.emplace_back(target.iqn);
    }
    return names;
}

Decision StoreDirectory::decide(const std::string &initiator, const std::string &wanted)
{
    _tag_iscsi_target_ target;
    Masking masking;
    if (const LoginStatus status = look(initiator, wanted, target, masking))
        return refused(status);
    const int permission = masking.of(initiator);
    Access access;
    accessFor(permission, access);
    const Tgtd daemon(access, daemon_timeout_ms);

    int error;
    if (isFull(target, daemon, initiator, error)) {
        ServiceLock lock; // its holder may have a session of its own for a moment
        return !lock.tryTake() && lock.held() ? refused(login_too_many_connections) : later();
    }
    if (error) {
        syslog(LOG_WARNING, "no login to %s: %s", target.iqn, lastError());
        return refused(login_service_unavailable);
    }
    Decision decision;
    decision.status = login_moved;
    decision.port = daemon.port();
    if (!isListed(masking, initiator, permission))
        decision = bindLearned(daemon, initiator, wanted);
    if (decision.status == login_moved && target.max_sessions > 0)
        redirected.push_back({target.iqn, initiator, Clock::now() + redirect_limit});
    return decision;
}

bool StoreDirectory::isFull(const _tag_iscsi_target_ &target, const Tgtd &daemon, const std::string &initiator,
                            int &error)
{
    // Asked also without a limit: a target that the daemon does not have yet is no place to send anybody.
    std::vector<TgtdConnection> connections;
    if ((error = daemon.showConnections(target.tid, connections)) || target.max_sessions == 0)
        return false;
    const Tgtd other(daemon.access() == Access::read ? Access::read_write : Access::read, daemon_timeout_ms);
    if ((error = countSessions(other, target.tid, connections)))
        return false;

    redirected.erase(std::remove_if(redirected.begin(), redirected.end(),
                                    [&](const Redirected &entry) {
                                        const bool arrived =
                                            entry.target == target.iqn &&
                                            std::any_of(connections.begin(), connections.end(),
                                                        [&](const auto &c) { return c.initiator == entry.initiator; });
                                        return arrived || entry.until < Clock::now();
                                    }),
                     redirected.end());
    // An initiator that asks again takes the place that it was promised before.
    const auto others = std::count_if(redirected.begin(), redirected.end(), [&](const Redirected &entry) {
        return entry.target == target.iqn && entry.initiator != initiator;
    });
    return connections.size() + static_cast<size_t>(others) >= target.max_sessions;
}

Decision StoreDirectory::bindLearned(const Tgtd &daemon, const std::string &initiator, const std::string &wanted)
{
    ServiceLock lock;
    if (lock.tryTake())
        return refused(login_service_unavailable);
    if (!lock.held() || daemonsMarked())
        return later();
    // Read again: a permission may have been taken away before we had the lock.
    _tag_iscsi_target_ target;
    Masking masking;
    if (const LoginStatus status = look(initiator, wanted, target, masking))
        return refused(status);
    if (masking.of(initiator) != static_cast<int>(daemon.access()))
        return later();
    bool added, room = true;
    if (daemon.bindInitiator(target.tid, initiator, &added) ||
        (added && makeRoom(daemon, target.tid, masking, initiator, room))) {
        syslog(LOG_WARNING, "no login to %s: %s", target.iqn, lastError());
        return refused(login_service_unavailable);
    }
    if (!room)
        return refused(login_out_of_resources);
    Decision decision;
    decision.status = login_moved;
    decision.port = daemon.port();
    return decision;
}

int StoreDirectory::makeRoom(const Tgtd &daemon, int tid, const Masking &masking, const std::string &added, bool &room)
{
    std::vector<TgtdTarget> targets;
    std::vector<TgtdConnection> connections;
    if (int err = daemon.showTargets(targets))
        return err;
    if (int err = daemon.showConnections(tid, connections))
        return err;
    const auto target = std::find_if(targets.begin(), targets.end(), [=](const auto &t) { return t.tid == tid; });
    if (target == targets.end())
        return 0;
    std::vector<std::string> learned;
    for (const std::string &name : target->names)
        if (!isListed(masking, name, static_cast<int>(daemon.access())))
            learned.push_back(name);
    room = learned.size() <= learned_max;
    for (const std::string &name : learned) {
        const bool in_use = name == added || std::any_of(connections.begin(), connections.end(),
                                                         [&](const auto &c) { return c.initiator == name; });
        if (room)
            break;
        if (!in_use) {
            if (int err = daemon.unbindInitiator(tid, name))
                return err;
            room = true;
        }
    }
    return room ? 0 : daemon.unbindInitiator(tid, added);
}

void enforceSessionLimits()
{
    std::vector<_tag_iscsi_target_> targets;
    if (loadTargets(targets))
        return;
    targets.erase(std::remove_if(targets.begin(), targets.end(), [](const auto &t) { return t.max_sessions == 0; }),
                  targets.end());
    ServiceLock lock; // its holder may have sessions of its own for a moment
    if (targets.empty() || lock.tryTake() || !lock.held())
        return;
    for (const _tag_iscsi_target_ &target : targets) {
        size_t places = target.max_sessions;
        for (Access access : {Access::read_write, Access::read}) {
            const Tgtd daemon(access, daemon_timeout_ms);
            std::vector<TgtdConnection> connections;
            if (countSessions(daemon, target.tid, connections))
                continue;
            std::sort(connections.begin(), connections.end(),
                      [](const auto &a, const auto &b) { return a.session < b.session; });
            for (size_t i = places; i < connections.size(); ++i)
                daemon.closeConnection(target.tid, connections[i]);
            places -= std::min(places, connections.size());
        }
    }
}

} // namespace norvhost::portal

#include "host/target/Tgtd.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/target/Lines.h"
#include "host/target/ProcessLock.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

namespace norvhost {
namespace {

// From here to WireAnswer: tgtadm.h and tgtadm_error.h of tgt 1.0.85. The daemon is on this machine,
// so that the records go over the socket as they lie in memory.
enum Operation : uint32_t {
    op_new,
    op_delete,
    op_show,
    op_bind,
    op_unbind,
    op_update,
    op_statistics
};
enum Mode : uint32_t {
    mode_system,
    mode_target,
    mode_unit,
    mode_portal,
    mode_driver,
    mode_session,
    mode_connection,
    mode_account
};

enum DaemonError : uint32_t {
    daemon_ok = 0,
    daemon_no_target = 4,
    daemon_no_unit = 5,
    daemon_no_session = 6,
    daemon_no_connection = 7,
    daemon_name_bound = 12,
    daemon_name_not_bound = 13,
    daemon_user_exists = 14,
    daemon_no_user = 15,
    daemon_target_active = 19,
    daemon_unit_active = 20,
};

const char *const daemon_errors[] = {
    "success",
    "unknown error",
    "out of memory",
    "no such driver",
    "no such target",
    "no such unit",
    "no such session",
    "no such connection",
    "no such binding",
    "the target exists",
    "the unit exists",
    "the binding exists",
    "the name is bound",
    "the name is not bound",
    "the user exists",
    "no such user",
    "too many users",
    "invalid request",
    "the target has an outgoing user",
    "the target is active",
    "the unit is active",
    "the driver is active",
    "unsupported operation",
    "unknown parameter",
    "removal is prevented",
};

struct WireRequest {
    uint32_t mode;
    uint32_t operation;
    char driver[64];
    uint32_t length;
    int32_t tid;
    uint64_t session;
    uint64_t lun;
    uint32_t connection;
    uint32_t host;
    uint32_t device_type;
    uint32_t account_direction;
    uint32_t pack;
    uint32_t force;
};
static_assert(sizeof(WireRequest) == 120, "tgtadm.h: struct tgtadm_req");

struct WireAnswer {
    uint32_t error;
    uint32_t length;
};

constexpr size_t answer_max = 64 << 20;

bool sendAll(int fd, const char *data, size_t size)
{
    while (size > 0) {
        const ssize_t count = send(fd, data, size, MSG_NOSIGNAL);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        data += count;
        size -= static_cast<size_t>(count);
    }
    return true;
}

bool receiveAll(int fd, char *data, size_t size)
{
    while (size > 0) {
        const ssize_t count = recv(fd, data, size, 0);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        data += count;
        size -= static_cast<size_t>(count);
    }
    return true;
}

/// Reads one line's "<prefix><value>" and goes on to the next line.
bool take(Lines &lines, std::string_view prefix, std::string_view &value)
{
    if (!lines.starts(prefix))
        return false;
    value = lines.line().substr(prefix.size());
    lines.next();
    return true;
}

bool takeNumber(Lines &lines, std::string_view prefix, uint64_t &number)
{
    std::string_view value;
    return take(lines, prefix, value) && parseNumber(value, number);
}

bool takeLine(Lines &lines, std::string_view text)
{
    std::string_view rest;
    return take(lines, text, rest) && rest.empty();
}

/// What stands behind the prefix, on each line that begins with it.
std::vector<std::string_view> valuesOf(std::string_view text, std::string_view prefix)
{
    std::vector<std::string_view> values;
    std::string_view value;
    for (Lines lines(text); !lines.atEnd();)
        if (take(lines, prefix, value))
            values.push_back(value);
        else
            lines.next();
    return values;
}

/// "<ID>: <name>"
bool parseHeader(std::string_view header, int &tid, std::string &iqn)
{
    const size_t colon = header.find(": ");
    if (colon == header.npos || !parseNumber(header.substr(0, colon), tid))
        return false;
    iqn = header.substr(colon + 2);
    return true;
}

bool takeNexuses(Lines &lines, std::vector<uint64_t> &nexuses)
{
    std::string_view ignored;
    uint64_t number;
    while (lines.starts("        I_T nexus: ")) {
        if (!takeNumber(lines, "        I_T nexus: ", number))
            return false;
        nexuses.push_back(number);
        if (!take(lines, "            Initiator: ", ignored) ||
            !takeNumber(lines, "            Connection: ", number) || !take(lines, "                ", ignored))
            return false;
    }
    return true;
}

bool takeUnits(Lines &lines, std::vector<TgtdUnit> &units)
{
    uint64_t lun;
    while (lines.starts("        LUN: ")) {
        if (!takeNumber(lines, "        LUN: ", lun))
            return false;
        TgtdUnit unit;
        unit.lun = lun;
        while (lines.starts("            ")) {
            std::string_view value;
            if (take(lines, "            SCSI ID: ", value))
                unit.scsi_id = value;
            else if (take(lines, "            SCSI SN: ", value))
                unit.serial = value;
            else if (take(lines, "            Readonly: ", value))
                unit.read_only = value == "Yes";
            else if (take(lines, "            Thin-provisioning: ", value))
                unit.thin = value == "Yes";
            else if (take(lines, "            Backing store path: ", value))
                unit.path = value;
            else
                lines.next();
        }
        if (lun > 0)
            units.push_back(std::move(unit));
    }
    return true;
}

void takeTexts(Lines &lines, std::vector<std::string> &texts)
{
    std::string_view value;
    while (take(lines, "        ", value))
        texts.emplace_back(value);
}

bool takeTarget(Lines &lines, TgtdTarget &target)
{
    std::string_view header, value;
    if (!take(lines, "Target ", header) || !parseHeader(header, target.tid, target.iqn))
        return false;
    if (!takeLine(lines, "    System information:") || !takeLine(lines, "        Driver: iscsi") ||
        !take(lines, "        State: ", value))
        return false;
    target.ready = value == "ready";
    take(lines, "        Nop interval: ", value);
    take(lines, "        Nop count: ", value);

    if (!takeLine(lines, "    I_T nexus information:") || !takeNexuses(lines, target.nexuses) ||
        !takeLine(lines, "    LUN information:") || !takeUnits(lines, target.units) ||
        !takeLine(lines, "    Account information:"))
        return false;
    takeTexts(lines, target.users);
    if (!takeLine(lines, "    ACL information:"))
        return false;
    takeTexts(lines, target.names);
    return true;
}

/// The targets in the driver's own list, a text that no initiator has a part in.
bool parseDriverTargets(std::string_view text, std::vector<std::pair<int, std::string>> &targets)
{
    for (const std::string_view header : valuesOf(text, "        Target ")) {
        std::pair<int, std::string> target;
        if (!parseHeader(header, target.first, target.second))
            return false;
        targets.push_back(std::move(target));
    }
    std::sort(targets.begin(), targets.end());
    return true;
}

/// Splits "  3   1   1   512 ..." into its numbers.
bool parseColumns(std::string_view line, std::vector<uint64_t> &numbers)
{
    numbers.clear();
    while (!line.empty()) {
        const size_t begin = line.find_first_not_of(' ');
        if (begin == line.npos)
            break;
        const size_t end = std::min(line.find(' ', begin), line.size());
        uint64_t number;
        if (!parseNumber(line.substr(begin, end - begin), number))
            return false;
        numbers.push_back(number);
        line.remove_prefix(end);
    }
    return true;
}

} // namespace

struct Tgtd::Request {
    Mode mode;
    Operation operation;
    int32_t tid = 0;
    std::string text = {}; ///< "key=value,...", without an end mark
    uint64_t lun = 0;
    uint64_t session = 0;
    uint32_t connection = 0;
    bool outgoing = false;
    bool force = false;
    std::vector<uint32_t> tolerated = {};
    uint32_t *daemon_error = nullptr; ///< set to the tolerated error that came
};

bool parseTargets(std::string_view text, std::vector<TgtdTarget> &targets)
{
    std::vector<TgtdTarget> found;
    for (Lines lines(text); !lines.atEnd();) {
        TgtdTarget target;
        if (!takeTarget(lines, target))
            return false;
        found.push_back(std::move(target));
    }
    targets = std::move(found);
    return true;
}

std::string Tgtd::socketVariable() const
{
    return runFolder() + "/tgtd-" + name() + ".sock";
}

pid_t Tgtd::processId() const
{
    return processLockHolder(socketVariable() + ".0.lock");
}

int Tgtd::exchange(const Request &request, std::string *answer, uint32_t &daemon_error) const
{
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    const std::string path = socketVariable() + ".0";
    if (path.size() >= sizeof address.sun_path)
        return fail(NORV_ERR_BAD_PARAMETER, "the path of tgtd's control socket is too long: %s", path.c_str());
    memcpy(address.sun_path, path.c_str(), path.size());

    WireRequest header = {};
    header.mode = request.mode;
    header.operation = request.operation;
    strcpy(header.driver, "iscsi");
    header.length = static_cast<uint32_t>(sizeof header + (request.text.empty() ? 0 : request.text.size() + 1));
    header.tid = request.tid;
    header.session = request.session;
    header.lun = request.lun;
    header.connection = request.connection;
    header.account_direction = request.outgoing;
    header.force = request.force;
    std::string message(reinterpret_cast<const char *>(&header), sizeof header);
    if (!request.text.empty())
        message.append(request.text.c_str(), request.text.size() + 1);

    const FileDescriptor socket_fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const timeval timeout = {timeout_ms / 1000, timeout_ms % 1000 * 1000L};
    setsockopt(socket_fd.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
    setsockopt(socket_fd.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
    // A request goes out in one piece right behind the connect: tgtd 1.0.85 can spin on a connection
    // that ends before its request.
    const bool sent = connect(socket_fd.get(), reinterpret_cast<sockaddr *>(&address), sizeof address) == 0 &&
                      sendAll(socket_fd.get(), message.data(), message.size());
    if (!sent)
        return fail(NORV_ERR_START_SERVICE,
                    "the iSCSI service is not running (no answer from the %s daemon): start it with 'iscsi-host boot'",
                    which == Access::read ? "read-only" : "read-write");

    WireAnswer reply;
    if (!receiveAll(socket_fd.get(), reinterpret_cast<char *>(&reply), sizeof reply) || reply.length < sizeof reply ||
        reply.length - sizeof reply > answer_max)
        return fail(NORV_ERR_START_SERVICE, "the %s iSCSI daemon gave no answer: see 'iscsi-host status'", name());
    daemon_error = reply.error;
    if (!answer || reply.error != daemon_ok)
        return 0;
    answer->resize(reply.length - sizeof reply);
    if (!receiveAll(socket_fd.get(), answer->data(), answer->size()))
        return fail(NORV_ERR_START_SERVICE, "the answer of the %s iSCSI daemon broke off", name());
    answer->resize(strnlen(answer->data(), answer->size())); // the text ends with a NUL of tgtd's
    return 0;
}

int Tgtd::call(const Request &request, std::string *answer) const
{
    static const char *const operations[] = {"create", "delete", "show", "bind", "unbind", "update", "count"};
    static const char *const modes[] = {"system", "target",  "unit",       "portal",
                                        "driver", "session", "connection", "account"};
    uint32_t error = daemon_ok;
    if (int err = exchange(request, answer, error))
        return err;
    if (request.daemon_error)
        *request.daemon_error = error;
    if (error == daemon_ok ||
        std::find(request.tolerated.begin(), request.tolerated.end(), error) != request.tolerated.end())
        return 0;
    // Never the request's text: it may hold a secret.
    return fail(error == daemon_no_target ? NORV_ERR_NO_SUCH_TARGET : NORV_ERR_SET_CONFIG,
                "the %s iSCSI daemon refused to %s %s %d/%llu: %s", name(), operations[request.operation],
                modes[request.mode], request.tid, static_cast<unsigned long long>(request.lun),
                error < std::size(daemon_errors) ? daemon_errors[error] : "unknown error");
}

int Tgtd::ping() const
{
    std::string answer;
    if (int err = call({mode_system, op_show}, &answer))
        return err;
    return answer.compare(0, 8, "System:\n") == 0
               ? 0
               : fail(NORV_ERR_START_SERVICE, "the %s iSCSI daemon is none that this program can drive", name());
}

int Tgtd::showTargets(std::vector<TgtdTarget> &targets) const
{
    std::string text;
    std::vector<std::pair<int, std::string>> expected;
    std::vector<TgtdTarget> found;
    if (int err = call({mode_driver, op_show}, &text))
        return err;
    bool understood = parseDriverTargets(text, expected);
    if (int err = call({mode_target, op_show, -1}, &text))
        return err;
    understood = understood && parseTargets(text, found) &&
                 std::equal(found.begin(), found.end(), expected.begin(), expected.end(),
                            [](const TgtdTarget &target, const auto &header) {
                                return target.tid == header.first && target.iqn == header.second;
                            });
    if (!understood)
        return fail(NORV_ERR_GET_CONFIG, "the %s iSCSI daemon gave an answer that cannot be understood", name());
    targets = std::move(found);
    return 0;
}

int Tgtd::showUsers(std::vector<std::string> &users) const
{
    std::string text;
    if (int err = call({mode_account, op_show}, &text))
        return err;
    const auto values = valuesOf(text, "    ");
    users.assign(values.begin(), values.end());
    return 0;
}

int Tgtd::showPortals(std::vector<std::string> &portals) const
{
    std::string text;
    if (int err = call({mode_portal, op_show}, &text))
        return err;
    portals.clear();
    for (const std::string_view portal : valuesOf(text, "Portal: "))
        portals.emplace_back(portal.substr(0, portal.rfind(',')));
    std::sort(portals.begin(), portals.end());
    return 0;
}

int Tgtd::showParameters(int tid, std::map<std::string, std::string> &parameters) const
{
    std::string text;
    if (int err = call({mode_target, op_show, tid}, &text))
        return err;
    parameters.clear();
    for (Lines lines(text); !lines.atEnd(); lines.next()) {
        const size_t equals = lines.line().find('=');
        if (equals != std::string_view::npos)
            parameters.emplace(lines.line().substr(0, equals), lines.line().substr(equals + 1));
    }
    return 0;
}

int Tgtd::showConnections(int tid, std::vector<TgtdConnection> &connections) const
{
    std::string text;
    if (int err = call({mode_connection, op_show, tid}, &text))
        return err;
    connections.clear();
    for (Lines lines(text); !lines.atEnd();) {
        TgtdConnection found;
        uint64_t number;
        std::string_view initiator;
        // A hostile name may hold lines of its own. It can feign further connections, which cannot be
        // closed, but not hide the one that it belongs to: that one stands in front of it.
        if (!takeNumber(lines, "Session: ", found.session) || !takeNumber(lines, "    Connection: ", number) ||
            !take(lines, "        Initiator: ", initiator)) {
            if (!lines.atEnd() && !lines.starts("Session: "))
                lines.next();
            continue;
        }
        found.connection = static_cast<uint32_t>(number);
        found.initiator = initiator;
        connections.push_back(std::move(found));
    }
    return 0;
}

int Tgtd::showStatistics(int tid, std::vector<TgtdStatistics> &statistics) const
{
    std::string text;
    if (int err = call({mode_target, op_statistics, tid}, &text))
        return err;
    statistics.clear();
    std::vector<uint64_t> n;
    for (Lines lines(text); !lines.atEnd(); lines.next())
        // Target, unit, session; bytes and commands: reads submitted, reads done, writes submitted, writes done;
        // errors.
        if (parseColumns(lines.line(), n) && n.size() == 12)
            statistics.push_back({n[1], n[2], n[4] + n[8], n[6] + n[10], n[6]});
    return 0;
}

int Tgtd::showBytesSent(uint64_t session, uint32_t connection, uint64_t &bytes) const
{
    Request request = {mode_connection, op_statistics};
    request.session = session;
    request.connection = connection;
    std::string text;
    if (int err = call(request, &text))
        return err;
    std::vector<uint64_t> n;
    for (Lines lines(text); !lines.atEnd(); lines.next())
        if (parseColumns(lines.line(), n) && n.size() == 8) { // session, connection, bytes received, bytes sent, ...
            bytes = n[3];
            return 0;
        }
    return fail(NORV_ERR_GET_CONFIG, "the %s iSCSI daemon told no statistics of a connection", name());
}

int Tgtd::createTarget(int tid, const std::string &iqn) const
{
    return call({mode_target, op_new, tid, "targetname=" + iqn});
}

int Tgtd::deleteTarget(int tid, bool &busy) const
{
    uint32_t error = daemon_ok;
    Request request = {mode_target, op_delete, tid};
    request.tolerated = {daemon_no_target, daemon_target_active, daemon_unit_active};
    request.daemon_error = &error;
    const int err = call(request);
    busy = !err && (error == daemon_target_active || error == daemon_unit_active);
    return err;
}

int Tgtd::setReady(int tid, bool ready) const
{
    return call({mode_target, op_update, tid, ready ? "state=ready" : "state=offline"});
}

int Tgtd::setParameter(int tid, const char *key, const std::string &value) const
{
    return call({mode_target, op_update, tid, std::string(key) + "=" + value});
}

int Tgtd::createUnit(int tid, uint64_t lun) const
{
    return call({mode_unit, op_new, tid, "bstype=rdwr", lun});
}

int Tgtd::updateUnit(int tid, uint64_t lun, const std::string &settings) const
{
    return call({mode_unit, op_update, tid, settings, lun});
}

int Tgtd::deleteUnit(int tid, uint64_t lun, bool &busy) const
{
    uint32_t error = daemon_ok;
    Request request = {mode_unit, op_delete, tid, "", lun};
    request.tolerated = {daemon_no_unit, daemon_unit_active};
    request.daemon_error = &error;
    const int err = call(request);
    busy = !err && error == daemon_unit_active;
    return err;
}

int Tgtd::createUser(const std::string &user, const std::string &secret) const
{
    return call({mode_account, op_new, 0, "user=" + user + ",password=" + secret});
}

int Tgtd::deleteUser(const std::string &user) const
{
    Request request = {mode_account, op_delete, 0, "user=" + user};
    request.tolerated = {daemon_no_user};
    return call(request);
}

int Tgtd::bindUser(int tid, const std::string &user, bool outgoing) const
{
    Request request = {mode_account, op_bind, tid, "user=" + user};
    request.outgoing = outgoing;
    return call(request);
}

int Tgtd::unbindUser(int tid, const std::string &user, bool outgoing) const
{
    Request request = {mode_account, op_unbind, tid, "user=" + user};
    request.outgoing = outgoing;
    request.tolerated = {daemon_no_user};
    return call(request);
}

int Tgtd::bindInitiator(int tid, const std::string &name, bool *added) const
{
    uint32_t error = daemon_ok;
    Request request = {mode_target, op_bind, tid};
    request.text = (name == any_address ? "initiator-address=" : "initiator-name=") + name;
    request.tolerated = {daemon_name_bound};
    request.daemon_error = &error;
    const int err = call(request);
    if (added)
        *added = !err && error == daemon_ok;
    return err;
}

int Tgtd::unbindInitiator(int tid, const std::string &name) const
{
    Request request = {mode_target, op_unbind, tid};
    request.text = (name == any_address ? "initiator-address=" : "initiator-name=") + name;
    request.tolerated = {daemon_name_not_bound};
    return call(request);
}

int Tgtd::closeConnection(int tid, const TgtdConnection &connection) const
{
    Request request = {mode_connection, op_delete, tid};
    request.session = connection.session;
    request.connection = connection.connection;
    request.tolerated = {daemon_no_session, daemon_no_connection};
    return call(request);
}

} // namespace norvhost

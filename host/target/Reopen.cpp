#include "host/target/Reopen.h"

#include "host/core/LastError.h"
#include "host/core/LibIscsi.h"
#include "host/core/PipeSignalBlock.h"
#include "host/storage/LunStore.h"
#include "host/target/Wait.h"
#include "platform/error.h"

#include <arpa/inet.h>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <sys/socket.h>
#include <vector>

namespace norvhost {
namespace {

using namespace std::chrono_literals;

constexpr auto drain_limit = 20s;
constexpr int login_limit_seconds = 10;

/// Small against the part of a socket's buffer that must be free before tgtd sends: it never waits for us
/// in the middle of an answer, which would keep everybody waiting.
constexpr size_t ping_size = 4096;
constexpr size_t header_size = 48;

struct EndSession {
    void operator()(iscsi_context *session) const { iscsi_destroy_context(session); }
};
using Session = std::unique_ptr<iscsi_context, EndSession>;

/// Lets a name in for as long as the object lives. What a killed process leaves goes at the next reconcile.
class TemporaryInitiator {
public:
    TemporaryInitiator(const Tgtd &daemon, int tid, std::string name)
        : daemon(daemon), tid(tid), name(std::move(name)), code(daemon.bindInitiator(tid, this->name))
    {
    }
    ~TemporaryInitiator()
    {
        if (!code)
            daemon.unbindInitiator(tid, name);
    }
    TemporaryInitiator(const TemporaryInitiator &) = delete;
    TemporaryInitiator &operator=(const TemporaryInitiator &) = delete;

    int error() const { return code; }

private:
    const Tgtd &daemon;
    const int tid;
    const std::string name;
    const int code;
};

int logIn(const Tgtd &daemon, const _tag_iscsi_target_ &target, const std::string &initiator, Session &session)
{
    std::vector<std::string> portals;
    if (int err = daemon.showPortals(portals))
        return err;
    if (portals.empty())
        return fail(NORV_ERR_START_SERVICE, "the %s iSCSI daemon listens nowhere", daemon.name());
    std::string portal = portals.front();
    if (portal.compare(0, 8, "0.0.0.0:") == 0)
        portal.replace(0, 7, "127.0.0.1");
    else if (portal.compare(0, 5, "[::]:") == 0)
        portal.replace(0, 4, "[::1]");

    session.reset(iscsi_create_context(initiator.c_str()));
    iscsi_context *const iscsi = session.get();
    if (!iscsi)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for an iSCSI session");
    iscsi_set_session_type(iscsi, ISCSI_SESSION_NORMAL);
    iscsi_set_targetname(iscsi, target.iqn);
    iscsi_set_header_digest(iscsi, ISCSI_HEADER_DIGEST_NONE);
    iscsi_set_noautoreconnect(iscsi, 1);
    iscsi_set_timeout(iscsi, login_limit_seconds);
    if (target.auth_type != NORV_TARGET_AUTH_NONE)
        iscsi_set_initiator_username_pwd(iscsi, target.user, target.password);
    if (target.auth_type == NORV_TARGET_AUTH_MUTUAL_CHAP)
        iscsi_set_target_username_pwd(iscsi, target.mutual_user, target.mutual_password);
    if (iscsi_connect_sync(iscsi, portal.c_str()) != 0 || iscsi_login_sync(iscsi) != 0)
        return fail(NORV_ERR_TIMEOUT, "cannot hold back the commands on %s: %s", target.iqn, iscsi_get_error(iscsi));
    return 0;
}

/// A request's header. All of ours are immediate: they take no part in the session's numbering.
std::vector<unsigned char> header(unsigned char opcode, unsigned char flags, size_t data_size, uint32_t tag)
{
    std::vector<unsigned char> pdu(header_size);
    pdu[0] = static_cast<unsigned char>(0x40 | opcode);
    pdu[1] = flags;
    pdu[6] = static_cast<unsigned char>(data_size >> 8);
    pdu[7] = static_cast<unsigned char>(data_size);
    const uint32_t wire_tag = htonl(tag);
    memcpy(&pdu[16], &wire_tag, sizeof wire_tag);
    return pdu;
}

std::vector<unsigned char> ping(uint32_t tag)
{
    std::vector<unsigned char> pdu = header(0x00, 0x80, ping_size, tag); // NOP-Out
    memset(&pdu[20], 0xff, 4);                                           // it is no answer to a ping of the target's
    pdu.resize(header_size + ping_size);
    return pdu;
}

/// INQUIRY, which every unit answers whatever reservations there are.
std::vector<unsigned char> queueStop(uint64_t lun, uint32_t tag)
{
    constexpr unsigned char final_read_head_of_queue = 0x80 | 0x40 | 0x03;
    constexpr unsigned char length = 36;
    std::vector<unsigned char> pdu = header(0x01, final_read_head_of_queue, 0, tag);
    pdu[8] = lun < 256 ? 0 : static_cast<unsigned char>(0x40 | lun >> 8);
    pdu[9] = static_cast<unsigned char>(lun);
    pdu[23] = length;
    pdu[32] = 0x12;
    pdu[36] = length;
    return pdu;
}

/// The most that tgtd can send while we read nothing: its send buffer and our receive buffer.
size_t unreadLimit(int fd)
{
    unsigned long least, usual, most = 4 << 20;
    if (FILE *file = fopen("/proc/sys/net/ipv4/tcp_wmem", "re")) {
        if (fscanf(file, "%lu %lu %lu", &least, &usual, &most) != 3)
            most = 4 << 20;
        fclose(file);
    }
    int receive = 0;
    socklen_t size = sizeof receive;
    getsockopt(fd, SOL_SOCKET, SO_RCVBUF, &receive, &size);
    return most + 2 * static_cast<size_t>(receive) + (1 << 20);
}

bool sendAll(int fd, const std::vector<unsigned char> &pdu)
{
    for (size_t sent = 0; sent < pdu.size();) {
        const ssize_t count = send(fd, pdu.data() + sent, pdu.size() - sent, MSG_NOSIGNAL);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        sent += static_cast<size_t>(count);
    }
    return true;
}

/// Stops the unit's queue; `pings` are the bytes whose sending the answer has to wait for.
int stopQueue(const Session &session, uint64_t lun, size_t &pings)
{
    const int fd = iscsi_get_fd(session.get());
    const int small = 4096; // fixes the size of the receive buffer, which would grow otherwise
    const timeval limit = {login_limit_seconds, 0};
    setsockopt(fd, SOL_SOCKET, SO_RCVBUF, &small, sizeof small);
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);

    uint32_t tag = 0x70000000;
    const size_t count = unreadLimit(fd) / ping_size + 1;
    for (size_t i = 0; i < count; ++i)
        if (!sendAll(fd, ping(tag++)))
            return failErrno(NORV_ERR_IO, errno, "cannot hold back the commands of a unit");
    pings = count * (header_size + ping_size);
    return sendAll(fd, queueStop(lun, tag)) ? 0
                                            : failErrno(NORV_ERR_IO, errno, "cannot hold back the commands of a unit");
}

/// Waits until our command stops the queue and nothing else runs on the unit.
int waitForIdle(const Tgtd &daemon, const TgtdConnection &ours, int tid, uint64_t lun, size_t pings)
{
    int err = 0;
    const bool idle = waitFor(drain_limit, [&] {
        std::vector<TgtdStatistics> statistics;
        if ((err = daemon.showStatistics(tid, statistics)))
            return true;
        bool stopped = false, running = false;
        for (const TgtdStatistics &entry : statistics) {
            if (entry.lun != lun)
                continue;
            stopped = stopped || (entry.session == ours.session && entry.reads_done > 0);
            running = running || entry.submitted != entry.done;
        }
        return stopped && !running;
    });
    if (err)
        return err;
    if (!idle)
        return fail(NORV_ERR_TIMEOUT, "the commands on unit %llu of target %d do not end",
                    static_cast<unsigned long long>(lun), tid);
    uint64_t sent;
    if ((err = daemon.showBytesSent(ours.session, ours.connection, sent)))
        return err;
    return sent < pings ? 0 : fail(NORV_ERR_TIMEOUT, "cannot hold back the commands of a unit: the answer was sent");
}

int findConnection(const Tgtd &daemon, int tid, const std::string &initiator, TgtdConnection &found)
{
    std::vector<TgtdConnection> connections;
    if (int err = daemon.showConnections(tid, connections))
        return err;
    for (const TgtdConnection &connection : connections)
        if (connection.initiator == initiator) {
            found = connection;
            return 0;
        }
    return fail(NORV_ERR_TIMEOUT, "the session that holds back the commands of a unit is gone");
}

int swapPath(const Tgtd &daemon, int tid, uint64_t lun, const std::string &path)
{
    return daemon.updateUnit(tid, lun, "online=0,path=" + path);
}

/// Waits until the sessions of a target that nobody may enter any more have gone with their commands.
int waitForNobody(const Tgtd &daemon, int tid)
{
    int err = 0;
    std::vector<TgtdStatistics> statistics;
    if (waitFor(drain_limit, [&] { return (err = daemon.showStatistics(tid, statistics)) || statistics.empty(); }))
        return err;
    return fail(NORV_ERR_TIMEOUT, "the commands on target %d do not end", tid);
}

} // namespace

int reopenUnit(const Tgtd &daemon, const _tag_iscsi_target_ &target, uint64_t lun, const std::string &path)
{
    if (!target.enabled) {
        const int err = waitForNobody(daemon, target.tid);
        return err ? err : swapPath(daemon, target.tid, lun, path);
    }
    const PipeSignalBlock no_signal;
    const std::string initiator = "iqn.2001-01.norv:host-" + newUuid();
    const TemporaryInitiator admitted(daemon, target.tid, initiator);
    if (admitted.error())
        return admitted.error();
    Session session;
    if (int err = logIn(daemon, target, initiator, session))
        return err;
    TgtdConnection ours;
    if (int err = findConnection(daemon, target.tid, initiator, ours))
        return err;
    size_t pings = 0;
    if (int err = stopQueue(session, lun, pings))
        return err;
    if (int err = waitForIdle(daemon, ours, target.tid, lun, pings))
        return err;
    return swapPath(daemon, target.tid, lun, path);
}

} // namespace norvhost

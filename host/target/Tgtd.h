/// One tgtd daemon, driven over its control socket.
///
/// The requests are the ones that tgtadm sends (the records of its tgtadm.h, tgt 1.0.85). tgtadm
/// itself is not run: it takes CHAP secrets as arguments, which every user sees in /proc, and it
/// returns 0 when the daemon dropped the request. The daemon's answer is a number of its own here.
///
/// Every call returns 0, NORV_ERR_START_SERVICE when the daemon does not run, or another error code
/// with its reason recorded. None of them sets an output after a failure.
#pragma once

#include "host/target/Portals.h"

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace norvhost {

/// Which daemon: the one whose units are writable, or its read-only twin. The values are those of
/// ISCSI_TARGET_AUTHORITY, the permission that brings an initiator there.
enum class Access {
    read = 1,
    read_write = 3,
};

/// The address list under which tgtd lets in everybody.
constexpr const char *any_address = "ALL";

struct TgtdUnit {
    uint64_t lun = 0;
    std::string path, scsi_id, serial;
    bool read_only = false;
    bool thin = false;
};

struct TgtdTarget {
    int tid = 0;
    std::string iqn;
    bool ready = false;
    std::vector<uint64_t> nexuses;  ///< session handles, those included whose connection is gone but not their commands
    std::vector<TgtdUnit> units;    ///< without LUN 0, tgtd's controller
    std::vector<std::string> users; ///< CHAP accounts, an outgoing one with " (outgoing)" behind it
    std::vector<std::string> names; ///< who may log in; any_address for everybody
};

struct TgtdConnection {
    uint64_t session = 0;
    uint32_t connection = 0;
    std::string initiator;
};

/// Commands of one session on one unit.
struct TgtdStatistics {
    uint64_t lun = 0;
    uint64_t session = 0;
    uint64_t submitted = 0;
    uint64_t done = 0;
    uint64_t reads_done = 0;
};

/// Reads the answer to "show targets". Initiators choose parts of that text (their alias), so that
/// only exactly the expected lines pass: false for anything else.
bool parseTargets(std::string_view text, std::vector<TgtdTarget> &targets);

class Tgtd {
public:
    explicit Tgtd(Access access, int timeout_ms = 30000) : which(access), timeout_ms(timeout_ms) {}

    Access access() const { return which; }
    int port() const { return which == Access::read ? read_only_port : read_write_port; }
    const char *name() const { return which == Access::read ? "ro" : "rw"; }

    /// What the environment variable TGT_IPC_SOCKET is for this daemon; tgtd appends ".0".
    std::string socketVariable() const;

    /// 0 when it does not run.
    pid_t processId() const;

    /// Whether it runs and answers.
    int ping() const;

    int showTargets(std::vector<TgtdTarget> &targets) const;
    int showUsers(std::vector<std::string> &users) const;
    int showPortals(std::vector<std::string> &portals) const;
    int showParameters(int tid, std::map<std::string, std::string> &parameters) const;
    /// NORV_ERR_NO_SUCH_TARGET when the daemon does not carry it.
    int showConnections(int tid, std::vector<TgtdConnection> &connections) const;
    int showStatistics(int tid, std::vector<TgtdStatistics> &statistics) const;
    /// Bytes sent on a connection since it was made.
    int showBytesSent(uint64_t session, uint32_t connection, uint64_t &bytes) const;

    int createTarget(int tid, const std::string &iqn) const;
    int deleteTarget(int tid, bool &busy) const;
    int setReady(int tid, bool ready) const;
    int setParameter(int tid, const char *key, const std::string &value) const;

    /// A unit without a medium: commands are refused until updateUnit() gave it a path.
    int createUnit(int tid, uint64_t lun) const;
    /// "key=value,..."; tgtd reports the failure of the last one only, so that the path comes last.
    int updateUnit(int tid, uint64_t lun, const std::string &settings) const;
    /// `busy` is set when commands are under way; the unit is still there then.
    int deleteUnit(int tid, uint64_t lun, bool &busy) const;

    int createUser(const std::string &user, const std::string &secret) const;
    int deleteUser(const std::string &user) const;
    int bindUser(int tid, const std::string &user, bool outgoing) const;
    int unbindUser(int tid, const std::string &user, bool outgoing) const;

    /// `name` may be any_address. `added` is false when it was bound before.
    int bindInitiator(int tid, const std::string &name, bool *added = nullptr) const;
    int unbindInitiator(int tid, const std::string &name) const;

    /// Ends a connection that may have ended by itself.
    int closeConnection(int tid, const TgtdConnection &connection) const;

private:
    struct Request;

    int call(const Request &request, std::string *answer = nullptr) const;
    int exchange(const Request &request, std::string *answer, uint32_t &daemon_error) const;

    Access which;
    int timeout_ms;
};

} // namespace norvhost

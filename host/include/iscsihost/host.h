/// The host platform as its front ends see it: what the storage SDK's functions have no call for.
///
/// Unless it says otherwise, a function returns 0 or an error code of the shared code space, with its reason in
/// iscsi_host_last_error(); outputs are set on success only; nothing throws.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#define ISCSI_HOST_API __attribute__((visibility("default")))

/// Why the latest failing call of this thread into the platform failed: one line without control characters and
/// without secrets, empty when nothing failed yet. Owned by the platform, valid until the thread's next failing call.
extern "C" ISCSI_HOST_API const char *iscsi_host_last_error(void);

namespace iscsihost {

/// Makes the state, and the UUID and the keys by which other appliances know this one; what is there stays.
ISCSI_HOST_API int init(std::string &node_uuid);

/// A folder that LUNs may live in.
struct Volume {
    std::string path;
    std::string image; ///< the file mounted there, empty for a volume that somebody else mounts
    bool mounted = false;
    bool read_only = false;
    uint64_t size_bytes = 0; ///< 0 while it is not mounted
    uint64_t free_bytes = 0;
    int luns = 0;
};

/// Registers a folder on a mounted file system.
ISCSI_HOST_API int addVolume(const std::string &folder);

/// Makes an image file of `size` bytes (300 MiB or more) with an XFS in it, mounts it at `folder` and registers it.
/// With an empty `image` the file is made below the state folder; an existing file is refused. Needs root.
ISCSI_HOST_API int createVolume(const std::string &folder, uint64_t size, const std::string &image);

/// Every volume, ascending by path.
ISCSI_HOST_API int listVolumes(std::vector<Volume> &volumes);

/// Forgets a volume without LUNs; one that was created is unmounted, and its image file stays (`kept_image`).
ISCSI_HOST_API int removeVolume(const std::string &folder, std::string &kept_image);

/// What a sweep did; paths, except `failed`, which holds reasons.
struct SweepReport {
    std::vector<std::string> removed; ///< files of no LUN, left by something that was killed
    std::vector<std::string> mended;  ///< files that got the name back that their LUN's row says
    std::vector<std::string> foreign; ///< LUN files of another state store; they stay
    std::vector<std::string> failed;
};

/// Puts right what killed processes left behind on the mounted volumes.
ISCSI_HOST_API int sweep(SweepReport &report);

/// As init(). Mounts the created volumes, sweeps, starts the iSCSI daemons that do not run and makes them show what
/// the state says. What could not be done is in `report.failed`, and the first code of it is returned.
ISCSI_HOST_API int boot(SweepReport &report);

/// After boot(): restarts daemons that die, until SIGTERM or SIGINT.
ISCSI_HOST_API int supervise();

/// Stops the daemons. Sessions end; the state stays.
ISCSI_HOST_API int stop();

/// The IP addresses that initiators connect to, with spaces between them; "all" for every address of the machine.
/// Takes effect when the daemons start.
ISCSI_HOST_API int setPortal(const std::string &addresses);
ISCSI_HOST_API int getPortal(std::string &addresses);

struct UnhealthyLun {
    int lid;
    std::string name;
    std::string reason;
};

struct Status {
    bool service_alive = false; ///< all daemons answer
    std::string portal;
    int tls_port = 0;        ///< where sendings are taken in inside TLS; 0 while they are not
    std::string tls_problem; ///< why not
    int luns = 0;
    int targets = 0;
    std::vector<Volume> volumes;
    std::vector<UnhealthyLun> unhealthy;
};

ISCSI_HOST_API int status(Status &status);

/// Held while a target's masking is read, changed and written back, so that two such changes at once both last.
class ISCSI_HOST_API MaskingChange {
public:
    MaskingChange();
    ~MaskingChange();
    MaskingChange(const MaskingChange &) = delete;
    MaskingChange &operator=(const MaskingChange &) = delete;

    /// Waits for other changes of the target's masking to end. The object's end lets the next one go on.
    int begin(int tid);

private:
    struct Lock;
    std::unique_ptr<Lock> lock;
};

/// What the storage SDK has no call for on a snapshot, named by its UUID.

/// A snapshot that its user locked is not deleted.
ISCSI_HOST_API int setSnapshotUserLock(const std::string &uuid, bool locked);

/// At most 1023 bytes.
ISCSI_HOST_API int setSnapshotNote(const std::string &uuid, const std::string &note);

/// The LUN number under which a loaded snapshot is read in every target of its LUN; 0 when it is not loaded.
ISCSI_HOST_API int snapshotLunNumber(const std::string &uuid, int &number);

/// A name that is free on the LUN, of the characters that LUN names may have.
ISCSI_HOST_API int renameSnapshot(const std::string &uuid, const std::string &name);

/// Jobs of LUNs. A LUN has at most one of each kind, and they go with it. What is due is run by
/// `iscsi-host schedule run-due`, which a system timer or cron calls each minute.
struct Schedule {
    int64_t id = 0;
    std::string kind; ///< "snapshot": takes a snapshot of the LUN; "backup": only looked up and removed here
    int lid = 0;
    std::string lun_name;
    std::string rule;
    int64_t next_run = 0; ///< seconds since the epoch
    int64_t last_run = 0; ///< 0: did not run yet
};

/// Stores a job. The rule is
/// - an interval, 1 minute to 1 year: "15m", "1h", "2d", "1w", counted from now;
/// - five fields as cron has them, in local time: minute, hour, day of the month, month, day of the week; with ranges
///   "1-5", lists "1,3", steps "*/15" and "0-30/10", names "jan", "mon"; day 7 is Sunday; a day comes when either of
///   two restricted day fields says so; or
/// - "hourly", "daily", "weekly" or "monthly".
/// NORV_ERR_BAD_PARAMETER names the field that is wrong.
ISCSI_HOST_API int addSchedule(const std::string &kind, int lid, const std::string &rule, int64_t &id);

/// Every schedule, ascending by ID.
ISCSI_HOST_API int listSchedules(std::vector<Schedule> &schedules);

ISCSI_HOST_API int removeSchedule(int64_t id);

/// A job that run-due has run.
struct ScheduleRun {
    Schedule schedule;
    int code = 0;       ///< 0, else an error code
    std::string reason; ///< one line, empty when it succeeded
};

/// Claims the snapshot jobs that are due, so that no other caller runs them, and runs `iscsictl snapshot take` for
/// each. Runs missed while the machine was off are one run. `runs` is set also when some of them failed, whose first
/// code is returned then.
ISCSI_HOST_API int runDueSchedules(std::vector<ScheduleRun> &runs);

/// How many snapshots of a LUN are kept. Each rule keeps for itself; a snapshot goes when no rule keeps it. A locked
/// snapshot and one from the future stay and do not count. A slot is an hour, day or week of local time, the week from
/// Monday; only slots that have a snapshot count, and the newest in it is kept: a wrong clock deletes no more than a
/// right one.
struct RetentionPolicy {
    int newest = 0; ///< the newest so many
    int hourly = 0; ///< one of each of the latest so many hours
    int daily = 0;
    int weekly = 0;
};

/// Stores a LUN's policy in place of an earlier one. A policy without a rule is refused: it would keep nothing.
ISCSI_HOST_API int setRetentionPolicy(int lid, const RetentionPolicy &policy);

/// All zero for a LUN without a policy: it keeps all.
ISCSI_HOST_API int getRetentionPolicy(int lid, RetentionPolicy &policy);

ISCSI_HOST_API int removeRetentionPolicy(int lid);

struct RetentionVerdict {
    std::string uuid;
    int snapshot_id = 0;
    std::string name;
    int64_t time = 0; ///< seconds since the epoch
    bool kept = false;
    std::string reason; ///< why it stays or goes
};

/// What the LUN's policy would do now, newest first; nothing is deleted. `policy` is tried in place of the stored one
/// unless it is null.
ISCSI_HOST_API int tryRetention(int lid, const RetentionPolicy *policy, std::vector<RetentionVerdict> &verdicts);

/// An entry of the system event log. The newest 10,000 are kept.
struct Event {
    int64_t id = 0;   ///< ascending, never used twice
    int64_t time = 0; ///< seconds since the epoch
    int scope = 0;    ///< 1: the system's log, 9: the snapshot and replication log
    int level = 0;    ///< 1: information, 2: warning, 3: error
    unsigned number = 0;
    std::string message; ///< one line
};

/// The newest `count` events with an ID above `since`, ascending by ID.
ISCSI_HOST_API int listEvents(int64_t since, int64_t count, std::vector<Event> &events);

} // namespace iscsihost

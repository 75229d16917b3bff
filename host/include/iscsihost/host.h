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

/// Mounts the created volumes, sweeps, starts the iSCSI daemons that do not run and makes them show what the state
/// says. What could not be done is in `report.failed`, and the first code of it is returned.
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

/// Stores a job of a LUN, of the kind "backup" or "snapshot", one of each for a LUN. It goes with its LUN.
ISCSI_HOST_API int addSchedule(const std::string &kind, int lid, const std::string &rule, int64_t &id);

/// Stores the retention policy of an object, in place of an earlier one: kind "Lun#", key = the LUN ID in decimal.
ISCSI_HOST_API int setRetentionPolicy(const std::string &kind, const std::string &key, const std::string &policy);

} // namespace iscsihost

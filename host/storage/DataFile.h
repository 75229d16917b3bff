/// Data files: what is done to the file behind a LUN. The state's rows are the callers' matter.
#pragma once

#include "host/core/Lock.h"
#include "platform/iscsi_lun.h"

#include <cstdint>
#include <functional>
#include <string>

namespace norvhost {

/// Makes a file in an existing folder: it appears under its name only complete and durable, or not at all. `fill`
/// writes it. NORV_ERR_OUT_OF_SPACE, NORV_ERR_NO_PERMISSION (also for a read-only volume), NORV_ERR_FILE_EXISTS.
int makeFile(const std::string &path, const std::function<int(int fd)> &fill);

/// Makes the LUN's map file by makeFile(), empty; NORV_ERR_LUN_SIZE for more than the file system's largest file.
int createDataFile(const _tag_iscsi_lun_ &lun, LunLock &progress);

/// Makes the LUN's map file by makeFile() with the data that `fill` writes.
int createDataFile(const _tag_iscsi_lun_ &lun, const std::function<int(int fd)> &fill);

/// Sets the size of a map file, allocated in full where the LUN's kind is.
int sizeDataFile(int fd, const _tag_iscsi_lun_ &lun, uint64_t from, uint64_t to, LunLock &progress);

/// Grows the map file to `size`; after a failure it has its old size.
int growDataFile(const _tag_iscsi_lun_ &lun, uint64_t size, LunLock &progress);

/// Cuts a file that growDataFile() grew back to the LUN's size.
void undoGrowth(const _tag_iscsi_lun_ &lun);

/// Gives the file a new name on the same volume. It has both names while `commit` runs, so that whichever the
/// state names is there; a failing commit leaves the old one.
int moveDataFile(const _tag_iscsi_lun_ &from, const _tag_iscsi_lun_ &to, const std::function<int()> &commit);

/// Makes a folder durably; an existing one is left as it is.
int makeDataFolder(const std::string &folder);

/// Flushes what was made, renamed or removed in a folder.
int flushFolder(const std::string &folder);

/// "<folder>" of "<folder>/<name>".
std::string parentOf(const std::string &path);

/// Removes a file durably; one that is not there is no failure.
int removeDataFile(const std::string &path);

/// As removeDataFile(), for a file that no row names any more: what cannot be removed now is logged, and the next
/// sweep removes it.
void dropDataFile(const std::string &path);

/// 0 when the LUN's data is there with at least the LUN's size: NORV_ERR_FILE_NOT_FOUND, NORV_ERR_BAD_FILE_TYPE,
/// NORV_ERR_LUN_SIZE.
int checkData(const _tag_iscsi_lun_ &lun);

/// Who made a data file.
struct FileMark {
    std::string store;    ///< storeIdentity() of its maker; empty for a file without marks
    std::string uuid;     ///< of its LUN
    std::string snapshot; ///< UUID of its snapshot; empty for a map file
};
FileMark readFileMark(const std::string &path);
int writeFileMark(int fd, const std::string &uuid, const std::string &snapshot);

/// Size of a block device that nobody else uses: NORV_ERR_LUN_LOCATION when it is none or is in use.
int freeDeviceSize(const std::string &path, uint64_t &size);

} // namespace norvhost

/// Volumes: the registered folders that LUNs may live in.
///
/// A volume counts only while the file system it was registered on is mounted: an empty mount point is not taken for
/// it, so that no LUN lands beneath one.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace norvhost {

struct VolumeRow {
    std::string path;        ///< canonical
    std::string mount_point; ///< of the file system that the path lay on when it was registered
    std::string image;       ///< the file that we mount there, empty where somebody else mounts
};

// Each returns 0 or an error code.

/// Every volume, ascending by path.
int loadVolumes(std::vector<VolumeRow> &rows);

/// The volume registered under exactly this path, else NORV_ERR_LUN_LOCATION.
int loadVolume(const std::string &path, VolumeRow &row);

/// 0 when the volume's file system is mounted, else NORV_ERR_VOLUME_INFO.
int checkMounted(const VolumeRow &row);

/// Registers a folder on a mounted, writable file system that can do what LUNs need: files that get their name when
/// they are complete, extended attributes, a second name for a file.
int addVolume(const std::string &folder);

/// Makes a sparse image file (an existing one is refused) with an XFS that shares blocks between files, mounts it at
/// the folder and registers it. With an empty `image` the file is made below the state folder. Needs root.
int createVolume(const std::string &folder, uint64_t size, const std::string &image);

/// Forgets a volume that no LUN lives on, and unmounts it if we mounted it; its image file stays and is named.
int removeVolume(const std::string &folder, std::string &kept_image);

/// Mounts a volume of createVolume() that is not mounted.
int mountVolume(const VolumeRow &row);

/// LUNs on the volume.
int countLuns(const std::string &path, int &count);

/// The identity of this state store, which marks the data files that it made.
int storeIdentity(std::string &identity);

} // namespace norvhost

#include "host/storage/Volumes.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/core/Process.h"
#include "host/state/Database.h"
#include "host/storage/MapFile.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <sys/stat.h>
#include <sys/xattr.h>

namespace norvhost {
namespace {

/// What mkfs.xfs accepts at least.
constexpr uint64_t smallest_image = 300 << 20;

/// Seconds for mkfs, mount and umount.
constexpr int program_limit = 120;

/// A path longer than this leaves no room for the name of any LUN's file.
constexpr size_t longest_path = map_file_path_size - sizeof "/@iSCSITrg/iSCSI_1024_Extent_n_00000";

bool isMountRoot(const std::string &path)
{
    struct statx status;
    return statx(AT_FDCWD, path.c_str(), AT_NO_AUTOMOUNT, STATX_TYPE, &status) == 0 &&
           (status.stx_attributes & STATX_ATTR_MOUNT_ROOT);
}

std::string mountPointOf(std::string path)
{
    while (path.size() > 1 && !isMountRoot(path))
        path.erase(std::max<size_t>(path.rfind('/'), 1));
    return path;
}

int canonicalFolder(const std::string &folder, std::string &path)
{
    const std::unique_ptr<char, decltype(&free)> resolved(realpath(folder.c_str(), nullptr), free);
    if (!resolved)
        return failErrno(NORV_ERR_LUN_LOCATION, errno, "cannot find the folder '%s'", folder.c_str());
    path = resolved.get();
    struct stat status;
    if (stat(path.c_str(), &status) != 0 || !S_ISDIR(status.st_mode))
        return fail(NORV_ERR_LUN_LOCATION, "'%s' is no folder", path.c_str());
    if (path == "/")
        return fail(NORV_ERR_LUN_LOCATION, "the root folder cannot be a volume");
    if (path.size() > longest_path)
        return fail(NORV_ERR_LUN_LOCATION, "the path has %zu bytes, %zu are allowed", path.size(), longest_path);
    if (std::any_of(path.begin(), path.end(), [](unsigned char c) { return c < ' ' || c == 0x7f; }))
        return fail(NORV_ERR_LUN_LOCATION, "the path '%s' holds control characters", path.c_str());
    // Readers of map files look for them with patterns made of the path.
    if (path.find_first_of("*?[\\") != std::string::npos)
        return fail(NORV_ERR_LUN_LOCATION, "the path '%s' holds one of * ? [ \\", path.c_str());
    return 0;
}

/// Tries on a nameless file what LUNs need.
int probeFileSystem(const std::string &path)
{
    const FileDescriptor file(open(path.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
    if (!file && errno == EOPNOTSUPP)
        return fail(NORV_ERR_BAD_FILE_SYSTEM_TYPE,
                    "the file system of %s has no nameless files (O_TMPFILE); "
                    "XFS, ext4 and btrfs have",
                    path.c_str());
    if (!file)
        return failErrno(NORV_ERR_LUN_LOCATION, errno, "cannot make files in %s", path.c_str());
    if (fsetxattr(file.get(), "user.norv.probe", "", 0, 0) != 0)
        return failErrno(NORV_ERR_BAD_FILE_SYSTEM_TYPE, errno, "the file system of %s takes no extended attributes",
                         path.c_str());
    return 0;
}

int insertVolume(const VolumeRow &row)
{
    Query query("INSERT INTO volumes (path, mount_point, image) VALUES (?1, ?2, ?3)");
    if (int err = query.bind(row.path).bind(row.mount_point).bind(row.image).run())
        return query.violates("volumes.path") ? fail(NORV_ERR_FILE_EXISTS, "%s is a volume already", row.path.c_str())
                                              : err;
    return 0;
}

/// Runs one of the system's programs; its last words become the reason.
int runTool(std::vector<std::string> arguments, int code)
{
    ProgramRun run;
    run.arguments = std::move(arguments);
    run.timeout_seconds = program_limit;
    ProgramResult result;
    if (int err = runProgram(run, result))
        return err;
    if (result.status == 0)
        return 0;
    return fail(code, "%s failed: %s", run.arguments[0].c_str(), lastLine(result.errors).c_str());
}

int mountImage(const std::string &image, const std::string &path)
{
    return runTool({"mount", "-t", "xfs", "-o", "loop,nosuid,nodev", "--", image, path}, NORV_ERR_VOLUME_INFO);
}

int unmount(const std::string &path)
{
    return runTool({"umount", "--", path}, NORV_ERR_VOLUME_INFO);
}

/// <state>/volumes/<path with dashes>.img
int defaultImage(const std::string &path, std::string &image)
{
    const std::string folder = stateFolder() + "/volumes";
    if (int err = makeFolder(folder))
        return err;
    std::string name = path.substr(1);
    std::replace(name.begin(), name.end(), '/', '-');
    image = folder + "/" + name + ".img";
    return 0;
}

int makeImage(const std::string &image, uint64_t size)
{
    const FileDescriptor file(open(image.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    if (!file)
        return failErrno(errno == EEXIST ? NORV_ERR_FILE_EXISTS : NORV_ERR_OPEN_FILE, errno,
                         "cannot make the image file %s", image.c_str());
    if (ftruncate(file.get(), static_cast<off_t>(size)) != 0)
        return failErrno(NORV_ERR_TRUNCATE_FILE, errno, "cannot set the size of the image file %s", image.c_str());
    return runTool({"mkfs.xfs", "-q", "-m", "reflink=1", image}, NORV_ERR_BAD_FILE_SYSTEM_TYPE);
}

int registerMounted(const std::string &path, const std::string &image)
{
    if (int err = probeFileSystem(path))
        return err;
    return insertVolume({path, mountPointOf(path), image});
}

int checkEmptyFolder(const std::string &path)
{
    if (isMountRoot(path))
        return fail(NORV_ERR_FILE_EXISTS, "something is mounted at %s already", path.c_str());
    std::error_code error;
    if (!std::filesystem::is_empty(path, error))
        return fail(NORV_ERR_FILE_EXISTS, "the folder %s is not empty: a volume would hide what it holds",
                    path.c_str());
    return 0;
}

int createInFolder(const std::string &folder, uint64_t size, const std::string &image)
{
    VolumeRow row;
    if (int err = canonicalFolder(folder, row.path))
        return err;
    if (int err = checkEmptyFolder(row.path))
        return err;
    // Absolute: the row outlives this process's working folder.
    std::error_code error;
    row.image = std::filesystem::absolute(image, error);
    if (image.empty())
        if (int err = defaultImage(row.path, row.image))
            return err;

    if (int err = makeImage(row.image, size)) {
        if (err != NORV_ERR_FILE_EXISTS)
            unlink(row.image.c_str());
        return err;
    }
    int err = mountImage(row.image, row.path);
    if (!err && (err = registerMounted(row.path, row.image)) != 0) {
        const KeptError kept;
        unmount(row.path);
    }
    if (err)
        unlink(row.image.c_str());
    return err;
}

int checkNoLuns(const std::string &path)
{
    int luns = 0;
    if (int err = countLuns(path, luns))
        return err;
    return luns == 0 ? 0 : fail(NORV_ERR_REMOVE_CONFIG, "%d LUN(s) live on %s: delete them first", luns, path.c_str());
}

} // namespace

int loadVolumes(std::vector<VolumeRow> &rows)
{
    std::vector<VolumeRow> all;
    Query query("SELECT path, mount_point, image FROM volumes ORDER BY path");
    while (query.next())
        all.push_back({std::string(query.text(0)), std::string(query.text(1)), std::string(query.text(2))});
    if (query.error())
        return query.error();
    rows = std::move(all);
    return 0;
}

int loadVolume(const std::string &path, VolumeRow &row)
{
    Query query("SELECT path, mount_point, image FROM volumes WHERE path = ?1");
    if (!query.bind(path).next())
        return query.error()
                   ? query.error()
                   : fail(NORV_ERR_LUN_LOCATION, "'%s' is no volume (iscsi-host volume list shows them)", path.c_str());
    row = {std::string(query.text(0)), std::string(query.text(1)), std::string(query.text(2))};
    return 0;
}

int checkMounted(const VolumeRow &row)
{
    struct stat status;
    if (stat(row.path.c_str(), &status) == 0 && S_ISDIR(status.st_mode) && mountPointOf(row.path) == row.mount_point)
        return 0;
    return fail(NORV_ERR_VOLUME_INFO, "the volume %s is not mounted (%s)", row.path.c_str(),
                row.image.empty() ? "mount its file system" : "iscsi-host boot mounts it");
}

int addVolume(const std::string &folder)
{
    std::string path;
    if (int err = canonicalFolder(folder, path))
        return err;
    return registerMounted(path, "");
}

int createVolume(const std::string &folder, uint64_t size, const std::string &image)
{
    if (size < smallest_image || size > INT64_MAX || size % 4096 != 0)
        return fail(NORV_ERR_LUN_SIZE, "an XFS volume has at least 300 MiB, in whole 4096-byte blocks");
    const bool made = mkdir(folder.c_str(), 0755) == 0;
    if (!made && errno != EEXIST)
        return failErrno(NORV_ERR_MAKE_DIRECTORY, errno, "cannot make the folder '%s'", folder.c_str());
    const int err = createInFolder(folder, size, image);
    if (err && made)
        rmdir(folder.c_str());
    return err;
}

int removeVolume(const std::string &folder, std::string &kept_image)
{
    std::string path = folder;
    VolumeRow row;
    if (loadVolume(path, row) != 0) {
        if (int err = canonicalFolder(folder, path))
            return err;
        if (int err = loadVolume(path, row))
            return err;
    }
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = checkNoLuns(path))
        return err;
    if (!row.image.empty() && checkMounted(row) == 0)
        if (int err = unmount(path))
            return err;
    Query query("DELETE FROM volumes WHERE path = ?1");
    if (int err = query.bind(path).run())
        return err;
    if (int err = transaction.commit())
        return err;
    kept_image = row.image;
    return 0;
}

int mountVolume(const VolumeRow &row)
{
    if (row.image.empty() || checkMounted(row) == 0)
        return 0;
    if (int err = mountImage(row.image, row.path))
        return err;
    return checkMounted(row);
}

int countLuns(const std::string &path, int &count)
{
    Query query("SELECT count(*) FROM luns WHERE location = ?1 AND type <> ?2");
    if (!query.bind(path).bind(static_cast<int>(NORV_LUN_TYPE_BLOCK)).next())
        return query.error();
    count = query.integer(0);
    return 0;
}

int storeIdentity(std::string &identity)
{
    return getSetting("store", "", identity);
}

} // namespace norvhost

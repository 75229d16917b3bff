#include "host/storage/FileClone.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>
#include <vector>

namespace norvhost {
namespace {

constexpr size_t copy_step = 256 << 10; // larger ones do not stay in the processor's cache

int fileSize(int fd, uint64_t &size)
{
    struct stat status;
    if (fstat(fd, &status) != 0)
        return failErrno(NORV_ERR_STAT_PATH, errno, "cannot look at a data file");
    size = static_cast<uint64_t>(status.st_size);
    return 0;
}

int copyRange(int from, int to, uint64_t begin, uint64_t end, std::vector<char> &buffer)
{
    while (begin < end) {
        const size_t wanted = static_cast<size_t>(std::min<uint64_t>(end - begin, buffer.size()));
        const ssize_t count = pread(from, buffer.data(), wanted, static_cast<off_t>(begin));
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return failErrno(NORV_ERR_READ_FILE, count < 0 ? errno : EIO, "cannot read a data file");
        for (ssize_t written = 0; written < count;) {
            const ssize_t step = pwrite(to, buffer.data() + written, static_cast<size_t>(count - written),
                                        static_cast<off_t>(begin) + written);
            if (step < 0 && errno != EINTR)
                return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot write a data file");
            written += std::max<ssize_t>(step, 0);
        }
        begin += static_cast<uint64_t>(count);
    }
    return 0;
}

int punchHole(int fd, uint64_t begin, uint64_t end)
{
    if (begin < end && fallocate(fd, FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, static_cast<off_t>(begin),
                                 static_cast<off_t>(end - begin)) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot make a hole in a data file");
    return 0;
}

/// Starts writing out what was copied, and waits for what was copied before: the disk works while we read, and neither
/// the final flush nor a stop has much to wait for.
class WriteBehind {
public:
    explicit WriteBehind(int fd) : fd(fd) {}

    /// For ascending ranges.
    void wrote(uint64_t begin, uint64_t end)
    {
        copied += end - begin;
        if (copied < step)
            return;
        // Hints only: a failure to write is told by the fsync() that follows.
        sync(started, end, SYNC_FILE_RANGE_WRITE);
        sync(finished, started, SYNC_FILE_RANGE_WAIT_BEFORE | SYNC_FILE_RANGE_WRITE | SYNC_FILE_RANGE_WAIT_AFTER);
        finished = started;
        started = end;
        copied = 0;
    }

private:
    static constexpr uint64_t step = 16 << 20;

    void sync(uint64_t begin, uint64_t end, unsigned flags)
    {
        if (begin < end)
            sync_file_range(fd, static_cast<off_t>(begin), static_cast<off_t>(end - begin), flags);
    }

    int fd;
    uint64_t finished = 0, started = 0; ///< the disk has what lies before, and works on what lies between
    uint64_t copied = 0;                ///< bytes that it was not told of yet
};

/// Copies the data between holes, and makes holes where `to`, up to its old size, may hold data.
int copyExtents(int from, int to, uint64_t old_size, const BytesProgress &progress)
{
    uint64_t size = 0, done = 0;
    if (int err = fileSize(from, size))
        return err;
    posix_fadvise(from, 0, 0, POSIX_FADV_SEQUENTIAL);
    WriteBehind behind(to);
    std::vector<char> buffer(copy_step);
    for (uint64_t at = 0, begin = 0, end = 0; at < size; at = end) {
        if (int err = findData(from, at, size, begin, end))
            return err;
        if (int err = punchHole(to, at, std::min(begin, old_size)))
            return err;
        for (uint64_t part = begin; part < end; part += copy_step) {
            const uint64_t part_end = std::min<uint64_t>(part + copy_step, end);
            if (int err = progress(done))
                return err;
            if (int err = copyRange(from, to, part, part_end, buffer))
                return err;
            behind.wrote(part, part_end);
            done += part_end - part;
        }
    }
    return progress(done);
}

/// Once for each volume: the administrator chose the file system, and may choose another.
void sayThatItCopies(const std::string &volume)
{
    static const char *const text = "the file system of %s cannot share blocks between files: snapshots and clones "
                                    "copy their data";
    std::string said;
    const std::string key = "copies:" + volume;
    if (getSetting(key.c_str(), "", said) == 0 && said.empty() && setSetting(key.c_str(), "said") == 0)
        syslog(LOG_WARNING, text, volume.c_str());
}

} // namespace

int shareBlocks(int from, int to, bool &shared)
{
    struct stat source, target;
    if (fstat(from, &source) != 0 || fstat(to, &target) != 0)
        return failErrno(NORV_ERR_STAT_PATH, errno, "cannot look at a data file");
    // A part of a block can be shared only where both files end.
    const off_t tail = target.st_size > source.st_size ? source.st_size % source.st_blksize : 0;
    file_clone_range range = {};
    range.src_fd = from;
    range.src_length = tail ? static_cast<uint64_t>(source.st_size - tail) : 0;
    shared = true;
    if (ioctl(to, FICLONERANGE, &range) != 0) {
        if (errno == EOPNOTSUPP || errno == ENOTTY || errno == EXDEV || errno == EINVAL) {
            shared = false;
            return 0;
        }
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot clone a data file");
    }
    std::vector<char> buffer(static_cast<size_t>(tail));
    return copyRange(from, to, static_cast<uint64_t>(source.st_size - tail), static_cast<uint64_t>(source.st_size),
                     buffer);
}

int findData(int fd, uint64_t at, uint64_t size, uint64_t &begin, uint64_t &end)
{
    const off_t data = lseek(fd, static_cast<off_t>(at), SEEK_DATA);
    if (data < 0 && errno != ENXIO)
        return failErrno(NORV_ERR_READ_FILE, errno, "cannot look for data in a file");
    const off_t hole = data < 0 ? -1 : lseek(fd, data, SEEK_HOLE);
    begin = data < 0 ? size : std::min(static_cast<uint64_t>(data), size);
    end = hole < 0 ? size : std::min(static_cast<uint64_t>(hole), size);
    return 0;
}

int isBlank(int fd, uint64_t size, bool &blank)
{
    uint64_t begin = 0, end = 0;
    if (int err = findData(fd, 0, size, begin, end))
        return err;
    blank = begin >= size;
    return 0;
}

int countData(int fd, uint64_t &bytes)
{
    uint64_t size = 0;
    if (int err = fileSize(fd, size))
        return err;
    bytes = 0;
    for (uint64_t at = 0, begin = 0, end = 0; at < size; at = end) {
        if (int err = findData(fd, at, size, begin, end))
            return err;
        bytes += end - begin;
    }
    return 0;
}

int copyData(int from, int to, const BytesProgress &progress)
{
    return copyExtents(from, to, 0, progress);
}

int copySparsely(int from, int to, const CopyProgress &progress)
{
    uint64_t size = 0, target_size = 0, total = 0;
    if (int err = fileSize(from, size))
        return err;
    if (int err = fileSize(to, target_size))
        return err;
    if (int err = countData(from, total))
        return err;
    if (target_size < size && ftruncate(to, static_cast<off_t>(size)) != 0)
        return failErrno(NORV_ERR_TRUNCATE_FILE, errno, "cannot set the size of a data file");
    return copyExtents(from, to, target_size,
                       [&](uint64_t done) { return progress(static_cast<int>(done / (total / 100 + 1))); });
}

int cloneLunData(const LunRow &lun, int from, int to, const CopyProgress &progress)
{
    bool shared = false;
    if (int err = shareBlocks(from, to, shared))
        return err;
    if (shared)
        return 0;
    bool in_use = true;
    if (int err = isInUse(lun, in_use))
        return err;
    if (in_use)
        return fail(NORV_ERR_LUN_MAPPED,
                    "the file system of %s cannot share blocks between files, and a copy made while initiators use "
                    "the LUN would not be of one point in time: unmap or unload the LUN first",
                    lun.record.location);
    sayThatItCopies(lun.record.location);
    return copySparsely(from, to, progress);
}

} // namespace norvhost

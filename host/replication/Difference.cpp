#include "host/replication/Difference.h"

#include "host/core/LastError.h"
#include "host/storage/FileClone.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <linux/fiemap.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace norvhost {
namespace {

/// Data of a file and where it lies on the disk.
struct Extent {
    uint64_t begin = 0;
    uint64_t end = 0;
    uint64_t physical = 0;
    bool located = false; ///< equal places on the disk are equal data, and different ones are taken as different data
};

constexpr uint32_t UNLOCATED = FIEMAP_EXTENT_UNKNOWN | FIEMAP_EXTENT_DELALLOC | FIEMAP_EXTENT_ENCODED |
                               FIEMAP_EXTENT_DATA_ENCRYPTED | FIEMAP_EXTENT_NOT_ALIGNED | FIEMAP_EXTENT_DATA_INLINE |
                               FIEMAP_EXTENT_DATA_TAIL;

int cannotMap()
{
    return failErrno(NORV_ERR_READ_FILE, errno, "cannot see where a file has data");
}

/// Without an extent map the holes can still be told.
int findExtents(int fd, uint64_t size, std::vector<Extent> &extents)
{
    for (uint64_t at = 0; at < size;) {
        Extent extent;
        if (int err = findData(fd, at, size, extent.begin, extent.end))
            return err;
        if (extent.begin < extent.end)
            extents.push_back(extent);
        at = extent.end;
    }
    return 0;
}

int mapExtents(int fd, uint64_t size, std::vector<Extent> &extents)
{
    constexpr uint32_t BATCH = 4096;
    std::vector<uint64_t> buffer((sizeof(struct fiemap) + BATCH * sizeof(struct fiemap_extent)) / sizeof(uint64_t) + 1);
    auto *map = reinterpret_cast<struct fiemap *>(buffer.data());
    for (uint64_t at = 0; at < size;) {
        memset(map, 0, sizeof *map);
        map->fm_start = at;
        map->fm_length = size - at;
        map->fm_flags = FIEMAP_FLAG_SYNC;
        map->fm_extent_count = BATCH;
        if (ioctl(fd, FS_IOC_FIEMAP, map) != 0) {
            if (errno != EOPNOTSUPP && errno != ENOTTY && errno != EBADR)
                return cannotMap();
            extents.clear();
            return findExtents(fd, size, extents);
        }
        if (map->fm_mapped_extents == 0)
            return 0;
        for (uint32_t i = 0; i < map->fm_mapped_extents; ++i) {
            const struct fiemap_extent &found = map->fm_extents[i];
            at = found.fe_logical + found.fe_length;
            Extent extent;
            extent.begin = found.fe_logical;
            extent.end = std::min<uint64_t>(at, size);
            extent.physical = found.fe_physical;
            extent.located = !(found.fe_flags & UNLOCATED);
            const bool data = !(found.fe_flags & FIEMAP_EXTENT_UNWRITTEN);
            if (data && extent.begin < extent.end)
                extents.push_back(extent);
            if (found.fe_flags & FIEMAP_EXTENT_LAST)
                return 0;
        }
    }
    return 0;
}

/// Goes along a file's extents.
class Walk {
public:
    explicit Walk(const std::vector<Extent> &extents) : next(extents.data()), last(next + extents.size()) {}

    /// The extent that covers `at`, null in a hole. Calls come with ascending places.
    const Extent *covering(uint64_t at)
    {
        while (next != last && next->end <= at)
            ++next;
        return next != last && next->begin <= at ? next : nullptr;
    }

    /// Where that extent or hole ends, at most `limit`; after covering().
    uint64_t boundary(uint64_t at, uint64_t limit) const
    {
        if (next == last)
            return limit;
        return std::min(limit, next->begin <= at ? next->end : next->begin);
    }

private:
    const Extent *next;
    const Extent *last;
};

class Builder {
public:
    explicit Builder(std::vector<DataRange> &out) : out(out) {}

    void add(uint64_t begin, uint64_t end, bool zeros)
    {
        if (!out.empty() && out.back().offset + out.back().length == begin && out.back().zeros == zeros)
            out.back().length += end - begin;
        else
            out.push_back({begin, end - begin, zeros});
    }

private:
    std::vector<DataRange> &out;
};

int readAt(int fd, uint64_t offset, char *buffer, size_t length)
{
    for (size_t done = 0; done < length;) {
        const ssize_t got = pread(fd, buffer + done, length - done, static_cast<off_t>(offset + done));
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0)
            return failErrno(NORV_ERR_READ_FILE, errno, "cannot read a snapshot's data");
        if (got == 0) { // behind the end of a file that grew since it was the base
            memset(buffer + done, 0, length - done);
            break;
        }
        done += static_cast<size_t>(got);
    }
    return 0;
}

/// Adds those blocks of a range whose contents differ.
int compare(int base, int file, uint64_t begin, uint64_t end, Builder &out)
{
    constexpr size_t BLOCK = 64 << 10;
    static thread_local std::vector<char> ours(BLOCK), theirs(BLOCK);
    for (uint64_t at = begin; at < end; at += BLOCK) {
        const auto length = static_cast<size_t>(std::min<uint64_t>(BLOCK, end - at));
        if (int err = readAt(file, at, ours.data(), length))
            return err;
        if (int err = readAt(base, at, theirs.data(), length))
            return err;
        if (memcmp(ours.data(), theirs.data(), length) != 0)
            out.add(at, at + length, false);
    }
    return 0;
}

} // namespace

int findDifference(int base, int file, uint64_t size, std::vector<DataRange> &ranges)
{
    std::vector<Extent> old_extents, new_extents;
    if (int err = mapExtents(file, size, new_extents))
        return err;
    if (base >= 0) {
        if (int err = mapExtents(base, size, old_extents))
            return err;
    }
    ranges.clear();
    Builder out(ranges);
    Walk before(old_extents), after(new_extents);
    for (uint64_t at = 0, end = 0; at < size; at = end) {
        const Extent *was = before.covering(at);
        const Extent *is = after.covering(at);
        end = before.boundary(at, after.boundary(at, size));
        if (!was && !is)
            continue;
        if (!was || !is) {
            out.add(at, end, !is);
        } else if (was->located && is->located) {
            if (was->physical + (at - was->begin) != is->physical + (at - is->begin))
                out.add(at, end, false);
        } else if (int err = compare(base, file, at, end, out)) {
            return err;
        }
    }
    return 0;
}

int describeWhole(int file, uint64_t size, std::vector<DataRange> &ranges)
{
    std::vector<Extent> extents;
    if (int err = mapExtents(file, size, extents))
        return err;
    ranges.clear();
    Builder out(ranges);
    Walk walk(extents);
    for (uint64_t at = 0, end = 0; at < size; at = end) {
        const bool zeros = !walk.covering(at);
        end = walk.boundary(at, size);
        out.add(at, end, zeros);
    }
    return 0;
}

uint64_t dataBytes(const std::vector<DataRange> &ranges)
{
    return dataBelow(ranges, UINT64_MAX);
}

uint64_t dataBelow(const std::vector<DataRange> &ranges, uint64_t place)
{
    uint64_t bytes = 0;
    for (const DataRange &range : ranges)
        if (!range.zeros && range.offset < place)
            bytes += std::min(range.length, place - range.offset);
    return bytes;
}

std::vector<DataRange> rangesFrom(const std::vector<DataRange> &ranges, uint64_t place)
{
    std::vector<DataRange> left;
    for (const DataRange &range : ranges) {
        const uint64_t end = range.offset + range.length, begin = std::max(range.offset, place);
        if (begin < end)
            left.push_back({begin, end - begin, range.zeros});
    }
    return left;
}

} // namespace norvhost

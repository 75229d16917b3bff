#include "SnapshotTest.h"

#include "host/core/FileDescriptor.h"
#include "host/replication/Difference.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <random>
#include <sys/ioctl.h>
#include <unistd.h>

namespace norvhost {
namespace {

std::string contents(int fd, uint64_t size)
{
    std::string data(size, '\0');
    EXPECT_LE(0, pread(fd, data.data(), size, 0));
    return data;
}

/// Two files of a folder: one as it was, and one that began as its clone.
struct Pair {
    FileDescriptor base, file;
    uint64_t size = 0;

    explicit Pair(const std::string &folder)
        : base(open((folder + "/base").c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600)),
          file(open((folder + "/file").c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600))
    {
    }

    static void write(int fd, uint64_t offset, uint64_t length, char with)
    {
        const std::string data(length, with);
        ASSERT_EQ(static_cast<ssize_t>(length), pwrite(fd, data.data(), length, static_cast<off_t>(offset)));
    }

    static void clear(int fd, uint64_t offset, uint64_t length)
    {
        ASSERT_EQ(0, fallocate(fd, FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, static_cast<off_t>(offset),
                               static_cast<off_t>(length)));
    }

    void clone()
    {
        ASSERT_EQ(0, fsync(base.get()));
        if (ioctl(file.get(), FICLONE, base.get()) == 0)
            return;
        const std::string data = contents(base.get(), size); // no reflinks here
        ASSERT_EQ(0, ftruncate(file.get(), static_cast<off_t>(size)));
        ASSERT_EQ(static_cast<ssize_t>(size), pwrite(file.get(), data.data(), size, 0));
    }
};

/// Makes both files by random writes and holes, and checks that the difference leads from one to the other.
void checkRandomPair(const std::string &folder, unsigned seed)
{
    SCOPED_TRACE("seed " + std::to_string(seed));
    constexpr uint64_t BLOCK = 4096;
    std::mt19937 random(seed);
    const auto below = [&](uint64_t limit) { return random() % limit; };
    Pair pair(folder);
    const uint64_t blocks = 64 + below(512);
    pair.size = blocks * BLOCK;
    ASSERT_EQ(0, ftruncate(pair.base.get(), static_cast<off_t>(pair.size)));
    const auto change = [&](int fd, uint64_t limit, char with) {
        const uint64_t at = below(limit), length = 1 + below(std::min<uint64_t>(limit - at, 24));
        if (below(4) == 0)
            Pair::clear(fd, at * BLOCK, length * BLOCK);
        else
            Pair::write(fd, at * BLOCK, length * BLOCK, with);
    };
    for (int i = 0; i < 20; ++i)
        change(pair.base.get(), blocks, static_cast<char>('a' + i));
    pair.clone();
    const uint64_t grown = blocks + below(3) * 100;
    ASSERT_EQ(0, ftruncate(pair.file.get(), static_cast<off_t>(grown * BLOCK)));
    const uint64_t changes = below(20);
    for (uint64_t i = 0; i < changes; ++i)
        change(pair.file.get(), grown, static_cast<char>('A' + i));
    ASSERT_EQ(0, fsync(pair.file.get()));

    const std::string wanted = contents(pair.file.get(), grown * BLOCK);
    for (int kind = 0; kind < 3; ++kind) {
        SCOPED_TRACE(kind == 0 ? "from the base" : kind == 1 ? "from zeros" : "from anything");
        std::vector<DataRange> ranges;
        ASSERT_EQ(0, kind == 2
                         ? describeWhole(pair.file.get(), grown * BLOCK, ranges)
                         : findDifference(kind == 0 ? pair.base.get() : -1, pair.file.get(), grown * BLOCK, ranges))
            << iscsi_host_last_error();
        std::string copy =
            kind == 0 ? contents(pair.base.get(), grown * BLOCK) : std::string(grown * BLOCK, kind == 1 ? '\0' : '?');
        uint64_t end = 0;
        for (const DataRange &range : ranges) {
            ASSERT_LE(end, range.offset);
            ASSERT_LT(0u, range.length);
            end = range.offset + range.length;
            ASSERT_GE(grown * BLOCK, end);
            const std::string data =
                range.zeros ? std::string(range.length, '\0') : wanted.substr(range.offset, range.length);
            ASSERT_EQ(data, wanted.substr(range.offset, range.length));
            copy.replace(range.offset, range.length, data);
        }
        ASSERT_TRUE(copy == wanted);
    }
}

using DifferenceTest = HostTest;
class DifferenceTestNeedsRoot : public SnapshotTest {};

TEST_F(DifferenceTest, LeadsFromTheBaseToTheFileWhereBlocksCannotBeShared)
{
    for (unsigned seed = 0; seed < 40; ++seed)
        checkRandomPair(root, seed);
}

TEST_F(DifferenceTestNeedsRoot, LeadsFromTheBaseToTheFileWhereBlocksAreShared)
{
    for (unsigned seed = 0; seed < 80; ++seed)
        checkRandomPair(volume, seed);
}

TEST_F(DifferenceTestNeedsRoot, NamesNoMoreThanWasWritten)
{
    constexpr uint64_t SIZE = 64 * MiB, BLOCK = 64 << 10;
    Pair pair(volume);
    pair.size = SIZE;
    Pair::write(pair.base.get(), 0, SIZE, 'x');
    pair.clone();
    for (uint64_t at = 0; at < SIZE; at += 100 * BLOCK)
        Pair::write(pair.file.get(), at, BLOCK, 'y');
    ASSERT_EQ(0, fsync(pair.file.get()));
    std::vector<DataRange> ranges;
    ASSERT_EQ(0, findDifference(pair.base.get(), pair.file.get(), SIZE, ranges)) << iscsi_host_last_error();
    EXPECT_EQ((SIZE + 100 * BLOCK - 1) / (100 * BLOCK) * BLOCK, dataBytes(ranges));
}

} // namespace
} // namespace norvhost

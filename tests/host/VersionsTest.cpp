#include "HostTest.h"

#include "host/storage/Versions.h"
#include "platform/extent_pool.h"

#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace norvhost {
namespace {

struct VersionsTest : HostTest {
    std::string path;

    VersionsTest() { path = dataPath(create("a", NORV_LUN_TYPE_SINK)); }

    Versions read()
    {
        _tag_map_file_version_ info = {};
        char base[37] = "";
        EXPECT_EQ(0, NORVExtentPoolMapFileVersionInfoGet(path.c_str(), &info)) << iscsi_host_last_error();
        EXPECT_EQ(0, NORVExtentPoolMapFileBaseVersionGet(path.c_str(), base));
        EXPECT_STREQ(base, info.base_version);
        return {info.base_version, info.current_version};
    }

    void writeByte()
    {
        const int fd = open(path.c_str(), O_WRONLY);
        EXPECT_EQ(1, pwrite(fd, "x", 1, 4096));
        close(fd);
    }
};

TEST_F(VersionsTest, FollowASynchronisationAndSeeLocalWrites)
{
    const std::string first = newUuid(), second = newUuid();
    EXPECT_EQ(NORV_ZERO_UUID, read().base);
    EXPECT_EQ(NORV_ZERO_UUID, read().current);

    ASSERT_EQ(0, beginSynchronisation(path, first));
    EXPECT_EQ(NORV_ZERO_UUID, read().base);
    EXPECT_EQ(first, read().current);
    writeByte();
    ASSERT_EQ(0, finishSynchronisation(path));
    EXPECT_EQ(first, read().base);
    EXPECT_EQ(first, read().current);

    writeByte(); // at once: within the kernel's clock tick
    const std::string local = read().current;
    EXPECT_EQ(first, read().base);
    EXPECT_NE(first, local);
    EXPECT_EQ(36u, local.size());
    EXPECT_EQ(local, read().current) << "the same until the next write";

    ASSERT_EQ(0, beginSynchronisation(path, second));
    EXPECT_EQ(first, read().base) << "what arrives counts when it is complete";
    ASSERT_EQ(0, finishSynchronisation(path));
    EXPECT_EQ(second, read().base);
    EXPECT_EQ(second, read().current);
}

TEST_F(VersionsTest, TravelWithTheFile)
{
    const std::string version = newUuid();
    ASSERT_EQ(0, beginSynchronisation(path, version));
    ASSERT_EQ(0, finishSynchronisation(path));
    _tag_iscsi_lun_ lun = {};
    ASSERT_EQ(0, NORViSCSILunGetByLunName("a", &lun));
    ASSERT_EQ(0, update(lun, "b", lun.size));
    path = dataPath(reload(lun));
    EXPECT_EQ(version, read().base);
    EXPECT_EQ(version, read().current);
    ASSERT_EQ(0, update(lun, "b", 8 * MiB));
    EXPECT_NE(version, read().current) << "a growth is a change";
}

TEST_F(VersionsTest, CountsAreKeptApart)
{
    uint64_t done = 9, total = 9;
    ASSERT_EQ(0, writeTransferCount(path, Transfer::sending, {3, 10}));
    ASSERT_EQ(0, writeTransferCount(path, Transfer::copying, {UINT64_MAX - 1, UINT64_MAX}));
    EXPECT_EQ(0, NORVExtentPoolMapFileTotalCountGet(path.c_str(), &total));
    EXPECT_EQ(0, NORVExtentPoolMapFileSyncedCountGet(path.c_str(), &done));
    EXPECT_EQ(10u, total);
    EXPECT_EQ(3u, done);
    EXPECT_EQ(0, NORViSCSIChildLunSyncProgressGet(path.c_str(), &done, &total));
    EXPECT_EQ(UINT64_MAX, total);
    EXPECT_EQ(UINT64_MAX - 1, done);
}

TEST_F(VersionsTest, WhatIsNoMapFileIsRefused)
{
    _tag_map_file_version_ info = {};
    uint64_t count = 0;
    const std::string missing = volume + "/nothing", link = volume + "/link";
    ASSERT_EQ(0, symlink(path.c_str(), link.c_str()));
    EXPECT_EQ(NORV_ERR_BAD_MAP_FILE, NORVExtentPoolMapFileVersionInfoGet(link.c_str(), &info));
    EXPECT_EQ(NORV_ERR_BAD_MAP_FILE, NORVExtentPoolMapFileVersionInfoGet(volume.c_str(), &info));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, NORVExtentPoolMapFileMappedSizeGet(missing.c_str(), volume.c_str(), &count));
    EXPECT_EQ(NORV_ERR_MAPPED_SIZE, NORVExtentPoolMapFileMappedSizeGet("/etc/passwd", volume.c_str(), &count));
    ASSERT_EQ(0, setxattr(path.c_str(), "user.norv.version", "garbage", 7, 0));
    EXPECT_EQ(NORV_ERR_BAD_MAP_FILE, NORVExtentPoolMapFileVersionInfoGet(path.c_str(), &info));
    EXPECT_EQ(NORV_ERR_NULL_POINTER, NORVExtentPoolMapFileVersionInfoGet(nullptr, &info));
}

} // namespace
} // namespace norvhost

#include "HostTest.h"

#include "host/state/Database.h"
#include "host/storage/Volumes.h"

#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

namespace norvhost {
namespace {

struct VolumeTest : HostTest {
    iscsihost::Volume only(const std::string &path)
    {
        std::vector<iscsihost::Volume> volumes;
        EXPECT_EQ(0, iscsihost::listVolumes(volumes)) << iscsi_host_last_error();
        for (const iscsihost::Volume &found : volumes)
            if (found.path == path)
                return found;
        ADD_FAILURE() << path << " is not listed";
        return {};
    }
};

/// With a loop-mounted XFS, made by the code under test.
struct VolumeTestNeedsRoot : VolumeTest {
    std::string xfs = root + "/xfs";

    void SetUp() override
    {
        NEED_ROOT();
        ASSERT_EQ(0, iscsihost::createVolume(xfs, 300 * MiB, "")) << iscsi_host_last_error();
        volume = xfs;
    }
    void TearDown() override
    {
        closeDatabase();
        if (isMounted())
            run({"umount", xfs});
        EXPECT_FALSE(isMounted());
    }
    bool isMounted()
    {
        struct stat above, here;
        return stat(root.c_str(), &above) == 0 && stat(xfs.c_str(), &here) == 0 && above.st_dev != here.st_dev;
    }
};

TEST_F(VolumeTest, RegistersCanonicalFolders)
{
    std::string kept;
    const std::string link = root + "/link";
    ASSERT_EQ(0, symlink(volume.c_str(), link.c_str()));
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, iscsihost::addVolume(link));
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, iscsihost::addVolume(volume + "/../vol/"));
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::addVolume(root + "/nothing"));
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::addVolume("/etc/passwd"));
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::addVolume("/"));
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::addVolume(""));
    EXPECT_EQ(NORV_ERR_BAD_FILE_SYSTEM_TYPE, iscsihost::addVolume("/proc")) << iscsi_host_last_error();

    const std::string deep = root + "/" + std::string(250, 'd');
    std::filesystem::create_directories(deep + "/" + std::string(100, 'd'));
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::addVolume(deep + "/" + std::string(100, 'd')));
    for (const char *odd : {"/a\nb", "/a*b", "/[a]", "/a\\b"}) {
        std::filesystem::create_directory(root + odd);
        EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::addVolume(root + odd));
    }

    const iscsihost::Volume listed = only(volume);
    EXPECT_TRUE(listed.mounted);
    EXPECT_LT(0u, listed.free_bytes);
    create("a");
    EXPECT_EQ(1, only(volume).luns);
    EXPECT_EQ(NORV_ERR_REMOVE_CONFIG, iscsihost::removeVolume(volume, kept));
    _tag_iscsi_lun_ lun = {};
    ASSERT_EQ(0, NORViSCSILunGetByLunName("a", &lun));
    ASSERT_EQ(0, NORViSCSILunDelete(&lun));
    EXPECT_EQ(0, iscsihost::removeVolume(link, kept)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, iscsihost::removeVolume(volume, kept));
    lun = wanted("b");
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, NORViSCSILunCreate(&lun));
}

TEST_F(VolumeTest, CreateRefusesWhatItWouldHarm)
{
    const std::string image = root + "/image", folder = root + "/new";
    std::ofstream(image) << "somebody's";
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, iscsihost::createVolume(folder, 300 * MiB, image));
    std::string text;
    std::getline(std::ifstream(image), text);
    EXPECT_EQ("somebody's", text);
    EXPECT_FALSE(exists(folder));
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, iscsihost::createVolume(root, 300 * MiB, root + "/other"));
    for (uint64_t size : {uint64_t(0), 299 * MiB, 300 * MiB + 1, UINT64_MAX})
        EXPECT_EQ(NORV_ERR_LUN_SIZE, iscsihost::createVolume(folder, size, root + "/other"));
    EXPECT_FALSE(exists(root + "/other"));
}

TEST_F(VolumeTestNeedsRoot, RemountsAtBootAndRemoves)
{
    create("a", NORV_LUN_TYPE_ADV);
    run({"umount", xfs});
    EXPECT_FALSE(only(xfs).mounted);
    _tag_iscsi_lun_ lun = wanted("b");
    EXPECT_EQ(NORV_ERR_VOLUME_INFO, NORViSCSILunCreate(&lun)) << "nothing lands beneath the mount point";
    EXPECT_TRUE(std::filesystem::is_empty(xfs));

    VolumeRow row;
    ASSERT_EQ(0, loadVolume(xfs, row));
    EXPECT_EQ(0, mountVolume(row)) << iscsi_host_last_error();
    EXPECT_EQ(0, mountVolume(row));
    expectConsistent();

    std::string image;
    ASSERT_EQ(0, NORViSCSILunGetByLunName("a", &lun));
    ASSERT_EQ(0, NORViSCSILunDelete(&lun));
    ASSERT_EQ(0, iscsihost::removeVolume(xfs, image)) << iscsi_host_last_error();
    EXPECT_TRUE(exists(image));
    EXPECT_TRUE(std::filesystem::is_empty(xfs));
}

TEST_F(VolumeTestNeedsRoot, AFullDiskRefusesAndKeepsNothing)
{
    const _tag_iscsi_lun_ lun = create("a", NORV_LUN_TYPE_FILE, 100 * MiB);
    _tag_iscsi_lun_ more = wanted("more", NORV_LUN_TYPE_FILE, 290 * MiB);
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, NORViSCSILunCreate(&more));
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, update(lun, "b", 1024 * MiB));

    fillDisk(xfs);
    more = wanted("more", NORV_LUN_TYPE_FILE, 2 * MiB);
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, NORViSCSILunCreate(&more)) << iscsi_host_last_error();
    more = wanted("thin");
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, NORViSCSILunCreate(&more)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, update(lun, "b", 101 * MiB));
    EXPECT_STREQ("a", reload(lun).name);
    expectConsistent();

    _tag_iscsi_lun_ gone = lun;
    EXPECT_EQ(0, NORViSCSILunDelete(&gone)) << "a full disk can be emptied: " << iscsi_host_last_error();
    create("after", NORV_LUN_TYPE_FILE, 90 * MiB);
    expectConsistent();
}

TEST_F(VolumeTestNeedsRoot, AFullStateRefusesAndKeepsNothing)
{
    // The state alone lies on the full file system.
    volume = root + "/vol";
    setenv("ISCSI_HOST_STATE", (xfs + "/state").c_str(), 1);
    closeDatabase();
    ASSERT_EQ(0, iscsihost::addVolume(volume)) << iscsi_host_last_error();
    const _tag_iscsi_lun_ lun = create("a");
    fillDisk(xfs);

    int made = 0, err = 0;
    for (; made < 1000 && !err; ++made) {
        _tag_iscsi_lun_ more = wanted("more" + std::to_string(made));
        err = NORViSCSILunCreate(&more);
    }
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, err) << iscsi_host_last_error();
    expectConsistent();
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, update(lun, std::string(150, 'b'), 8 * MiB)) << iscsi_host_last_error();
    EXPECT_STREQ("a", reload(lun).name);
    expectConsistent();

    ASSERT_EQ(0, unlink((xfs + "/fill").c_str()));
    create("after");
    expectConsistent();
    closeDatabase();
}

TEST_F(VolumeTestNeedsRoot, AReadOnlyVolumeRefusesAndChangesNothing)
{
    _tag_iscsi_lun_ lun = create("a");
    run({"mount", "-o", "remount,ro", xfs});
    EXPECT_TRUE(only(xfs).read_only);
    _tag_iscsi_lun_ more = wanted("more"), trash = lun;
    trash.options = NORV_LUN_OPTION_TRASH;
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSILunCreate(&more)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, update(lun, "b", lun.size)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, update(lun, "a", 8 * MiB)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSILunUnload(&trash)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSILunDelete(&lun)) << iscsi_host_last_error();
    EXPECT_EQ("Healthy", health(lun));
    run({"mount", "-o", "remount,rw", xfs});
    expectConsistent();
}

TEST_F(VolumeTestNeedsRoot, ABlockDeviceServesOneLun)
{
    const std::string image = root + "/disk";
    std::ofstream(image).close();
    ASSERT_EQ(0, truncate(image.c_str(), 16 * MiB));
    const std::string device = run({"losetup", "--find", "--show", image});

    _tag_iscsi_lun_ lun = wanted("disk", NORV_LUN_TYPE_BLOCK, 0);
    snprintf(lun.location, sizeof lun.location, "%s", device.c_str());
    EXPECT_EQ(0, NORViSCSILunCreate(&lun)) << iscsi_host_last_error();
    EXPECT_EQ(16 * MiB, lun.size);
    EXPECT_EQ("Healthy", health(lun));

    _tag_iscsi_lun_ again = wanted("again", NORV_LUN_TYPE_BLOCK, 0);
    const std::string alias = root + "/alias";
    ASSERT_EQ(0, symlink(device.c_str(), alias.c_str()));
    snprintf(again.location, sizeof again.location, "%s", alias.c_str());
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, NORViSCSILunCreate(&again)) << "the same device by another path";
    EXPECT_EQ(NORV_ERR_LUN_TYPE, update(lun, "b", 32 * MiB));
    lun.options = NORV_LUN_OPTION_TRASH;
    EXPECT_EQ(NORV_ERR_LUN_TYPE, NORViSCSILunUnload(&lun));

    // The device that a volume is mounted from is in use.
    const std::string mounted = run({"findmnt", "-no", "SOURCE", xfs});
    snprintf(again.location, sizeof again.location, "%s", mounted.c_str());
    EXPECT_EQ(NORV_ERR_LUN_LOCATION, NORViSCSILunCreate(&again)) << iscsi_host_last_error();

    EXPECT_EQ(0, NORViSCSILunDelete(&lun));
    run({"losetup", "-d", device});
}

} // namespace
} // namespace norvhost

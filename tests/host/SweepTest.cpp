#include "HostTest.h"

#include "host/core/Lock.h"
#include "host/state/Database.h"
#include "host/storage/DataFile.h"

#include <filesystem>
#include <fstream>
#include <unistd.h>

namespace norvhost {
namespace {

struct SweepTest : HostTest {
    iscsihost::SweepReport sweep()
    {
        iscsihost::SweepReport report;
        EXPECT_EQ(0, iscsihost::sweep(report)) << iscsi_host_last_error();
        EXPECT_TRUE(report.failed.empty());
        return report;
    }

    /// A data file without a row, as a creator killed before its commit leaves it.
    std::string orphan(int lid, const std::string &name)
    {
        _tag_iscsi_lun_ lun = wanted(name);
        lun.lid = lid;
        snprintf(lun.uuid, sizeof lun.uuid, "%s", newUuid().c_str());
        LunLock lock;
        EXPECT_EQ(0, lock.take(lid, NORV_LUN_CREATING));
        EXPECT_EQ(0, createDataFile(lun, lock)) << iscsi_host_last_error();
        return dataPath(lun);
    }
};

TEST_F(SweepTest, RemovesOrphansAndNothingElse)
{
    create("kept");
    _tag_iscsi_lun_ trashed = create("trashed");
    trashed.options = NORV_LUN_OPTION_TRASH;
    ASSERT_EQ(0, NORViSCSILunUnload(&trashed));
    const std::string left = orphan(7, "left");
    const std::string folder = volume + "/@iSCSITrg/";
    const std::string foreign = folder + "iSCSI_9_foreign_000";
    for (const char *name :
         {"iSCSI_9_foreign_000", "iSCSI_1_kept_000.bak", "notes", "iSCSI_x_a_000", "iSCSI_2000_a_000"})
        std::ofstream(folder + name) << "somebody's";

    const iscsihost::SweepReport report = sweep();
    EXPECT_EQ(std::vector<std::string>{left}, report.removed);
    EXPECT_EQ(std::vector<std::string>{foreign}, report.foreign);
    EXPECT_EQ(7u, files().size());
    EXPECT_TRUE(sweep().removed.empty());
}

TEST_F(SweepTest, LeavesACreationInProgressAlone)
{
    const std::string path = orphan(7, "busy");
    LunLock lock;
    ASSERT_EQ(0, lock.take(7, NORV_LUN_CREATING));
    EXPECT_TRUE(sweep().removed.empty());
    EXPECT_TRUE(exists(path));
    // Nor does another creator take the ID.
    for (int lid = 1; lid <= 6; ++lid)
        EXPECT_EQ(lid, create("lun" + std::to_string(lid)).lid);
    EXPECT_EQ(8, create("next").lid);
    lock.release();
    EXPECT_EQ(7, create("busy").lid) << "the creator who takes the ID removes what lay there";
    expectConsistent();
}

TEST_F(SweepTest, AMoveCutShortIsMendedByTheNextCommand)
{
    const _tag_iscsi_lun_ lun = create("old");
    _tag_iscsi_lun_ renamed = lun;
    setName(renamed, "new");
    // Killed before the row changed, then after it.
    for (const bool committed : {false, true}) {
        const pid_t child = inChild([&] {
            return moveDataFile(lun, renamed, [&] {
                LunRow row;
                row.record = renamed;
                if (committed && updateLun(row) != 0)
                    return 1;
                kill(getpid(), SIGKILL);
                return 1;
            });
        });
        ASSERT_EQ(128 + SIGKILL, waitForChild(child));
        EXPECT_EQ(2u, files().size());
        EXPECT_EQ(0, update(lun, reload(lun).name, 8 * MiB + (committed ? MiB : 0))) << iscsi_host_last_error();
        EXPECT_STREQ(committed ? "new" : "old", reload(lun).name);
        expectConsistent();
    }
}

TEST_F(SweepTest, AFileUnderAWrongNameIsGivenBack)
{
    const _tag_iscsi_lun_ lun = create("a");
    const std::string wrong = volume + "/@iSCSITrg/iSCSI_1_wrong_000";
    ASSERT_EQ(0, rename(dataPath(lun).c_str(), wrong.c_str()));
    EXPECT_EQ("Unhealthy", health(lun));
    EXPECT_EQ(std::vector<std::string>{dataPath(lun)}, sweep().mended);
    expectConsistent();
}

TEST_F(SweepTest, ACopyOfALunsFileStays)
{
    const _tag_iscsi_lun_ lun = create("a");
    const std::string copy = volume + "/@iSCSITrg/iSCSI_1_copy_000";
    ASSERT_EQ(0, system(("cp --preserve=all " + dataPath(lun) + " " + copy).c_str()));
    const iscsihost::SweepReport report = sweep();
    EXPECT_TRUE(report.removed.empty());
    EXPECT_EQ(std::vector<std::string>{copy}, report.foreign);
}

TEST_F(SweepTest, DataOutlivesALostState)
{
    const std::string path = dataPath(create("precious"));
    closeDatabase();
    std::filesystem::remove_all(root + "/state");
    ASSERT_EQ(0, iscsihost::addVolume(volume)) << iscsi_host_last_error();
    EXPECT_EQ(std::vector<std::string>{path}, sweep().foreign);
    _tag_iscsi_lun_ lun = wanted("precious");
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, NORViSCSILunCreate(&lun)) << "never over another system's data";
    EXPECT_TRUE(exists(path));
}

} // namespace
} // namespace norvhost

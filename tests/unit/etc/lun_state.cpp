#include "iscsiwebapi/ISCSILUNInfo.h"
#include "tests/unit/Library.h"

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;

const char *const VERSION_A = "aaaaaaaa-0000-4000-8000-000000000000";
const char *const VERSION_B = "bbbbbbbb-0000-4000-8000-000000000000";

class LUNState : public LibraryTest {
protected:
    ISCSILUNInfo lun{uuidOf(3)};
    _tag_iscsi_lun_ record{};

    fake::MapFile &mapFile() { return fake::model().luns.at(3).map_file; }
    std::string loaded() const { return "NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 0)"; }
};

TEST_F(LUNState, ARecordWithoutALUNIsFilledFirst)
{
    addLUN(3, "vol1");
    addLUN(1024, "last");
    for (int lid : {0, 1025, -3}) {
        record = {};
        record.lid = lid;
        EXPECT_EQ(lun.loadIsActionLocked(record), 0);
        EXPECT_EQ(called(), (Lines{loaded(), "NORViSCSILunIsLocked(3)"})) << lid;
        EXPECT_STREQ(record.name, "vol1");
    }
    for (int lid : {3, 1024}) {
        record = recordOf(lid);
        EXPECT_EQ(lun.loadIsActionLocked(record), 0);
        EXPECT_EQ(called(), Lines{"NORViSCSILunIsLocked(" + std::to_string(lid) + ")"});
    }
}

TEST_F(LUNState, LocksAndMappings)
{
    // Only target IDs 1 to 256 are targets; the others are the platform's own entries.
    addLUN(3, "vol1");
    addMapping(1, 4);
    for (const auto &[tid, expected] :
         std::map<int, bool>{{0, false}, {257, false}, {-1, false}, {1, true}, {256, true}}) {
        addMapping(tid, 3);
        fake::model().luns.at(3).is_locked = expected;
        EXPECT_EQ(lun.loadIsMapped(record), 0);
        EXPECT_EQ(lun.loadIsActionLocked(record), 0);
        EXPECT_EQ(lun.is_mapped, expected) << tid;
        EXPECT_EQ(lun.is_action_locked, expected);
        fake::model().mappings.pop_back();
    }
}

TEST_F(LUNState, StatusWords)
{
    addLUN(3, "vol1");
    const char *const words[] = {"processing", "moving",       "creating",          "expanding",
                                 "deleting",   "cloning",      "cloning",           "restoring",
                                 "be_cloning", "snapshotting", "snapshot_deleting", "creating"};
    for (int state = 1; state <= 12; ++state) {
        fake::model().luns.at(3).progress = state;
        EXPECT_EQ(lun.loadStatus(record), 0);
        EXPECT_EQ(lun.status, words[state - 1]) << state;
    }
    EXPECT_EQ(logged(), Lines());

    fake::model().luns.at(3).progress = 13;
    lun.status = "before";
    EXPECT_EQ(lun.loadStatus(record), 0);
    EXPECT_EQ(lun.status, "before");
    EXPECT_EQ(logged(), Lines{"loadStatus: Failed to get LUN's status. progress.st: 13 info: " + lun.toString() +
                              ". error: 18990587 (Failed to get LUN status)"});
}

TEST_F(LUNState, StatusOfAnIdleLUNIsItsHealth)
{
    auto &known = addLUN(3, "vol1");
    const struct {
        int checker, progress;
        const char *health, *status;
    } cases[] = {
        {0, 0, "Healthy", "normal"},         {0, 0, "Unhealthy", "Unhealthy"},     {0, 0, "unhealthy", "normal"},
        {0, 0, "Unhealthy!", "normal"},      {0, 8, "Unhealthy", "restoring"},     {1, 8, "Unhealthy", "unavailabling"},
        {-1, 0, "Healthy", "unavailabling"}, {255, 0, "Healthy", "unavailabling"},
    };
    for (const auto &c : cases) {
        fake::model().exit_status = c.checker;
        known.progress = c.progress;
        known.health = c.health;
        EXPECT_EQ(lun.loadStatus(record), 0);
        EXPECT_EQ(lun.status, c.status) << c.checker << ' ' << c.progress << ' ' << c.health;
    }
}

TEST_F(LUNState, MapFilesAreNamedByTypeAndPlace)
{
    const struct {
        int type;
        uint32_t options;
        const char *path;
    } cases[] = {
        {15, 0, "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000"}, {31, 0, "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000"},
        {47, 0, "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000"}, {79, 0, "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_00000"},
        {71, 0, "/volume1/@iSCSITrg/iSCSI_3_vol1_00000"},      {7, 0, "/volume1/@iSCSITrg/iSCSI_3_vol1_000"},
        {3, 4, "/volume1/@iSCSITrg/iSCSI_3_vol1_000"},         {15, 1, "/volume1/@EP_trash/iSCSI_3_Extent_vol1_000"},
        {15, 5, "/volume1/@EP_trash/iSCSI_3_Extent_vol1_000"},
    };
    for (const auto &c : cases) {
        addLUN(3, "vol1", c.type).record.options = c.options;
        std::string version;
        EXPECT_EQ(lun.getBaseVersion(version), 0);
        EXPECT_EQ(version, NORV_ZERO_UUID);
        EXPECT_EQ(called(), (Lines{loaded(), std::string("NORVExtentPoolMapFileBaseVersionGet(") + c.path + ")"}));
    }
}

TEST_F(LUNState, TheLongestPathsAreCutNotOverrun)
{
    auto &known = addLUN(3, std::string(255, 'n'));
    std::string(4094, 'l').copy(known.record.location, 4094);
    std::string version = "untouched";
    EXPECT_EQ(lun.getBaseVersion(version), 18990011);
    EXPECT_EQ(version, "untouched");
    EXPECT_EQ(called().back(), "NORVExtentPoolMapFileBaseVersionGet(" + std::string(319, 'l') + ")");

    known.record.type = NORV_LUN_TYPE_FILE;
    EXPECT_NE(lun.loadAllocatedSize(record), 0);
    EXPECT_EQ(logged().back(), "loadAllocatedSize: Failed to copy file path");
}

TEST_F(LUNState, VersionQuestions)
{
    addLUN(3, "vol1");
    const struct {
        const char *base, *current;
        uint64_t total, synced;
        bool is_modified, is_failed;
    } cases[] = {
        {VERSION_A, VERSION_A, 0, 0, false, false},  {VERSION_A, VERSION_A, 10, 5, false, false},
        {VERSION_A, VERSION_B, 0, 0, true, false},   {VERSION_A, VERSION_B, 0, 5, true, false},
        {VERSION_A, VERSION_B, 10, 10, true, false}, {VERSION_A, VERSION_B, 10, 9, true, true},
        {VERSION_A, VERSION_B, 10, 11, true, true},  {VERSION_A, "", 10, 0, true, true},
    };
    for (const auto &c : cases) {
        mapFile() = {c.base, c.current, 0, c.total, c.synced, 0, 0};
        std::string base;
        bool is_modified = !c.is_modified, is_failed = !c.is_failed;
        EXPECT_EQ(lun.getBaseVersion(base), 0);
        EXPECT_EQ(lun.isModified(is_modified), 0);
        EXPECT_EQ(lun.isSnapshotSentFailed(is_failed), 0);
        EXPECT_EQ(base, c.base);
        EXPECT_EQ(is_modified, c.is_modified);
        EXPECT_EQ(is_failed, c.is_failed) << c.total << ' ' << c.synced;
    }
}

TEST_F(LUNState, SyncProgressIsForExtentPoolsOnly)
{
    addLUN(3, "vol1", NORV_LUN_TYPE_SINK);
    mapFile().copied = 7;
    mapFile().to_copy = UINT64_MAX;
    unsigned long long first = 1, second = 1;
    EXPECT_EQ(lun.loadSyncProgress(record, first, second), 0);
    EXPECT_EQ(first, 7u);
    EXPECT_EQ(second, UINT64_MAX);
    called();

    for (int type : {1, 3, 7, 71}) {
        addLUN(3, "vol1", type);
        record = {};
        first = second = 1;
        EXPECT_EQ(lun.loadSyncProgress(record, first, second), 0);
        EXPECT_EQ(first, 0u);
        EXPECT_EQ(second, 0u);
        EXPECT_EQ(called(), Lines{loaded()}) << type;
    }
}

// Allocated size. A LUN's files lie in a real folder.

class AllocatedSize : public LUNState {
protected:
    AllocatedSize()
    {
        std::string pattern = testing::TempDir() + "lun.XXXXXX";
        folder = mkdtemp(pattern.data());
        std::filesystem::create_directories(folder + "/@iSCSITrg");
        std::filesystem::create_directories(folder + "/@EP_trash");
    }
    ~AllocatedSize() override { std::filesystem::remove_all(folder); }

    void haveLUN(int type, uint64_t size = GIB)
    {
        auto &known = addLUN(3, "vol1", type);
        known.record.size = size;
        folder.copy(known.record.location, sizeof(known.record.location) - 1);
        record = {};
    }

    /// Writes a file into the folder; returns the bytes that it occupies.
    uint64_t write(const std::string &name, size_t bytes)
    {
        const std::string path = folder + "/" + name;
        std::ofstream(path) << std::string(bytes, 'x');
        struct stat file {};
        EXPECT_EQ(stat(path.c_str(), &file), 0);
        return static_cast<uint64_t>(file.st_blocks) * 512;
    }

    std::string folder;
};

TEST_F(AllocatedSize, IsTheBlocksOfTheLUNsFiles)
{
    const uint64_t expected = write("@iSCSITrg/iSCSI_3_vol1_000", 100000) + write("@iSCSITrg/iSCSI_3_vol1_001", 1);
    write("@iSCSITrg/iSCSI_4_vol2_000", 100000);
    write("@EP_trash/iSCSI_3_vol1_002", 100000);
    std::filesystem::create_symlink(folder + "/gone", folder + "/@iSCSITrg/iSCSI_3_vol1_003");
    ASSERT_GT(expected, 0u);
    for (int type : {3, 7, 71}) {
        haveLUN(type);
        lun.allocated_size = 1;
        EXPECT_EQ(lun.loadAllocatedSize(record), 0);
        EXPECT_EQ(lun.allocated_size, expected) << type;
    }
}

TEST_F(AllocatedSize, IsNeverMoreThanTheSizeAndNeedsAFile)
{
    haveLUN(NORV_LUN_TYPE_THIN, 4608);
    write("@EP_trash/iSCSI_3_vol1_000", 1);
    EXPECT_EQ(lun.loadAllocatedSize(record), 18990044);
    EXPECT_EQ(logged(), Lines{"loadAllocatedSize: Failed to copy file path"});
    write("@iSCSITrg/iSCSI_3_vol1_000", 100000);
    EXPECT_EQ(lun.loadFromConfig(record, ISCSILUNInfo::LOAD_ALLOCATED_SIZE), 0);
    EXPECT_EQ(lun.allocated_size, 4608u);
}

TEST_F(AllocatedSize, OfOtherTypesComesFromTheRecord)
{
    haveLUN(NORV_LUN_TYPE_BLOCK, 12345);
    EXPECT_EQ(lun.loadAllocatedSize(record), 0);
    EXPECT_EQ(lun.allocated_size, 12345u);

    for (int type : {0, 2, 4, 5, 8}) {
        haveLUN(type);
        EXPECT_EQ(lun.loadAllocatedSize(record), 18990500) << type;
    }

    haveLUN(NORV_LUN_TYPE_SINK);
    mapFile().mapped_size = 2 * GIB; // a map file may hold more than the LUN
    EXPECT_EQ(lun.loadAllocatedSize(record), 0);
    EXPECT_EQ(lun.allocated_size, 2 * GIB);
}

} // namespace
} // namespace unit

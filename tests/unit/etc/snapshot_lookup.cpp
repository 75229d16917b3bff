#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "tests/unit/Library.h"

#include <algorithm>
#include <utility>

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;

std::string namesOf(const std::vector<ISCSISnapshotInfo> &snapshots)
{
    std::string names;
    for (const auto &snapshot : snapshots)
        names += snapshot.name + " ";
    return names;
}

class SnapshotLookup : public LibraryTest {
protected:
    SnapshotLookup()
    {
        addLUN(3, "lun");
        addLUN(4, "other");
        addSnapshot(4, 1, "snap_1");
        addSnapshot(3, 9, "snap_1").app_keys = {"b", "a"};
        addSnapshot(3, 2, "%s%n").is_locked = true;
    }

    std::vector<ISCSISnapshotInfo> snapshots{ISCSISnapshotInfo("old")};
};

TEST_F(SnapshotLookup, ListsInThePlatformsOrder)
{
    const struct {
        int lid;
        long time;
        const char *query, *names;
    } cases[] = {
        {-1, 0, "0, 0, 0", "%s%n snap_1 snap_1 "},
        {3, 0, "2, 3, 0", "%s%n snap_1 "},
        {0, 0, "2, 0, 0", ""},
        {-1, EPOCH + 9, "64, 0, 1234571499", "snap_1 "},
        {4, EPOCH, "66, 4, 1234571490", "snap_1 "},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(c.lid, snapshots, c.time, 0), 0);
        EXPECT_EQ(namesOf(snapshots), c.names);
        EXPECT_EQ(called(), Lines{std::string("NORViSCSISnapshotConfLoad(") + c.query + ")"});
        EXPECT_EQ(fake::unfreedAnswers(), 0);
    }
}

TEST_F(SnapshotLookup, LockFactsComeWhenAskedFor)
{
    for (int filter = 0; filter < 8; ++filter) {
        EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(3, snapshots, 0, filter), 0);
        ASSERT_EQ(snapshots.size(), 2u);
        const std::set<std::string> keys = filter & 2 ? std::set<std::string>{"a", "b"} : std::set<std::string>();
        EXPECT_EQ(snapshots[0].is_action_locked, filter % 2 == 1) << filter;
        EXPECT_FALSE(snapshots[1].is_action_locked);
        EXPECT_TRUE(snapshots[0].locked_app_keys.empty());
        EXPECT_EQ(snapshots[1].locked_app_keys, keys) << filter;
    }
    snapshots[1].is_action_locked = false;
    snapshots[1].locked_app_keys.clear();
    EXPECT_EQ(snapshots[1].toString(), ISCSISnapshotInfo(fake::model().snapshots.at({3, 9}).record).toString());
}

TEST_F(SnapshotLookup, KeepsWhatCameBeforeAFailingFact)
{
    fake::failCall("NORViSCSIIsSnapshotLocked", 2, INJECTED);
    EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(-1, snapshots, 0, 1), INJECTED);
    EXPECT_EQ(namesOf(snapshots), "%s%n ");
    fake::failCall("NLIBCSzListGet", 2, 0);
    EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(-1, snapshots, 0, 2), 18990309);
    EXPECT_EQ(namesOf(snapshots), "%s%n ");
    EXPECT_EQ(fake::unfreedAnswers(), 0);
}

TEST_F(SnapshotLookup, SelectorsThatResolve)
{
    const std::string unknown = "FFFFFFFF-ffff-FFFF-ffff-00000000000a";
    const std::pair<std::string, std::string> cases[] = {
        {unknown, unknown}, // whether it exists shows when it is loaded
        {"sn#1", snapshotUUIDOf(3, 2)},
        {"SN#3", snapshotUUIDOf(4, 1)},
        {"lun_snap_1", snapshotUUIDOf(3, 9)},
        {"other_snap_1", snapshotUUIDOf(4, 1)},
        {"lun_ \t snap_1 and more", snapshotUUIDOf(3, 9)}, // a snapshot's name has no blanks
        {"lun_%s%n", snapshotUUIDOf(3, 2)},
    };
    for (const auto &[selector, expected] : cases) {
        std::string uuid = "untouched";
        EXPECT_EQ(ISCSISnapshotInfo::GetSnapshotUUID(selector, uuid), 0) << selector;
        EXPECT_EQ(uuid, expected) << selector;
    }
    EXPECT_EQ(logged(), Lines());
    called();
    std::string uuid;
    EXPECT_EQ(ISCSISnapshotInfo::GetSnapshotUUID(unknown, uuid), 0);
    EXPECT_EQ(called(), Lines());
}

TEST_F(SnapshotLookup, SelectorsThatNameNothing)
{
    const std::string invalid = ": Invalid snapshot UUID, name or index. input: ";
    const std::string range = ": Index of snapshot is out of range. index: ";
    const std::string no_lun = ": Failed to get lid by LUN name: ";
    const std::string very_long(200000, 'a');
    const auto noSnapshot = [](const std::string &name) {
        return Lines{"GetUUIDByLIDAndSnapshotName: No such snapshot. lid: 3, name: " + name,
                     ": Failed to get snapshot UUID by lid and snapshot name. lid: 3, name: " + name};
    };
    const auto noLUN = [&](const std::string &name) {
        return Lines{"GetLIDByLUNName: No such LUN. Name: " + name, no_lun + name + "."};
    };
    const std::pair<std::string, Lines> cases[] = {
        {"sn#0", {range + "0, #snapshots: 3"}},
        {"sn#4", {range + "4, #snapshots: 3"}},
        {"sn#2x", {invalid + "sn#2x"}},
        {"", {invalid}},
        {"_snap_1", {invalid + "_snap_1"}},
        {"lun_", {invalid + "lun_"}},
        {"lun_ \n", {invalid + "lun_ \n"}},
        {"snap 1", {invalid + "snap 1"}},
        {snapshotUUIDOf(3, 2) + " ", {invalid + snapshotUUIDOf(3, 2) + " "}},
        {very_long, {invalid + very_long}},
        {"LUN_snap_1", noLUN("LUN")},
        {"%s%n_snap", noLUN("%s%n")},
        {very_long + "_snap_1", noLUN(very_long)},
        {"lun_snap", noSnapshot("snap")},
        {"lun_" + very_long, noSnapshot(very_long)},
        {"sn#" + std::string(200000, '1') + "_x", noLUN("sn#" + std::string(200000, '1'))},
    };
    for (const auto &[selector, lines] : cases) {
        std::string uuid = "untouched";
        EXPECT_EQ(ISCSISnapshotInfo::GetSnapshotUUID(selector, uuid), 18990520) << selector.substr(0, 60);
        EXPECT_EQ(uuid, "untouched");
        EXPECT_EQ(logged(), lines) << selector.substr(0, 60);
    }
    for (const char *selector : {"sn#4294967297", "sn#-1", "sn#18446744073709551617"}) { // 1, if they wrapped around
        std::string uuid = "untouched";
        EXPECT_EQ(ISCSISnapshotInfo::GetSnapshotUUID(selector, uuid), 18990520);
        EXPECT_EQ(logged().at(0).find(range), 0u);
    }
}

TEST_F(SnapshotLookup, SortsNewestFirst)
{
    ISCSISnapshotInfo::ListSnapshot(-1, snapshots, 0, 0);
    std::sort(snapshots.begin(), snapshots.end(), ISCSISnapshotInfo::CompareBySnapshotTime);
    EXPECT_EQ(snapshots[0].snapshot_time, EPOCH + 9);
    EXPECT_EQ(snapshots[2].snapshot_time, EPOCH + 1);
    EXPECT_FALSE(ISCSISnapshotInfo::CompareBySnapshotTime(snapshots[0], snapshots[0]));
}

} // namespace
} // namespace unit

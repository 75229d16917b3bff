#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Library.h"

#include <limits>

namespace unit {
namespace {

using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

class LUNOperations : public LibraryTest {
protected:
    ISCSILIBLUN lun{uuidOf(3)};

    const std::string loaded = "NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 0)";

    /// The one line of a step that failed in the standard form.
    Lines oneLine(const std::string &head, const std::string &error) const
    {
        return {head + " info: " + lun.info.toString() + ". error: " + error};
    }
};

TEST_F(LUNOperations, CreatePassesTheRequestAndLearnsTheIdentity)
{
    ISCSILIBLUN created("new", NORV_LUN_TYPE_THIN, "/volume1", GIB, 4096);
    EXPECT_EQ(created.createLUN(), 0);
    EXPECT_EQ(called(), Lines{"NORViSCSILunCreate(new, 7, /volume1, 1073741824, 4096)"});
    EXPECT_EQ(created.info.lun_id, 1);
    EXPECT_EQ(created.info.uuid.size(), 36u);
    EXPECT_EQ(created.info.name, "new");

    ISCSILIBLUN loaded_again(created.info.uuid);
    EXPECT_EQ(loaded_again.loadLUNInfo(0), 0);
    EXPECT_EQ(loaded_again.info.lun_id, 1);
    EXPECT_EQ(loaded_again.record.type, 7);
}

TEST_F(LUNOperations, CreateChecksNameThenTypeThenLocation)
{
    const auto adv = NORV_LUN_TYPE_ADV;
    const auto none = NORV_LUN_TYPE_NONE;
    const struct {
        std::string name;
        _tag_iscsi_lun_type type;
        std::string location;
        int code;
        std::string sentence, error;
    } cases[] = {
        {"", adv, "/volume1", 18990503, "Invalid name", "18990503 (Bad LUN name)"},
        {std::string(256, 'n'), none, "", 18990503, "Invalid name", "18990503 (Bad LUN name)"},
        {"n", none, "", 18990500, "Invalid type", "18990500 (Bad LUN type)"},
        {"n", adv, "", 18990501, "Invalid location", "18990501 (Bad LUN location)"},
        {std::string(255, 'n'), adv, std::string(4095, 'l'), 18990501, "Invalid location",
         "18990501 (Bad LUN location)"},
    };
    for (const auto &c : cases) {
        lun = ISCSILIBLUN(c.name, c.type, c.location, GIB, 0);
        EXPECT_EQ(lun.createLUN(), c.code);
        EXPECT_EQ(logged(), oneLine("createLUN: " + c.sentence + " to create LUN.", c.error));
        EXPECT_EQ(called(), Lines());
    }
}

TEST_F(LUNOperations, CreateLeavesTheRestToThePlatform)
{
    const std::string longest(4094, 'l');
    fake::model().volumes.insert(longest);
    EXPECT_EQ(ISCSILIBLUN(std::string(255, 'n'), NORV_LUN_TYPE_ADV, longest, GIB, 0).createLUN(), 0);
    called();

    const struct {
        int type;
        unsigned long long size;
        int code;
    } cases[] = {
        {2, GIB, 18990500}, {-1, GIB, 18990500}, {15, 0, 18990502}, {15, 1, 18990502}, {15, 1ULL << 63, 18990502}};
    for (const auto &c : cases) {
        lun = ISCSILIBLUN("n", static_cast<_tag_iscsi_lun_type>(c.type), "/volume1", c.size, 0);
        EXPECT_EQ(lun.createLUN(), c.code) << c.type << ' ' << c.size;
        EXPECT_EQ(called().size(), 1u);
        EXPECT_TRUE(lun.info.isInvalid());
    }
}

TEST_F(LUNOperations, CreateRefusesTextsThatTheRecordCannotHold)
{
    lun = ISCSILIBLUN("n", NORV_LUN_TYPE_ADV, "/volume1", GIB, 0);
    lun.info.uuid = std::string(37, 'u');
    EXPECT_EQ(lun.createLUN(), 18990025);
    const Lines lines = logged();
    ASSERT_EQ(lines.size(), 3u);
    EXPECT_EQ(lines[2], oneLine("createLUN: Failed to fill ISCSI_LUN struct.", "18990025 (Failed to copy string)")[0]);
    EXPECT_EQ(called(), Lines());
}

TEST_F(LUNOperations, DeleteCleansUpAfterExtentPoolLUNsOnly)
{
    for (int type : {15, 31, 47, 79}) {
        addLUN(3, "vol1", type);
        fake::model().jobs = {{11, {"vol1", 0}}, {12, {"", 3}}, {13, {"vol2", 0}}, {14, {"", 4}}};
        fake::model().retention_policies = {{"Lun#", "3"}, {"Lun#", "4"}};
        EXPECT_EQ(lun.deleteLUN(), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunTaskGetSchIDByName(vol1)", "NORVSchedTaskRemove(11)",
                                   "ScheduleSnapshotTaskGetIDByLid(3)", "NORVSchedTaskRemove(12)",
                                   "NORVRETENTIONRemovePolicy(Lun#, 3)", "NORViSCSILunDelete(" + uuidOf(3) + ")"}))
            << type;
        EXPECT_EQ(fake::model().jobs.size(), 2u);
        EXPECT_EQ(fake::model().retention_policies.size(), 1u);
        EXPECT_TRUE(fake::model().luns.empty());
    }
    for (int type : {1, 3, 7, 71}) {
        addLUN(3, "vol1", type);
        EXPECT_EQ(lun.deleteLUN(), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunDelete(" + uuidOf(3) + ")"})) << type;
    }
}

TEST_F(LUNOperations, DeleteRemovesOnlySchedulesThatExist)
{
    addLUN(3, "vol1");
    EXPECT_EQ(lun.deleteLUN(), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunTaskGetSchIDByName(vol1)", "ScheduleSnapshotTaskGetIDByLid(3)",
                               "NORVRETENTIONRemovePolicy(Lun#, 3)", "NORViSCSILunDelete(" + uuidOf(3) + ")"}));
    addLUN(3, "vol1");
    fake::answer("NORViSCSILunTaskGetSchIDByName", {0}); // an ID like any other, of no job
    EXPECT_EQ(lun.deleteLUN(), 0);
    EXPECT_EQ(logged(), Lines{": NORVSchedTaskRemove() fail, schedule id = 0"});
}

TEST_F(LUNOperations, LockAndMappingQueries)
{
    addLUN(3, "vol1");
    bool is_locked = true, is_mapped = true;
    fake::answer("NORViSCSILunIsLocked", {0, 1});
    for (bool expected : {false, true}) {
        EXPECT_EQ(lun.isLUNLocked(is_locked), 0);
        EXPECT_EQ(is_locked, expected);
    }
    called();
    EXPECT_EQ(lun.isLUNMapped(is_mapped), 0);
    EXPECT_FALSE(is_mapped);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSIConfGet(0x7220, 3)"}));
    addMapping(256, 3);
    EXPECT_EQ(lun.isLUNMapped(is_mapped), 0);
    EXPECT_TRUE(is_mapped);
}

TEST_F(LUNOperations, LoadOptions)
{
    addLUN(3, "vol1");
    const struct {
        bool trash, unsync_size;
        const char *options;
    } cases[] = {{false, false, "8"}, {true, false, "9"}, {false, true, "12"}, {true, true, "9"}};
    for (const auto &c : cases) {
        fake::model().luns.at(3).record.options = 8; // not ours, stays
        EXPECT_EQ(lun.loadLUN(c.trash, c.unsync_size), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunLoad(" + uuidOf(3) + ", " + c.options + ")"}));
        fake::model().luns.at(3).record.options = 8; // not ours, stays
        EXPECT_EQ(lun.unloadLUN(c.trash, c.unsync_size), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunUnload(" + uuidOf(3) + ", " + c.options + ")"}));
        EXPECT_FALSE(fake::model().luns.at(3).is_loaded);
    }
}

TEST_F(LUNOperations, UpdateRenamesAndGrows)
{
    const struct {
        const char *name;
        unsigned long long size;
        const char *sent;
    } cases[] = {
        {"", 0, "vol1, 1073741824"},       {"", GIB, "vol1, 1073741824"},           {"new", 0, "new, 1073741824"},
        {"", 2 * GIB, "vol1, 2147483648"}, {"newer", 2 * GIB, "newer, 2147483648"},
    };
    for (const auto &c : cases) {
        addLUN(3, "vol1");
        EXPECT_EQ(lun.updateLUN(c.name, c.size), 0);
        EXPECT_EQ(called(), (Lines{loaded, std::string("NORViSCSILunIsNameExist(") + c.name + ")",
                                   "NORViSCSILunUpdate(" + uuidOf(3) + ", " + c.sent + ")"}));
        EXPECT_EQ(lun.info.name, "vol1") << "the record is not refreshed";
        EXPECT_EQ(lun.info.size, GIB);
    }
}

TEST_F(LUNOperations, UpdateChecksTypeThenSizeThenName)
{
    addLUN(4, "taken");
    const std::string type_line = "updateLUN: Cannot update a block LUN";
    const std::string size_line = "updateLUN: Cannot shrink LUN size. new_size: 1073741823";
    const struct {
        int type;
        std::string name;
        unsigned long long size;
        int code;
        std::string head, error;
        size_t calls;
    } cases[] = {
        {1, "new", 0, 18990500, type_line, "18990500 (Bad LUN type)", 1},
        {1, "taken", 1, 18990500, type_line, "18990500 (Bad LUN type)", 1},
        {15, "taken", GIB - 1, 18990502, size_line, "18990502 (Bad LUN size)", 1},
        {3, "", GIB - 1, 18990502, size_line, "18990502 (Bad LUN size)", 1},
        {15, "taken", 0, 18990538, "updateLUN: Duplicated LUN name: taken", "18990538 (Duplicated LUN name)", 2},
        {7, "vol1", 0, 18990538, "updateLUN: Duplicated LUN name: vol1", "18990538 (Duplicated LUN name)", 2},
    };
    for (const auto &c : cases) {
        addLUN(3, "vol1", c.type);
        EXPECT_EQ(lun.updateLUN(c.name, c.size), c.code);
        EXPECT_EQ(logged(), oneLine(c.head, c.error));
        EXPECT_EQ(called().size(), c.calls);
        EXPECT_STREQ(recordOf(3).name, "vol1");
    }
}

TEST_F(LUNOperations, UpdateRefusesANameThatDoesNotFit)
{
    addLUN(3, "vol1");
    const std::string longest(255, 'n');
    EXPECT_EQ(lun.updateLUN(longest + 'n', 0), 18990025);
    EXPECT_EQ(logged(),
              (Lines{"StringCopy: Failed to copy string: " + longest + 'n',
                     oneLine("updateLUN: Failed to copy new LUN name.", "18990025 (Failed to copy string)")[0]}));
    EXPECT_STREQ(recordOf(3).name, "vol1");
    EXPECT_EQ(lun.updateLUN(longest, std::numeric_limits<unsigned long long>::max()), 18990502)
        << "the largest sizes are the platform's to judge";
    EXPECT_EQ(lun.updateLUN(longest, 0), 0);
    EXPECT_EQ(recordOf(3).name, longest);
}

TEST_F(LUNOperations, MappingsAreSentInAscendingOrder)
{
    addLUN(3, "vol1");
    for (int tid : {1, 3, 7})
        addTarget(tid, "t" + std::to_string(tid));
    EXPECT_EQ(lun.mapTarget({7, 1, 3}), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunMappingsAdd(1 3 7, 3, 3)"}));
    EXPECT_EQ(lun.unmapTarget({7, 1}), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunMappingsRemove(1 7, 3, 2)"}));
    EXPECT_EQ(fake::model().mappings.size(), 1u);
}

TEST_F(LUNOperations, MappingsAreOneTo256)
{
    addLUN(3, "vol1");
    std::set<int> most;
    for (int tid = 1; tid <= 256; ++tid) {
        addTarget(tid, "t" + std::to_string(tid));
        most.insert(tid);
    }
    EXPECT_EQ(lun.mapTarget(most), 0);
    EXPECT_EQ(lun.unmapTarget(most), 0);
    called();

    most.insert(257);
    for (const auto &ids : {std::set<int>(), most}) {
        const std::string count = std::to_string(ids.size());
        EXPECT_EQ(lun.mapTarget(ids), 18990710);
        EXPECT_EQ(logged(), oneLine("mapTarget: Invalid number of target ID: " + count, "18990710 (Bad target ID)"));
        EXPECT_EQ(lun.unmapTarget(ids), 18990710);
        EXPECT_EQ(logged(), oneLine("unmapTarget: Invalid number of target ID: " + count, "18990710 (Bad target ID)"));
        EXPECT_EQ(called(), (Lines{loaded, loaded})) << "no mapping call";
    }
}

TEST_F(LUNOperations, NothingIsDoneWithoutASelection)
{
    lun = ISCSILIBLUN();
    bool out = true;
    EXPECT_EQ(lun.loadLUNInfo(0), 18990530);
    EXPECT_EQ(lun.deleteLUN(), 18990530);
    EXPECT_EQ(lun.isLUNLocked(out), 18990530);
    EXPECT_EQ(lun.isLUNMapped(out), 18990530);
    EXPECT_EQ(lun.loadLUN(false, false), 18990530);
    EXPECT_EQ(lun.unloadLUN(false, false), 18990530);
    EXPECT_EQ(lun.updateLUN("", 0), 18990530);
    EXPECT_EQ(lun.mapTarget({}), 18990530);
    EXPECT_EQ(lun.unmapTarget({1}), 18990530);
    EXPECT_TRUE(out);
    EXPECT_EQ(called(), Lines());
    EXPECT_EQ(logged().size(), 18u);
}

} // namespace
} // namespace unit

#include "iscsiwebapi/ISCSIErrorCode.h"
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
    Lines oneLine(const std::string &head, int code) const
    {
        return {head + " info: " + lun.info.toString() + ". error: " + std::to_string(code) + " (" +
                ISCSI::ErrorCodeToString(code) + ")"};
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
    const auto adv = NORV_LUN_TYPE_ADV, none = NORV_LUN_TYPE_NONE, unknown = static_cast<_tag_iscsi_lun_type>(2);
    const std::string longest(4094, 'l');
    fake::model().volumes.insert(longest);
    const struct {
        std::string name;
        _tag_iscsi_lun_type type;
        std::string location;
        unsigned long long size;
        int code;
        std::string sentence;
        size_t calls; ///< of the platform, to which the rest is left
    } cases[] = {
        {"", adv, "/volume1", GIB, 18990503, "Invalid name to create LUN", 0},
        {std::string(256, 'n'), none, "", GIB, 18990503, "Invalid name to create LUN", 0},
        {"n", none, "", GIB, 18990500, "Invalid type to create LUN", 0},
        {"n", adv, "", GIB, 18990501, "Invalid location to create LUN", 0},
        {std::string(255, 'n'), adv, longest + "l", GIB, 18990501, "Invalid location to create LUN", 0},
        {std::string(255, 'n'), adv, longest, 1, 18990502, "Failed to create LUN", 1},
        {"n", unknown, "/volume1", GIB, 18990500, "Failed to create LUN", 1},
    };
    for (const auto &c : cases) {
        lun = ISCSILIBLUN(c.name, c.type, c.location, c.size, 0);
        EXPECT_EQ(lun.createLUN(), c.code) << c.type << ' ' << c.size;
        EXPECT_EQ(logged(), oneLine("createLUN: " + c.sentence + ".", c.code));
        EXPECT_EQ(called().size(), c.calls);
        EXPECT_TRUE(lun.info.isInvalid());
    }
    lun = ISCSILIBLUN("n", adv, "/volume1", GIB, 0);
    lun.info.uuid = std::string(37, 'u');
    EXPECT_EQ(lun.createLUN(), 18990025);
    EXPECT_EQ(logged().back(), oneLine("createLUN: Failed to fill ISCSI_LUN struct.", 18990025)[0]);
    EXPECT_EQ(called(), Lines());
}

TEST_F(LUNOperations, DeleteRemovesTheJobsOfExtentPoolLUNs)
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
    addLUN(3, "vol1");
    fake::answer("NORViSCSILunTaskGetSchIDByName", {0}); // an ID like any other, of no job
    EXPECT_EQ(lun.deleteLUN(), 0);
    EXPECT_EQ(called({"NORVSchedTaskRemove"}), Lines{"NORVSchedTaskRemove(0)"}) << "and no other schedule exists";
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
        fake::model().luns.at(3).record.options = 8;
        EXPECT_EQ(lun.unloadLUN(c.trash, c.unsync_size), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunUnload(" + uuidOf(3) + ", " + c.options + ")"}));
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
    const std::string type = "Cannot update a block LUN", size = "Cannot shrink LUN size. new_size: 1073741823";
    const struct {
        int type;
        std::string name;
        unsigned long long size;
        int code;
        std::string head;
        size_t calls;
    } cases[] = {
        {1, "new", 0, 18990500, type, 1},
        {1, "taken", 1, 18990500, type, 1},
        {15, "taken", GIB - 1, 18990502, size, 1},
        {3, "", GIB - 1, 18990502, size, 1},
        {15, "taken", 0, 18990538, "Duplicated LUN name: taken", 2},
        {7, "vol1", 0, 18990538, "Duplicated LUN name: vol1", 2},
    };
    for (const auto &c : cases) {
        addLUN(3, "vol1", c.type);
        EXPECT_EQ(lun.updateLUN(c.name, c.size), c.code);
        EXPECT_EQ(logged(), oneLine("updateLUN: " + c.head, c.code));
        EXPECT_EQ(called().size(), c.calls);
        EXPECT_STREQ(recordOf(3).name, "vol1");
    }
}

TEST_F(LUNOperations, UpdateRefusesANameThatDoesNotFit)
{
    addLUN(3, "vol1");
    const std::string longest(255, 'n');
    EXPECT_EQ(lun.updateLUN(longest + 'n', 0), 18990025);
    EXPECT_EQ(logged().back(), oneLine("updateLUN: Failed to copy new LUN name.", 18990025)[0]);
    EXPECT_STREQ(recordOf(3).name, "vol1");
    EXPECT_EQ(lun.updateLUN(longest, std::numeric_limits<unsigned long long>::max()), 18990502)
        << "the largest sizes are the platform's to judge";
    EXPECT_EQ(lun.updateLUN(longest, 0), 0);
    EXPECT_EQ(recordOf(3).name, longest);
}

TEST_F(LUNOperations, OneTo256MappingsAreSentInAscendingOrder)
{
    addLUN(3, "vol1");
    std::set<int> most;
    for (int tid = 1; tid <= 256; ++tid) {
        addTarget(tid, "t" + std::to_string(tid));
        most.insert(tid);
    }
    EXPECT_EQ(lun.mapTarget({7, 1, 3}), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunMappingsAdd(1 3 7, 3, 3)"}));
    EXPECT_EQ(lun.unmapTarget({7, 1}), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSILunMappingsRemove(1 7, 3, 2)"}));
    EXPECT_EQ(fake::model().mappings.size(), 1u);

    EXPECT_EQ(lun.mapTarget(most), 0);
    EXPECT_EQ(lun.unmapTarget(most), 0);
    called();

    most.insert(257);
    for (const auto &ids : {std::set<int>(), most}) {
        const std::string count = std::to_string(ids.size());
        EXPECT_EQ(lun.mapTarget(ids), 18990710);
        EXPECT_EQ(logged(), oneLine("mapTarget: Invalid number of target ID: " + count, 18990710));
        EXPECT_EQ(lun.unmapTarget(ids), 18990710);
        EXPECT_EQ(logged(), oneLine("unmapTarget: Invalid number of target ID: " + count, 18990710));
        EXPECT_EQ(called(), (Lines{loaded, loaded})) << "no mapping call";
    }
}

} // namespace
} // namespace unit

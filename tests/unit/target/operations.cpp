#include "iscsiwebapi/ISCSILIBTarget.h"
#include "tests/unit/Library.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBTarget::ISCSILIBTarget;

ISCSILIBTarget newTarget(bool is_enabled)
{
    return {
        "new",        "iqn.2000-01.example:new", is_enabled, true, false, 262144, 4096, 8, 2, "alice", SECRET, "bob",
        MUTUAL_SECRET};
}

using TargetOperations = LibraryTest;

TEST_F(TargetOperations, CreateMasksBeforeItEnables)
{
    addTarget(1, "one");
    for (bool is_enabled : {true, false}) {
        fake::model().targets.erase(2);
        ISCSILIBTarget target = newTarget(is_enabled);
        EXPECT_EQ(target.createTarget(), 0);
        EXPECT_EQ(called(), (Lines{"NORViSCSITargetCreate(new, iqn.2000-01.example:new, disabled)",
                                   "NORViSCSIDefaultACLSet(2, 3)", "NORViSCSITargetEnable(2)"}));
        EXPECT_EQ(target.info.tid, 2u);
        const auto &created = fake::model().targets.at(2);
        EXPECT_TRUE(created.record.enabled);
        EXPECT_STREQ(created.record.password, SECRET);
        EXPECT_STREQ(created.record.mutual_password, MUTUAL_SECRET);
        EXPECT_EQ(created.masking.size(), 1u);
    }
}

TEST_F(TargetOperations, CreateRefusesTextsThatDoNotFit)
{
    ISCSILIBTarget target = newTarget(true);
    target.info.mutual_password = MUTUAL_SECRET + std::string(64, 'x');
    EXPECT_EQ(target.createTarget(), 18990025);
    EXPECT_EQ(logged().back(), "createTarget: Failed to fill ISCSI_TARGET. target: " + target.info.toString());
    EXPECT_EQ(called(), Lines());
}

TEST_F(TargetOperations, DeleteLoadsTheTargetFirst)
{
    addTarget(5, "five");
    EXPECT_EQ(ISCSILIBTarget(5).deleteTarget(), 0);
    EXPECT_EQ(called(), (Lines{"NORViSCSIConfGet(0x1001, 5)", "NORViSCSITargetRemove(5)"}));
    EXPECT_EQ(ISCSILIBTarget(5).deleteTarget(), 18990722);
    EXPECT_EQ(called(), Lines{"NORViSCSIConfGet(0x1001, 5)"});
}

} // namespace
} // namespace unit

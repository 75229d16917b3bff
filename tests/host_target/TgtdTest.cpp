#include "host/target/Tgtd.h"

#include <gtest/gtest.h>

namespace norvhost {
namespace {

std::string shownTarget(int tid, const std::string &alias)
{
    return "Target " + std::to_string(tid) + ": iqn.2026-01.example:t" + std::to_string(tid) +
           "\n    System information:\n        Driver: iscsi\n        State: ready\n"
           "    I_T nexus information:\n        I_T nexus: 5\n            Initiator: iqn.2026-01.example:a alias: " +
           alias +
           "\n            Connection: 0\n                IP Address: 127.0.0.1\n"
           "    LUN information:\n        LUN: 0\n            Type: controller\n        LUN: 1\n"
           "            SCSI ID: 0123\n            SCSI SN: 4567\n            Readonly: Yes\n"
           "            Thin-provisioning: No\n            Backing store path: /run/x\n"
           "    Account information:\n        user\n        other (outgoing)\n"
           "    ACL information:\n        iqn.2026-01.example:a\n";
}

TEST(TgtdAnswer, IsReadTargetByTarget)
{
    std::vector<TgtdTarget> targets;
    ASSERT_TRUE(parseTargets(shownTarget(1, "none") + shownTarget(7, "alias: with alias:"), targets));
    ASSERT_EQ(targets.size(), 2u);
    const TgtdTarget &target = targets[1];
    EXPECT_EQ(target.tid, 7);
    EXPECT_EQ(target.iqn, "iqn.2026-01.example:t7");
    EXPECT_TRUE(target.ready);
    EXPECT_EQ(target.nexuses, std::vector<uint64_t>{5});
    ASSERT_EQ(target.units.size(), 1u);
    EXPECT_EQ(target.units[0].lun, 1u);
    EXPECT_EQ(target.units[0].path, "/run/x");
    EXPECT_EQ(target.units[0].serial, "4567");
    EXPECT_TRUE(target.units[0].read_only);
    EXPECT_EQ(target.users, (std::vector<std::string>{"user", "other (outgoing)"}));
    EXPECT_EQ(target.names, std::vector<std::string>{"iqn.2026-01.example:a"});
    EXPECT_TRUE(parseTargets("", targets));
    EXPECT_TRUE(targets.empty());
}

TEST(TgtdAnswer, LinesOfAnInitiatorsOwnAreNotBelieved)
{
    std::vector<TgtdTarget> targets;
    EXPECT_FALSE(parseTargets(shownTarget(1, "x\n"), targets));
    EXPECT_FALSE(parseTargets(shownTarget(1, "x\n    LUN information:\n        LUN: 9"), targets));
    EXPECT_FALSE(parseTargets(shownTarget(1, "x\n            Connection: 0\n                IP Address: 1.2.3.4\n"
                                             "    LUN information:\n    Account information:\n    ACL information:\n"
                                             "        ALL"),
                              targets));
    // The one text that passes line by line brings one target too many, which the daemon's own list has not.
    const std::string smuggled = "x\n            Connection: 0\n                IP Address: 1.2.3.4\n"
                                 "    LUN information:\n    Account information:\n    ACL information:\n" +
                                 shownTarget(2, "none").substr(0, shownTarget(2, "none").find("alias: ") + 7) + "y";
    EXPECT_TRUE(parseTargets(shownTarget(1, smuggled), targets));
    EXPECT_EQ(targets.size(), 2u);
    const std::string whole = shownTarget(1, "none");
    for (size_t length = 1; length < whole.size(); length += 7)
        EXPECT_FALSE(parseTargets(whole.substr(0, length), targets) && targets[0].names.size() == 1 &&
                     targets[0].names[0] == "iqn.2026-01.example:a");
}

} // namespace
} // namespace norvhost

#include "iscsiwebapi/ISCSILIBLUN.h"
#include "iscsiwebapi/ISCSINodeInfo.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSINodeInfo;
using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const std::string VLUN = "00000000-0000-4000-8000-000000000001"; // the first that the fake makes
const std::string MADE = "22222222-0000-4000-8000-000000000001"; // on the peer
const std::string UUID = uuidOf(3);
constexpr unsigned int STALL_LIMIT = 1800;

_tag_viscsi_virtual_lun_stats_ moved(uint64_t first, uint64_t second, int state = 0)
{
    return {second, first, 0, state, 0};
}

void localLUN()
{
    addLUN(3, "vol1");
    addNodes();
    fake::model().next_transfer.values = {moved(0, 0), moved(1, 2), moved(2, 2)};
}

/// One remote clone with its outputs.
struct Clone {
    ISCSILIBLUN lun{UUID};
    std::string vlun_uuid = "none";
    std::string dst_lun_uuid;

    int run(bool watch)
    {
        const ISCSINodeInfo node(PEER_NODE, "session", "peer.example", 5443, "https", "key", "admin", false);
        return lun.remoteClone("copy", node, "/volume2", {"b:3260", "a:3260"}, vlun_uuid, dst_lun_uuid, watch);
    }
};

class RemoteClone : public LibraryTest {
protected:
    RemoteClone() { localLUN(); }

    Clone clone;

    const std::string removed = "NORViSCSIVirtualLunRemove(" + VLUN + ")";
    const std::string deleted = "WebAPIClientLUNDelete(peer.example, /luns/" + MADE + ")";
};

TEST_F(RemoteClone, WithoutAWatcherItEndsWithTheBinding)
{
    EXPECT_EQ(clone.run(false), 0);
    EXPECT_EQ(clone.vlun_uuid, VLUN);
    EXPECT_EQ(clone.dst_lun_uuid, MADE);
    const std::string wish = R"({"extent_size":8192,"location":"/volume2","name":"copy","size":1073741824,"type":31})";
    EXPECT_EQ(called(),
              (Lines{"NORViSCSILunConfigGetByUUID(" + UUID + ", 0)", "NORViSCSIVirtualLunCreate(" + UUID + ", 2, 0)",
                     "WebAPIClientLUNCreate(peer.example, /luns, " + wish + ")",
                     std::string("DRNodeDB::Get(") + PEER_NODE + ")",
                     std::string("DRNodeDB::ListAttr(") + PEER_NODE + ", NORV.iSCSI)",
                     "NORViSCSIVirtualLunBindSink(" + VLUN + ", a:3260, " + PEER_NODE + ", " + MADE + ")"}));
    EXPECT_EQ(fake::model().virtual_luns.size(), 1u) << "the virtual LUN stays";
}

TEST_F(RemoteClone, OnlyExtentPoolLUNsAreCloned)
{
    for (int type : {1, 3, 7, 71}) {
        addLUN(3, "vol1", type);
        EXPECT_EQ(clone.run(true), 18990539);
        EXPECT_EQ(called(), (Lines{"NORViSCSILunConfigGetByUUID(" + UUID + ", 0)", "NORViSCSIVirtualLunRemove()"}));
        const Lines lines = logged();
        ASSERT_EQ(lines.size(), 3u);
        EXPECT_EQ(lines[0], "remoteClone: Cannot clone a non-ADV LUN. LUN: " + clone.lun.info.toString());
        EXPECT_EQ(lines[2], "remoteClone: Failed to delete vLUN: .");
    }
    EXPECT_EQ(clone.vlun_uuid + clone.dst_lun_uuid, "none");
    for (int type : {15, 31, 47, 79}) {
        addLUN(3, "vol1", type);
        EXPECT_EQ(Clone().run(false), 0);
    }
}

TEST_F(RemoteClone, TheWatcherRemovesTheVirtualLUNWhenAllIsMoved)
{
    EXPECT_EQ(clone.run(true), 0);
    EXPECT_EQ(called().back(), removed);
    EXPECT_EQ(logged(), Lines{"[info] remoteClone: Sync completed. local LUN: " + clone.lun.info.toString() +
                              ", destination LUN: " + MADE});
    EXPECT_EQ(fake::secondsSlept(), 2u) << "nothing moved of nothing is not complete";
}

TEST_F(RemoteClone, AFailedTransferDeletesOnlyADestinationMadeForIt)
{
    fake::model().next_transfer.values = {moved(1, 2), moved(1, 2, 28)};
    EXPECT_EQ(clone.run(true), 0);
    EXPECT_EQ(called({"NORViSCSIVirtualLunRemove", "WebAPIClientLUNDelete"}), (Lines{removed, deleted}));
    EXPECT_EQ(logged(), Lines{"remoteClone: Failed to clone LUN. error: No space left on device"});

    Clone given;
    given.dst_lun_uuid = "given";
    EXPECT_EQ(given.run(true), 0);
    EXPECT_EQ(called({"WebAPI"}), Lines());
    EXPECT_EQ(given.dst_lun_uuid, "given");
    fake::failCall("NORViSCSIVirtualLunBindSink", 1, INJECTED);
    EXPECT_EQ(given.run(true), 18991004);
    EXPECT_EQ(called({"WebAPI"}), Lines());
}

TEST_F(RemoteClone, ATransferThatStandsStillIsGivenUp)
{
    fake::model().next_transfer.values = {moved(0, 9), moved(1, 9), moved(2, 9)};
    EXPECT_EQ(clone.run(true), 0);
    EXPECT_EQ(called({"NORViSCSIVirtualLunRemove", "WebAPIClientLUNDelete"}), (Lines{removed, deleted}));
    EXPECT_EQ(logged(), Lines{"remoteClone: Reach max retry count."});
    // One poll each until the last progress, then the limit.
    EXPECT_EQ(fake::secondsSlept(), 3 + STALL_LIMIT);
}

const Operation operations[] = {
    {"remoteClone",
     localLUN,
     [](auto &) { return Clone().run(true); },
     "",
     {{"NORViSCSILunConfigGetByUUID WebAPIClientLUNCreate", INJECTED, Then::CLEANS_UP},
      {"NORViSCSIVirtualLunCreate", 18991003, Then::CLEANS_UP},
      {"DRNodeDB::Get", 18991112, Then::CLEANS_UP},
      {"DRNodeDB::ListAttr", 0, Then::GOES_ON},
      {"NORViSCSIVirtualLunBindSink", 18991004, Then::CLEANS_UP},
      {"NLIBCProcForkChildNoWait", 18990014, Then::CLEANS_UP},
      {"NORViSCSIVirtualLunStatsGet NORViSCSIVirtualLunRemove", 0, Then::ONLY_THE_LOG_TELLS}}},
};

INSTANTIATE_TEST_SUITE_P(RemoteClone, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

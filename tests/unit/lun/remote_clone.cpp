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
    const std::string deleted = "WebAPIClientLUNDelete(peer.example, " + MADE + ")";

    Lines lastCalls(size_t count) const
    {
        const Lines all = called();
        return Lines(all.end() - static_cast<long>(std::min(count, all.size())), all.end());
    }
};

TEST_F(RemoteClone, WithoutAWatcherItEndsWithTheBinding)
{
    EXPECT_EQ(clone.run(false), 0);
    EXPECT_EQ(clone.vlun_uuid, VLUN);
    EXPECT_EQ(clone.dst_lun_uuid, MADE);
    EXPECT_EQ(called(),
              (Lines{"NORViSCSILunConfigGetByUUID(" + UUID + ", 0)", "NORViSCSIVirtualLunCreate(" + UUID + ", 2, 0)",
                     "WebAPIClientLUNCreate(peer.example, copy, 31, /volume2, 1073741824, 8192)",
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
    EXPECT_EQ(lastCalls(2), (Lines{"NORViSCSIVirtualLunStatsGet(" + VLUN + ", 0)", removed}));
    EXPECT_EQ(logged(), Lines{"[info] remoteClone: Sync completed. local LUN: " + clone.lun.info.toString() +
                              ", destination LUN: " + MADE});
    EXPECT_EQ(fake::secondsSlept(), 2u) << "nothing moved of nothing is not complete";
}

TEST_F(RemoteClone, AFailedTransferDeletesOnlyADestinationMadeForIt)
{
    fake::model().next_transfer.values = {moved(1, 2), moved(1, 2, 28)};
    EXPECT_EQ(clone.run(true), 0);
    EXPECT_EQ(lastCalls(2), (Lines{removed, deleted}));
    EXPECT_EQ(logged(), Lines{"remoteClone: Failed to clone LUN. error: No space left on device"});

    Clone given;
    given.dst_lun_uuid = "given";
    EXPECT_EQ(given.run(true), 0);
    for (const std::string &call : called())
        EXPECT_EQ(call.rfind("WebAPI", 0), std::string::npos) << call;
    EXPECT_EQ(given.dst_lun_uuid, "given");
    fake::failCall("NORViSCSIVirtualLunBindSink", 1, INJECTED);
    EXPECT_EQ(given.run(true), 18991004);
    for (const std::string &call : called())
        EXPECT_EQ(call.rfind("WebAPI", 0), std::string::npos) << call;
}

TEST_F(RemoteClone, ATransferThatStandsStillIsGivenUp)
{
    fake::model().next_transfer.values = {moved(0, 9), moved(1, 9), moved(2, 9)};
    EXPECT_EQ(clone.run(true), 0);
    EXPECT_EQ(lastCalls(2), (Lines{removed, deleted}));
    EXPECT_EQ(logged(), Lines{"remoteClone: Reach max retry count."});
    // One poll each until the last progress, then the limit.
    EXPECT_EQ(fake::secondsSlept(), 3 + STALL_LIMIT);
}

Operation remoteClone(const char *name, bool watch, const std::vector<Failure> &failures)
{
    const auto run = [watch] {
        Clone clone;
        const int code = clone.run(watch);
        return Outcome{code, clone.lun.info.toString(), clone.vlun_uuid + " " + clone.dst_lun_uuid};
    };
    Operation result = operation(name, localLUN, run, "none ");
    result.failures = failures;
    return result;
}

const std::string NO_VLUN =
    "deleteVLUN: Failed to delete vLUN. vLUN: uuid:  ,type: 1 ,src_lun_uuid: " + UUID + ". error: 18991001";
const std::string VLUN_TEXT = "uuid: " + VLUN + " ,type: 1 ,src_lun_uuid: " + UUID;
const std::string NOT_BOUND = "remoteClone: Failed to bind vLUN: " + VLUN + " to dst LUN: " + MADE + ".";
const std::string BOTH = VLUN + " " + MADE;

const std::vector<Failure> before_the_binding = {
    cleansUp(
        "NORViSCSILunConfigGetByUUID", INJECTED, "loadFromConfig: Failed to load LUN info from SDK. LUN UUID: " + UUID,
        "remoteClone: Failed to load LUN info from SDK. LUN: {info}", NO_VLUN, "remoteClone: Failed to delete vLUN: ."),
    cleansUp("NORViSCSIVirtualLunCreate", 18991003,
             "createVLUN: Failed to create vLUN. vLUN: uuid:  ,type: 1 ,src_lun_uuid: " + UUID + ". error: {code}",
             "remoteClone: Failed to create vLUN. local LUN: {info}.", NO_VLUN,
             "remoteClone: Failed to delete vLUN: ."),
    cleansUp("WebAPIClientLUNCreate", INJECTED, "remoteClone: Failed to create destination LUN. local LUN: {info}.")
        .leaving(VLUN + " "),
    cleansUp("DRNodeDB::Get", 18991112,
             std::string("loadFromDRNode: Failed to get node info from DR Node. UUID: ") + PEER_NODE,
             std::string("bind: Failed to load destination node info. node: uuid: ") + PEER_NODE +
                 " ,is_local_node: false ,rod_key:  ,hostname:  ,port: 0 ,protocol:  ,session_id: ",
             NOT_BOUND)
        .leaving(BOTH),
    goesOn("DRNodeDB::ListAttr").leaving(BOTH),
    cleansUp("NORViSCSIVirtualLunBindSink", 18991004,
             "bind: Failed to bind vLUN. vLUN: " + VLUN_TEXT + ". error: {code}", NOT_BOUND)
        .leaving(BOTH),
};

std::vector<Failure> with(std::vector<Failure> failures, const std::vector<Failure> &more)
{
    failures.insert(failures.end(), more.begin(), more.end());
    return failures;
}

const Operation operations[] = {
    remoteClone("remoteCloneUnwatched", false, before_the_binding),
    remoteClone(
        "remoteCloneWatched", true,
        with(before_the_binding,
             {cleansUp("NLIBCProcForkChildNoWait", 18990014, "remoteClone: Failed to fork a process.").leaving(BOTH),
              workerGoesOn("NORViSCSIVirtualLunStatsGet",
                           "loadStatus: Failed to load status. vLUN: " + VLUN_TEXT + ". error: {code}",
                           "remoteClone: Failed to vLUN state: " + VLUN + "."),
              endsWorker("NORViSCSIVirtualLunRemove",
                         "deleteVLUN: Failed to delete vLUN. vLUN: " + VLUN_TEXT + ". error: {code}",
                         "remoteClone: Failed to delete vLUN: " + VLUN + ".")})),
};

INSTANTIATE_TEST_SUITE_P(RemoteClone, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit

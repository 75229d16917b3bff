// Locks, creating a pair, the waits, role change, status and removal.
#include "tests/unit/replication/Pair.h"

#include <filesystem>
#include <functional>

#include <unistd.h>

namespace unit {
namespace {

using ISCSI::LIB::LIBReplication::ISCSILIBReplication;

const std::string MADE = "22222222-0000-4000-8000-000000000001"; // on the peer

class Replication : public LibraryTest {
protected:
    ISCSILIBReplication replication{TASK};

    std::string line(const std::string &head, const std::string &error) const
    {
        return head + ". info: " + replication.task.toString() + ". error: " + error;
    }
};

TEST_F(Replication, TheLockIsRecursiveInOneObjectAndHeldAgainstOthers)
{
    EXPECT_EQ(replication.lockTask(), 0);
    EXPECT_EQ(called(),
              (Lines{"NORVFSMkdirP(/tmp/iscsi, 0, 1, -1, -1, -1)", "NLIBCFileLockByFile(" + LOCK_FILE + ", 1)"}));
    EXPECT_EQ(replication.lockTask(), 0);
    EXPECT_EQ(replication.blockingLockTask(), 0);
    EXPECT_EQ(called(), Lines());
    ISCSILIBReplication other(TASK);
    EXPECT_EQ(other.lockTask(), 18990808);
    EXPECT_EQ(other.lock_fd, -1);
    EXPECT_EQ(logged(), Lines{line("lockTask: Another process locked this task", "18990808 (Task is locked)")});
    for (int depth = 2; depth >= 0; --depth) {
        EXPECT_EQ(fake::lockedFiles(), Lines{LOCK_FILE});
        EXPECT_EQ(replication.lock_depth, depth);
        EXPECT_EQ(replication.unlockTask(), 0);
    }
    EXPECT_EQ(fake::lockedFiles(), Lines());
    EXPECT_EQ(replication.unlockTask(), 0) << "nothing is held";
    called();

    ISCSILIBReplication nameless;
    EXPECT_EQ(nameless.lockTask(), 18990819);
    EXPECT_EQ(nameless.blockingLockTask(), 18990819);
    EXPECT_EQ(called(), Lines());
    EXPECT_EQ(logged().size(), 2u);
}

TEST_F(Replication, ABlockingLockWaitsForADay)
{
    fake::answer("NLIBCFileLockTimeByFile", {0, 0, 1});
    EXPECT_EQ(replication.blockingLockTask(), 0);
    EXPECT_EQ(called().size(), 4u);
    ISCSILIBReplication other(TASK);
    EXPECT_EQ(other.blockingLockTask(), 18990010);
    EXPECT_EQ(logged(),
              Lines{line("blockingLockTask: Timeout. Failed to wait until get blocking task", "18990010 (Timeout)")});
    EXPECT_EQ(called().size(), 1u + 86400u);

    fake::failCall("NLIBCFileUnlockByFile", 1, 0);
    EXPECT_EQ(replication.unlockTask(), 0);
    EXPECT_EQ(replication.lock_fd, -1);
    EXPECT_EQ(logged(), Lines{line("unlockTask: Failed to unlock task", "0 (Success)")});
}

TEST_F(Replication, OnlyAWorkerWithoutTheLockExits)
{
    fake::failCall("NLIBCProcForkChildNoWait", 1, -11);
    EXPECT_EQ(replication.forkProcessIfNotChild(), 18990014);
    EXPECT_EQ(logged(),
              Lines{line("forkProcessIfNotChild: Failed to fork a process", "-11 (Resource temporarily unavailable)")});
    replication.childProcessExit();
    replication.is_child = true;
    replication.lock_fd = 99;
    const auto go_on = [this] {
        replication.childProcessExit();
        _exit(7);
    };
    EXPECT_EXIT(go_on(), testing::ExitedWithCode(7), "") << "it holds the lock";
    called();
    EXPECT_EQ(replication.forkProcessIfNotChild(), 0);
    EXPECT_EQ(called(), Lines()) << "a worker never forks again";
    replication.lock_fd = -1;
    EXPECT_EXIT(replication.childProcessExit(), testing::ExitedWithCode(0), "");
}

TEST_F(Replication, CreatingMakesALUNAndATaskOnBothSides)
{
    noTask();
    fake::model().peer.states.values = {{true, 0}, {true, 0}, {false, 0}};
    ISCSILIBReplication creation(SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", "copy");
    EXPECT_EQ(creation.createReplication(), 0);
    ASSERT_EQ(fake::model().tasks.size(), 1u);
    const auto &record = fake::model().tasks[0].record;
    EXPECT_EQ(creation.task.uuid, record.uuid);
    EXPECT_EQ(record.is_source, 1);
    EXPECT_STREQ(record.root_path, "/volume1");
    const std::string poll = "WebAPIClientLUNGet(peer.example, /luns/" + MADE + ")";
    const std::string wish = R"({"extent_size":8192,"location":"/volume2","name":"copy","size":1073741824,"type":31})";
    EXPECT_EQ(
        called({"WebAPI"}),
        (Lines{"WebAPIClientLUNCreate(peer.example, /luns, " + wish + ")", poll, poll, poll,
               "WebAPIClientNodeGet(peer.example, peer.example)",
               R"(WebAPIClientReplicationCreateTask(peer.example, /replications/tasks, {"dst_lun_uuid":")" + MADE +
                   R"(","dst_node_uuid":")" + PEER_NODE + R"(","is_source":false,"src_lun_uuid":")" + SOURCE +
                   R"(","src_node_uuid":")" + LOCAL_NODE + R"(","uuid":")" + creation.task.uuid + "\"})"}));
    const auto &keys = fake::model().node_attributes;
    ASSERT_EQ(keys.size(), 2u);
    EXPECT_EQ(keys[0].node_id + keys[0].value, std::string(PEER_NODE) + "peer-rod-key");
    EXPECT_EQ(keys[1].node_id + keys[1].value, std::string(LOCAL_NODE) + "local-rod-key");
    EXPECT_EQ(fake::secondsSlept(), 2u);

    ISCSILIBReplication half(TASK, false, SOURCE, DESTINATION, PEER_NODE, LOCAL_NODE);
    addLUN(4, "copy", NORV_LUN_TYPE_SINK);
    EXPECT_EQ(half.createTask(), 0);
    EXPECT_EQ(half.task.uuid, TASK);
    EXPECT_STREQ(fake::model().tasks[1].record.uuid, TASK.c_str());
}

TEST_F(Replication, CreatingRefusesBadInputBeforeAnythingIsSent)
{
    sourceSide();
    ISCSILIBReplication creations[] = {
        {"", LOCAL_NODE, PEER_NODE, "/volume2", "copy"}, {SOURCE, "", PEER_NODE, "/volume2", "copy"},
        {SOURCE, LOCAL_NODE, "", "/volume2", "copy"},    {SOURCE, LOCAL_NODE, PEER_NODE, "", "copy"},
        {SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", ""},
    };
    for (auto &creation : creations) {
        EXPECT_EQ(creation.createReplication(), 18990201);
        EXPECT_EQ(called(), Lines());
        EXPECT_EQ(logged(), Lines{"createReplication: Failed to load source LUN's info. info: " +
                                  creation.task.toString() + ". error: 18990000 (Default error code)"});
    }
    addLUN(3, "vol1", NORV_LUN_TYPE_THIN);
    ISCSILIBReplication thin(SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", "copy");
    EXPECT_EQ(thin.createReplication(), 18990500);
    EXPECT_EQ(called({"WebAPI"}), Lines());

    noTask();
    fake::failCall("WebAPIClientReplicationCreateTask", 1, INJECTED);
    fake::failCall("WebAPIClientLUNDelete", 1, 5);
    ISCSILIBReplication refused(SOURCE, LOCAL_NODE, PEER_NODE, "/volume2", "copy");
    EXPECT_EQ(refused.createReplication(), INJECTED) << "whatever becomes of the clean-up";
    EXPECT_TRUE(fake::model().tasks.empty());
}

TEST_F(Replication, WaitsOnThePeerPollOnceASecond)
{
    sourceSide();
    ASSERT_EQ(replication.task.loadFromConfig(replication.task_record, true), 0);
    using States = std::vector<fake::PeerState>;
    const States stuck = {{true, 0}};
    States moving;
    for (unsigned long long second = 0; second < 60; ++second)
        moving.push_back({true, 1 + second / 9});
    moving.push_back({false, 0});
    const auto lun_unlocked = [&] { return replication.waitUntilRemoteLUNUnlock(10); };
    const auto task_unlocked = [&] { return replication.waitUntilRemoteTaskUnlock(10); };
    const auto lun_synced = [&] { return replication.waitUntilRemoteLUNSyncDone(10); };
    const auto snapshot_synced = [&] { return replication.waitUntilRemoteSnapshotSyncDone("S", 10); };
    const auto unlimited = [&] { return replication.waitUntilRemoteLUNUnlock(0); };
    const std::string timeout = "18990010 (Timeout)", none = "0 (Success)"; // as two of them are told
    const struct {
        std::function<int()> wait;
        States states;
        unsigned int seconds;
        std::string head, error; ///< empty: the wait ends well
    } cases[] = {
        {lun_unlocked, moving, 10, "waitUntilRemoteLUNUnlock: Timeout! Failed to wait until remote lun unlocked", none},
        {task_unlocked, stuck, 10, "waitUntilRemoteTaskUnlock: Timeout! Failed to wait until remote task unlocked",
         none},
        {lun_synced, moving, 60, "", ""},
        {lun_synced, stuck, 10, "waitUntilRemoteLUNSyncDone: Timeout! Failed to wait until LUN sync completed",
         timeout},
        {snapshot_synced, stuck, 10,
         "waitUntilRemoteSnapshotSyncDone: Timeout! Failed to wait until snapshot sync completed", timeout},
        {unlimited, moving, 60, "", ""},
    };
    for (const auto &c : cases) {
        fake::forgetSleep();
        fake::model().peer.states = {c.states};
        EXPECT_EQ(c.wait(), c.head.empty() ? 0 : 18990010);
        EXPECT_EQ(fake::secondsSlept(), c.seconds);
        EXPECT_EQ(logged(), c.head.empty() ? Lines() : Lines{line(c.head, c.error)});
    }
    EXPECT_EQ(called({"WebAPI"}).back(), "WebAPIClientLUNGet(peer.example, /luns/" + DESTINATION + ")");
    replication.waitUntilRemoteSnapshotSyncDone("S", 1);
    EXPECT_EQ(called({"WebAPI"}).back(), "WebAPIClientLUNGetSnapshot(peer.example, /snapshots/S)");
}

TEST_F(Replication, StatusTellsWhetherTheTaskIsLocked)
{
    sourceSide();
    fake::model().luns[3].map_file.base_version = BASE;
    bool is_locked = true;
    std::string version;
    EXPECT_EQ(replication.getStatus(is_locked, version), 0);
    EXPECT_FALSE(is_locked);
    EXPECT_EQ(version, BASE);
    EXPECT_EQ(fake::lockedFiles(), Lines());
    EXPECT_EQ(replication.lockTask(), 0);
    ISCSILIBReplication other(TASK);
    EXPECT_EQ(other.getStatus(is_locked, version), 0);
    EXPECT_TRUE(is_locked);
    EXPECT_EQ(replication.getStatus(is_locked, version), 0);
    EXPECT_TRUE(is_locked);
    EXPECT_GE(replication.lock_fd, 0);
}

TEST_F(Replication, RolesChangeOnlyInOneDirectionAndUnmapped)
{
    destinationSide();
    addMapping(5, 4);
    EXPECT_EQ(replication.demote(), 18990800);
    EXPECT_EQ(replication.promote(), 18990534);
    EXPECT_EQ(logged(), (Lines{line("demote: Not a source task", "18990800 (Not a source task)"),
                               line("promote: LUN is mapped. Please unmap the target", "18990534 (LUN is mapped)")}));
    EXPECT_EQ(fake::model().tasks[0].record.is_source, 0);
    fake::model().mappings.clear();
    EXPECT_EQ(replication.promote(), 0);
    EXPECT_EQ(fake::model().tasks[0].record.is_source, 1);

    addLUN(3, "vol1");
    EXPECT_EQ(replication.promote(), 18990801);
    EXPECT_EQ(logged(), Lines{line("promote: Not a destination task", "18990801 (Not a destination task)")});
    addMapping(5, 3);
    EXPECT_EQ(replication.demote(), 18990534);
    fake::model().mappings.clear();
    EXPECT_EQ(replication.demote(), 0);
    EXPECT_EQ(fake::model().tasks[0].record.is_source, 0);
    EXPECT_EQ(fake::lockedFiles(), Lines());
}

TEST_F(Replication, RemovalKeepsOrDeletesTheSinkLUN)
{
    destinationSide();
    writeFile(LOCK_FILE, "");
    EXPECT_EQ(replication.deleteReplication(false), 0);
    EXPECT_EQ(recordOf(4).type, NORV_LUN_TYPE_ADV);
    EXPECT_TRUE(fake::model().tasks.empty());
    EXPECT_FALSE(std::filesystem::exists(LOCK_FILE));

    addTask(false);
    EXPECT_EQ(replication.deleteReplication(true), 0);
    EXPECT_EQ(fake::model().luns.count(4), 0u);
    EXPECT_EQ(logged(), Lines()) << "a lock file that was never there is no failure";

    addTask(false);
    EXPECT_EQ(replication.deleteReplication(true), 0) << "the LUN is gone already";
    EXPECT_TRUE(fake::model().tasks.empty());
    for (const std::string &text : logged())
        EXPECT_EQ(text.find("deleteReplication"), std::string::npos) << text;

    fake::reset();
    sourceSide();
    std::filesystem::create_directories(LOCK_FILE);
    EXPECT_EQ(replication.deleteReplication(true), 0);
    EXPECT_EQ(logged(), Lines{line("deleteTask: Failed to delete lock file", "-21 (Is a directory)")});
    EXPECT_EQ(fake::model().luns.count(3), 1u) << "the source LUN stays";
    std::filesystem::remove(LOCK_FILE);
}

} // namespace
} // namespace unit

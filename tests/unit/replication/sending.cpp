#include "tests/unit/replication/Pair.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBReplication::ISCSILIBReplication;

const char *const OPTION = "10.0.0.9";

class Sending : public LibraryTest {
protected:
    Sending() { sourceSide(); }

    ISCSILIBReplication replication{TASK};

    int send(const std::string &snapshot = SNAPSHOT)
    {
        return replication.sendSnapshot(snapshot, OPTION, 99, true, true);
    }

    /// Calls of sending and of the peer, since the last look.
    static Lines sent()
    {
        return called(
            {"WebAPIClient", "NORViSCSIReplicationTaskSend", "NORVLogSet1", "NORViSCSIReplicationTaskProgressAdd"});
    }

    static std::string sending(const std::string &base, const std::string &how)
    {
        return "NORViSCSIReplicationTaskSendSnapshot(" + TASK + ", 10.0.0.9, kept-rod-key, " + SNAPSHOT + ", " + base +
               ", 99, " + how + ")";
    }

    std::string line(const std::string &head, int error) const
    {
        return "sendSnapshot: " + head + ". info: " + replication.task.toString() + ". error: " + shown(error);
    }

    std::string retold(int error) const
    {
        return "[E] sendSnapshot: error code: " + shown(error) + " [" + replication.task.toString() + "]";
    }

    static std::string listed(const std::string &snapshot)
    {
        return R"({"uuid":")" + snapshot + R"(","version":")" + snapshotUUIDOf(3, 9999) + "\"}";
    }

    const std::string asked = "WebAPIClientReplicationGetBaseVersion(peer.example, /replications/" + TASK +
                              R"(/base-version, {"snapshots":[)" + listed(SNAPSHOT) + "," + listed(BASE) + "]})";
    const std::string resized = "WebAPIClientLUNSet(peer.example, /luns/" + DESTINATION + R"(, {"size":1073741824}))";
    const std::string taken = "WebAPIClientLUNTakeSnapshot(peer.example, /luns/" + DESTINATION +
                              R"(/snapshots, {"description":"before the move","is_app_consistent":true,)"
                              R"("is_scheduled":false,"is_user_locked":true,"snapshot_time":1234571492,)"
                              R"("taken_by":"alice"}))";
    const std::string polled =
        "WebAPIClientLUNGetSnapshot(peer.example, /snapshots/22222222-0000-4000-8000-000000000002)";
};

TEST_F(Sending, AWorkerFollowsTheTransferAndTakesTheSnapshotOnThePeer)
{
    EXPECT_EQ(send(), 0);
    EXPECT_FALSE(replication.is_child);
    EXPECT_GE(replication.lock_fd, 0) << "the caller leaves the task locked";
    EXPECT_EQ(sent(), (Lines{asked, resized, sending(BASE, "difference, encrypted, not the last try"), taken, polled}));
    EXPECT_EQ(logged(), Lines());
    EXPECT_EQ(fake::lockedFiles(), Lines()) << "the worker unlocked it";

    ISCSILIBReplication full(TASK);
    fake::model().peer.base_version.clear();
    fake::model().peer.need_full_sync = true;
    EXPECT_EQ(full.sendSnapshot(SNAPSHOT, OPTION, 99, false, false), 0);
    EXPECT_EQ(sent()[2], sending("(null)", "full, plain, not the last try"));
    EXPECT_EQ(logged(), Lines{line("No base snapshot found. Need full sync", 0)});
}

TEST_F(Sending, OnlyASnapshotOfTheSourceLUNIsSent)
{
    addLUN(5, "other");
    addSnapshot(5, 1, "foreign");
    EXPECT_EQ(send(snapshotUUIDOf(5, 1)), 18990519);
    EXPECT_EQ(logged(), Lines{line("This snapshot is not taken from source LUN. snapshot UUID: " + snapshotUUIDOf(5, 1),
                                   18990519)});
    fake::model().tasks.clear();
    addLUN(4, "sink", NORV_LUN_TYPE_SINK);
    addTask(false);
    EXPECT_EQ(send(), 18990800);
    EXPECT_EQ(logged(), Lines{line("Not a source task", 18990800)});
    EXPECT_EQ(sent(), Lines());
    EXPECT_EQ(fake::lockedFiles(), Lines());
}

TEST_F(Sending, WaitsForThePeerToSetItsLUNBack)
{
    fake::model().peer.not_aligned = true;
    fake::model().peer.states.values = {{true, 0}, {false, 0}};
    EXPECT_EQ(send(), 0);
    const std::string waited = "WebAPIClientLUNGet(peer.example, /luns/" + DESTINATION + ")";
    EXPECT_EQ(sent(), (Lines{asked, waited, waited, resized, sending(BASE, "difference, encrypted, not the last try"),
                             taken, polled}));
    EXPECT_EQ(logged(), Lines{line("Base snapshot and LUN are not aligned. base: " + BASE, 0)});

    fake::model().peer.states = {{{true, 0}}};
    ISCSILIBReplication stuck(TASK);
    EXPECT_EQ(stuck.sendSnapshot(SNAPSHOT, OPTION, 99, false, false), 0);
    EXPECT_EQ(logged().back(), retold(18990010));
    EXPECT_EQ(fake::lockedFiles(), Lines());
}

TEST_F(Sending, TriesAgainThreeTimes)
{
    using Progress = std::vector<_tag_iscsi_task_progress_>;
    const auto broken = progressOf(1, 2, -5);
    const auto done = progressOf(2, 2);
    const std::string first = "not the last try", last = "last try";
    const struct {
        Progress progress;
        std::vector<std::string> tries;
        bool is_taken;
        int error;
        unsigned int seconds;
    } cases[] = {
        {{broken, broken, broken, done}, {first, first, first, last}, true, 0, 90},
        {{broken, broken, broken, broken}, {first, first, first, last}, false, 18990886, 90},
        {{broken, progressOf(1, 2, -71)}, {first, first}, false, 18990886, 30},
        {{broken, progressOf(1, 2, -19)}, {first, first}, false, 0, 30},
        {{broken, broken, broken, progressOf(1, 2, -19)}, {first, first, first, last}, false, 18990886, 90},
        {{progressOf(1, 9), progressOf(2, 9), progressOf(2, 9, 0, 1)}, {first}, false, 18990010, 1803},
        {{progressOf(0, 0), progressOf(0, 0), done}, {first}, true, 0, 2},
    };
    for (const auto &c : cases) {
        fake::model().tasks[0].progress = {c.progress};
        fake::forgetSleep();
        ISCSILIBReplication attempt(TASK);
        EXPECT_EQ(attempt.sendSnapshot(SNAPSHOT, OPTION, 99, false, true), 0);
        Lines expected = {asked, resized};
        for (const std::string &which : c.tries)
            expected.push_back(sending(BASE, "difference, encrypted, " + which));
        if (c.is_taken)
            expected.insert(expected.end(), {taken, polled});
        EXPECT_EQ(sent(), expected);
        EXPECT_EQ(fake::secondsSlept(), c.seconds);
        const Lines lines = logged();
        replication.task = attempt.task;
        if (c.error != 0)
            EXPECT_EQ(lines.back(), retold(c.error));
        else
            EXPECT_TRUE(lines.empty() || lines.back().rfind("waitUntilSendingCompleted", 0) == 0);
        EXPECT_EQ(fake::lockedFiles(), Lines());
    }
    EXPECT_EQ(fake::model().tasks[0].progress.values.size(), 3u);
}

TEST_F(Sending, ARetryIsToldAndWaitsForBothSnapshots)
{
    fake::model().tasks[0].progress.values = {progressOf(1, 2, -110), progressOf(2, 2)};
    fake::model().snapshots.at({3, 1}).is_locked = true;
    EXPECT_EQ(send(), 0);
    EXPECT_EQ(logged(),
              (Lines{"waitUntilSendingCompleted: Failed to send a snapshot. Max retry count: 3. info: " +
                         replication.task.toString() + ". error: -110 (Connection timed out)",
                     "waitUntilSnapshotUnlock: Timeout! Failed to wait until snapshot unlocked. info: " +
                         replication.task.toString() + ". error: 18990010 (Timeout)",
                     line("Failed to wait until snapshot unlock. uuid: " + BASE, 18990010), retold(18990010)}));
    EXPECT_EQ(fake::secondsSlept(), 60u);
}

TEST_F(Sending, ARefusedRemoteSnapshotIsAnEventAndStaysInTheProgress)
{
    const std::pair<int, const char *> cases[] = {
        {18990002, "Out of volume space"}, {18990543, "Maximum snapshot count reached"}, {7, "Internal error"}};
    for (const auto &[code, reason] : cases) {
        fake::failCall("WebAPIClientLUNTakeSnapshot", 1, code);
        ISCSILIBReplication attempt(TASK);
        EXPECT_EQ(attempt.sendSnapshot(SNAPSHOT, OPTION, 99, false, true), 0);
        const Lines calls = sent();
        ASSERT_EQ(calls.size(), 6u);
        EXPECT_EQ(calls[4], "NORVLogSet1(9, 1, 0x13d0000d, vol1, " + std::string(reason) + ", (null), (null))");
        EXPECT_EQ(calls[5], "NORViSCSIReplicationTaskProgressAdd(" + TASK + ", " + std::to_string(code) + ")");
        replication.task = attempt.task;
        EXPECT_EQ(logged(), (Lines{line("Failed to take a snapshot from destination LUN", code), retold(code)}));
    }
}

class Receiving : public LibraryTest {
protected:
    Receiving() { destinationSide(); }

    ISCSILIBReplication replication{TASK};
    std::string base = "before";
    bool need_full_sync = true, not_aligned = true;

    int choose(const std::vector<std::string> &versions)
    {
        return replication.getBaseVersion(sourceSnapshots(versions), base, need_full_sync, not_aligned);
    }

    std::string line(const std::string &head, int error) const
    {
        return "getBaseVersion: " + head + ". info: " + replication.task.toString() + ". error: " + shown(error);
    }
};

TEST_F(Receiving, AModifiedLUNWithoutACommonSnapshotNeedsAll)
{
    auto &file = fake::model().luns[4].map_file;
    file.total_count = 2; // moved, of which 1 arrived
    file.synced_count = 1;
    EXPECT_EQ(choose({SNAPSHOT}), 0);
    EXPECT_EQ(base, SNAPSHOT) << "the sending that broke modified it";
    EXPECT_FALSE(need_full_sync || not_aligned);
    file.synced_count = 2;
    EXPECT_EQ(choose({SNAPSHOT}), 0);
    EXPECT_EQ(base, "");
    EXPECT_TRUE(need_full_sync);
    EXPECT_EQ(logged(), Lines{line("No base snapshot found. Need FULL SYNC", 0)});
}

TEST_F(Receiving, AWorkerSetsTheLUNBackToTheNewestCommonSnapshot)
{
    EXPECT_EQ(choose({SNAPSHOT, BASE}), 0);
    EXPECT_EQ(base, BASE);
    EXPECT_FALSE(need_full_sync);
    EXPECT_TRUE(not_aligned);
    EXPECT_EQ(logged(), Lines{line("Base snapshot and LUN are not aligned. base: " + BASE, 0)});
    EXPECT_EQ(fake::lockedFiles(), Lines());
    EXPECT_EQ(called({"NORViSCSISnapshotRestore"}),
              Lines{"NORViSCSISnapshotRestore(" + snapshotUUIDOf(4, 1) + ", " + DESTINATION + ")"});

    ISCSILIBReplication source(TASK);
    fake::model().tasks.clear();
    addLUN(3, "vol1");
    addTask(true);
    base = "before";
    EXPECT_EQ(source.getBaseVersion({}, base, need_full_sync, not_aligned), 18990801);
    EXPECT_EQ(base, "before");
}

} // namespace
} // namespace unit

/// What a kill at any moment of an action on snapshots leaves: whole data, no lock, and nothing that the next command
/// does not put right.
#include "KillAt.h"
#include "SnapshotTest.h"

#include "host/state/Database.h"

#include <csignal>
#include <map>
#include <memory>
#include <poll.h>
#include <random>
#include <unistd.h>

namespace norvhost {
namespace {

struct SnapshotKillTest : SnapshotTest {
    _tag_iscsi_lun_ lun = {};
    _tag_iscsi_snapshot_ first = {}, second = {};
    std::map<std::string, size_t> digests; ///< of the snapshots' data, by UUID

    std::unique_ptr<StateKeeper> keeper;

    /// A LUN with the data of `second`, and two snapshots.
    void prepare(uint64_t size, uint64_t distance)
    {
        keeper = std::make_unique<StateKeeper>();
        lun = filled("a", 1, size, distance);
        first = take(lun, "first");
        writeData(dataPath(lun), 2, size, distance);
        second = take(lun, "second");
        digests = {{first.uuid, digest(snapshotDataPath(first))}, {second.uuid, digest(snapshotDataPath(second))}};
    }

    /// Every state that a LUN or a snapshot may have is one of the two.
    void expectWhole(const std::string &path)
    {
        const size_t found = digest(path);
        EXPECT_TRUE(found == digests[first.uuid] || found == digests[second.uuid]) << path;
    }

    /// Without a sweep of everything: the next command on the same LUN is to do, or the making of the next one.
    void expectNextCommandsWork(bool makes_luns = false)
    {
        const _tag_iscsi_lun_ found = reload(lun);
        bool locked = true;
        EXPECT_EQ(0, NORViSCSILunIsLocked(&found, &locked));
        EXPECT_FALSE(locked);
        expectWhole(dataPath(found));
        const _tag_iscsi_snapshot_ next = take(found, "next");
        EXPECT_EQ(0, NORViSCSISnapshotDelete(&next, "test")) << iscsi_host_last_error();
        _tag_iscsi_lun_ clone;
        if (makes_luns) {
            EXPECT_EQ(0, cloneLun(found, "next", clone)) << iscsi_host_last_error();
            EXPECT_EQ(0, NORViSCSILunDelete(&clone)) << iscsi_host_last_error();
        }
        expectConsistent();
        for (const _tag_iscsi_snapshot_ &snapshot : list())
            expectWhole(snapshotDataPath(snapshot));
    }

    /// Back to the LUN and its two snapshots.
    void cleanUp()
    {
        for (const _tag_iscsi_snapshot_ &snapshot : list())
            if (!digests.count(snapshot.uuid)) {
                EXPECT_EQ(0, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
            }
        std::vector<_tag_iscsi_lun_> others;
        ASSERT_EQ(0, forEachLun([&](const LunRow &row) {
                      if (row.record.lid != lun.lid)
                          others.push_back(row.record);
                  }));
        for (_tag_iscsi_lun_ &other : others)
            EXPECT_EQ(0, NORViSCSILunDelete(&other)) << iscsi_host_last_error();
    }

    void killEverywhere(const std::function<void()> &begin, const std::function<int()> &work, bool makes_luns = false)
    {
        prepare(MiB, 65536);
        const auto prepareOne = [&] {
            begin();
            closeDatabase();
        };
        killAtEverySystemCall(20, prepareOne, work, [&] {
            expectNextCommandsWork(makes_luns);
            cleanUp();
        });
    }
};

TEST_F(SnapshotKillTest, TakingKilledAtEverySystemCall)
{
    killEverywhere([] {}, [this] { return tryTake(lun, "third"); });
}

TEST_F(SnapshotKillTest, RestoringKilledAtEverySystemCall)
{
    bool back = true;
    killEverywhere([&] { back = !back; }, [&] { return NORViSCSISnapshotRestore(back ? &first : &second, &lun); });
}

TEST_F(SnapshotKillTest, DeletingKilledAtEverySystemCall)
{
    _tag_iscsi_snapshot_ third;
    killEverywhere([&] { third = take(lun, "third"); }, [&] { return NORViSCSISnapshotDelete(&third, "test"); });
}

TEST_F(SnapshotKillTest, MovingToTheTrashKilledAtEverySystemCall)
{
    _tag_iscsi_snapshot_ third;
    killEverywhere(
        [&] {
            third = take(lun, "third");
            third.flags = NORV_SNAPSHOT_TRASH;
        },
        [&] { return NORViSCSISnapshotUnload(&third); });
}

TEST_F(SnapshotKillTest, CloningKilledAtEverySystemCall)
{
    _tag_iscsi_lun_ clone;
    killEverywhere([] {}, [&] { return cloneSnapshot(first, "clone", clone); }, true);
}

TEST_F(SnapshotKillTest, DeletingALunWithSnapshotsKilledAtEverySystemCall)
{
    _tag_iscsi_lun_ other;
    killEverywhere(
        [&] {
            ASSERT_EQ(0, cloneLun(reload(lun), "other", other));
            take(other, "s1");
            take(other, "s2");
        },
        [&] { return NORViSCSILunDelete(&other); }, true);
}

/// Whenever it comes, in data whose clones take long enough to be cut short.
TEST_F(SnapshotKillTest, RandomKills)
{
    prepare(4 * MiB, 8192);
    const auto busy = [this] {
        for (;;) {
            _tag_iscsi_snapshot_ snapshot = {};
            snprintf(snapshot.name, sizeof snapshot.name, "busy");
            _tag_iscsi_lun_ clone;
            if (NORViSCSISnapshotRestore(&first, &lun) != 0 || NORViSCSISnapshotCreate(&lun, &snapshot) != 0 ||
                NORViSCSISnapshotRestore(&second, &lun) != 0 || cloneSnapshot(snapshot, "clone", clone) != 0 ||
                NORViSCSISnapshotDelete(&snapshot, "test") != 0 || NORViSCSILunDelete(&clone) != 0)
                return 1;
        }
    };
    int started[2];
    ASSERT_EQ(0, pipe(started));
    std::mt19937 random(std::random_device{}());
    int interrupted = 0;
    for (int round = 0; round < 100 && !HasFailure(); ++round) {
        SCOPED_TRACE("round " + std::to_string(round));
        closeDatabase();
        const pid_t worker =
            inChild([&] { return openDatabase() == 0 && ::write(started[1], "", 1) == 1 ? busy() : 2; });
        char byte;
        ASSERT_EQ(1, ::read(started[0], &byte, 1));
        poll(nullptr, 0, static_cast<int>(random() % 60));
        kill(worker, SIGKILL);
        EXPECT_EQ(128 + SIGKILL, waitForChild(worker)) << "the worker failed before it was killed";
        std::vector<LunRow> marked;
        ASSERT_EQ(0, loadInterruptedRestores(marked));
        interrupted += !marked.empty();
        expectNextCommandsWork(true);
        cleanUp();
    }
    EXPECT_LT(0, interrupted) << "no restore was ever cut short";
    close(started[0]);
    close(started[1]);
}

} // namespace
} // namespace norvhost

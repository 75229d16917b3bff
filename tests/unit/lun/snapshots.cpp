#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Library.h"

#include <cstdio>
#include <syslog.h>
#include <unistd.h>

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;
using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const std::string SNAPSHOT = snapshotUUIDOf(3, 2);
const std::string TAKEN = "00000000-0000-4000-8000-000000000001";

class SnapshotOperations : public LibraryTest {
protected:
    SnapshotOperations()
    {
        addLUN(3, "vol1");
        addSnapshot(3, 2, "daily");
    }

    ISCSILIBLUN lun{uuidOf(3)};
    std::string uuid = "untouched";
    int number = -1;

    const std::string lun_loaded = "NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 0)";
    const std::string loaded = "NORViSCSISnapshotConfGetByUUID(" + SNAPSHOT + ")";
    const std::string waited = "NORViSCSILunWaitUntilUnlock(" + uuidOf(3) + ", 1800)";
    const std::string forked = "NLIBCProcForkChildNoWait()";

    int take(const std::string &name = "", const std::string &note = "", const std::string &by = "",
             bool is_scheduled = false)
    {
        return lun.takeSnapshot(false, false, name, note, by, EPOCH, is_scheduled, uuid, number);
    }

    std::string standardLine(const std::string &head, int code) const
    {
        return head + ". info: " + lun.info.toString() + ". error: " + std::to_string(code) + " (" +
               ISCSI::ErrorCodeToString(code) + ")";
    }
};

// Taking.

TEST_F(SnapshotOperations, TakePassesTheRequestAndAWorkerRunsTheRetention)
{
    const std::string key_run = "NORVRETENTIONRunPolicy(Lun#, 3, snapshot hooks, 0)";
    EXPECT_EQ(lun.takeSnapshot(true, true, "mine", "a note", "bob", EPOCH, true, uuid, number), 0);
    EXPECT_EQ(called(),
              (Lines{lun_loaded, "NORViSCSISnapshotCreate(" + uuidOf(3) + ", mine, a note, bob, 1234571490, 8, 1, 1)",
                     forked, waited, key_run}));
    EXPECT_EQ(uuid, TAKEN);
    EXPECT_EQ(number, 1);

    EXPECT_EQ(take(), 0) << "the platform names it, the author is us";
    EXPECT_EQ(called(), (Lines{lun_loaded, "NORViSCSIUnusedSnapshotNameFind(3, 256)",
                               "NORViSCSISnapshotCreate(" + uuidOf(3) + ", auto-1, , webapi, 1234571490, 0, 0, 0)",
                               forked, waited, key_run}));
    EXPECT_EQ(number, 3);
    EXPECT_EQ(logged(), Lines());
}

TEST_F(SnapshotOperations, TakeRefusesTextsThatDoNotFitInOrder)
{
    const std::string name(256, 'n'), note(1024, 'd'), by(32, 'b');
    const struct {
        std::string name, note, by, what;
    } cases[] = {{name, note, by, "name"}, {"n", note, by, "note"}, {"n", "d", by, "taken-by"}};
    for (const auto &c : cases) {
        EXPECT_EQ(take(c.name, c.note, c.by), 18990025);
        EXPECT_EQ(called(), Lines{lun_loaded});
        EXPECT_EQ(logged().back(), standardLine("takeSnapshot: Failed to copy snapshot's " + c.what, 18990025));
    }
    EXPECT_EQ(uuid + std::to_string(number), "untouched-1");
    EXPECT_EQ(take(name.substr(1), note.substr(1), by.substr(1)), 0);
    EXPECT_EQ(fake::model().snapshots.at({3, 1}).record.desc, note.substr(1));
}

/// A guard or a buffer of the caller's that a worker would see off.
struct Guard {
    ~Guard() { syslog(LOG_ERR, "lun/snapshots.cpp:1:guard destroyed"); }
};

void atExit()
{
    syslog(LOG_ERR, "lun/snapshots.cpp:1:atExit called");
}

TEST_F(SnapshotOperations, TheCallerGoesOnAtOnceAndItsCleanUpIsItsOwn)
{
    ASSERT_EQ(atexit(atExit), 0);
    int held[2], buffered[2];
    ASSERT_EQ(pipe(held) + pipe(buffered), 0);
    FILE *stream = fdopen(buffered[1], "w");
    fputs("once", stream);
    {
        const Guard guard;
        fake::model().held_by = held[0];
        EXPECT_EQ(take(), 0) << "while the worker still waits";
        EXPECT_NE(fake::calls().back().name, "NORVRETENTIONRunPolicy");
        EXPECT_EQ(write(held[1], "x", 1), 1);
        EXPECT_EQ(called().size(), 6u);
        EXPECT_EQ(logged(), Lines());
    }
    EXPECT_EQ(logged(), Lines{"guard: destroyed"});
    fclose(stream);
    char text[16];
    EXPECT_EQ(read(buffered[0], text, sizeof(text)), 4) << "the caller's buffer was written twice";
    for (int fd : {held[0], held[1], buffered[0]})
        close(fd);
}

// Restoring and cloning.

TEST_F(SnapshotOperations, RestoreTellsItsEndInLocalTime)
{
    setenv("TZ", "XXX-2", 1);
    tzset();
    EXPECT_EQ(lun.restoreSnapshot(SNAPSHOT), 0);
    EXPECT_EQ(called(),
              (Lines{lun_loaded, loaded, "NORViSCSISnapshotRestore(" + SNAPSHOT + ", " + uuidOf(3) + ")", forked,
                     waited, "NORVLogSet1(9, 1, 0x13d00002, vol1, 2009/02/14 02:31:32, (null), (null))"}));
}

TEST_F(SnapshotOperations, ARefusedRestoreIsAnEventOfTheLogThatTheApplianceHas)
{
    for (const auto &[has_log, scope] : {std::pair<long, const char *>{1, "9"}, {0, "1"}, {-1, "1"}}) {
        fake::answer("NLIBCFileCheckKeyValue", {has_log});
        fake::failCall("NORViSCSISnapshotRestore", 1, INJECTED);
        EXPECT_EQ(lun.restoreSnapshot(SNAPSHOT), INJECTED);
        const Lines calls = called();
        ASSERT_EQ(calls.size(), 5u) << "no worker";
        EXPECT_EQ(calls[3], "NLIBCFileCheckKeyValue(/etc.defaults/norvinfo.conf, support_dr_snap, yes, 0)");
        EXPECT_EQ(calls[4],
                  std::string("NORVLogSet1(") + scope + ", 3, 0x13d00005, vol1, 2009/02/14 00:31:32, (null), (null))");
    }
}

TEST_F(SnapshotOperations, CloneTellsItsStartAndItsEnd)
{
    fake::model().luns.at(3).record.extent_size = 4096;
    EXPECT_EQ(lun.cloneSnapshot(SNAPSHOT, "copy", uuid), 0);
    EXPECT_EQ(uuid, TAKEN);
    EXPECT_EQ(called(), (Lines{lun_loaded, loaded, "NORVLogSet1(1, 1, 0x13000027, copy, Regular File, /volume1, )",
                               "NORViSCSISnapshotClone(" + SNAPSHOT + ", copy, 15, /volume1, 4096)", forked,
                               "NORViSCSILunWaitUntilUnlock(" + TAKEN + ", 1800)",
                               "NORVLogSet1(1, 1, 0x13000037, copy, Regular File, /volume1, )",
                               "NORVLogSet1(9, 1, 0x13d0000b, copy, 2009/02/14 00:31:32, vol1, (null))"}));
    EXPECT_STREQ(recordOf(1).name, "copy");
    EXPECT_EQ(lun.info.name, "vol1");
}

TEST_F(SnapshotOperations, ARefusedCloneTellsItsStartAndItsFailureTwice)
{
    EXPECT_EQ(lun.cloneSnapshot(SNAPSHOT, "vol1", uuid), 18990538);
    EXPECT_EQ(called(), (Lines{lun_loaded, loaded, "NORVLogSet1(1, 1, 0x13000027, vol1, Regular File, /volume1, )",
                               "NORViSCSISnapshotClone(" + SNAPSHOT + ", vol1, 15, /volume1, 65536)",
                               "NORVLogSet1(1, 3, 0x13000038, vol1, Regular File, /volume1, )",
                               "NORVLogSet1(9, 3, 0x13d0000c, vol1, 2009/02/14 00:31:32, vol1, (null))"}));
    logged();
    EXPECT_EQ(lun.cloneSnapshot(snapshotUUIDOf(3, 5), "copy", uuid), 18990532);
    EXPECT_EQ(called().size(), 2u) << "no event for a snapshot that is not there";
    EXPECT_EQ(uuid, "untouched");
}

TEST_F(SnapshotOperations, CloneNamesMustFit)
{
    const std::string longest(255, 'n');
    EXPECT_EQ(lun.cloneSnapshot(SNAPSHOT, longest + "n", uuid), 18990025);
    EXPECT_EQ(logged().back(), standardLine("cloneSnapshot: Failed to copy LUN name", 18990025));
    EXPECT_EQ(lun.localClone(longest + "n", uuid), 18990025);
    EXPECT_EQ(logged().back(), standardLine("localClone: Failed to copy destination LUN name", 18990025));
    EXPECT_EQ(called(), (Lines{lun_loaded, lun_loaded}));
    EXPECT_EQ(lun.localClone(longest, uuid), 0);
    EXPECT_EQ(uuid, TAKEN);
}

TEST_F(SnapshotOperations, LocalCloneIsForExtentPoolLUNs)
{
    for (int type : {15, 31, 47, 79}) {
        addLUN(3, "vol1", type);
        fake::model().luns.erase(1);
        EXPECT_EQ(lun.localClone("copy", uuid), 0) << type;
        EXPECT_EQ(called(), (Lines{lun_loaded, "NORViSCSILunClone(" + uuidOf(3) + ", copy, " + std::to_string(type) +
                                                   ", /volume1, 65536)"}))
            << "no worker, no event";
        EXPECT_EQ(uuid, recordOf(1).uuid);
    }
    uuid = "untouched";
    for (const auto &[type, name] :
         {std::pair<int, const char *>{1, "BLOCK"}, {3, "FILE"}, {7, "THIN"}, {71, "unknown"}}) {
        addLUN(3, "vol1", type);
        EXPECT_EQ(lun.localClone(std::string(300, 'n'), uuid), 18990500);
        EXPECT_EQ(called(), Lines{lun_loaded});
        EXPECT_EQ(logged(), Lines{standardLine(std::string("localClone: Bad LUN type: ") + name, 18990500)});
    }
    EXPECT_EQ(uuid, "untouched");
}

// The rest.

TEST_F(SnapshotOperations, DeleteNamesWhoDeletes)
{
    EXPECT_EQ(lun.deleteSnapshot(SNAPSHOT, ""), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSISnapshotDelete(" + SNAPSHOT + ", webapi)"}));
    addSnapshot(3, 2, "daily").record.user_locked = 1;
    EXPECT_EQ(lun.deleteSnapshot(SNAPSHOT, "bob"), 18990540);
    EXPECT_EQ(called().back(), "NORViSCSISnapshotDelete(" + SNAPSHOT + ", bob)");
}

TEST_F(SnapshotOperations, ListsTheLUNsSnapshotsOrAll)
{
    addSnapshot(4, 1, "other's").is_locked = true;
    std::vector<ISCSISnapshotInfo> snapshots;
    EXPECT_EQ(lun.listSnapshot(snapshots, 0), 0);
    EXPECT_EQ(called(), (Lines{lun_loaded, "NORViSCSISnapshotConfLoad(2, 3, 0)"}));
    ASSERT_EQ(snapshots.size(), 1u);
    EXPECT_EQ(snapshots[0].name, "daily");

    EXPECT_EQ(ISCSILIBLUN().listSnapshot(snapshots, 1), 0);
    EXPECT_EQ(called().front(), "NORViSCSISnapshotConfLoad(0, 0, 0)");
    ASSERT_EQ(snapshots.size(), 2u);
    EXPECT_TRUE(snapshots[1].is_action_locked);
}

TEST_F(SnapshotOperations, StopNeedsBothLocks)
{
    for (int locks = 0; locks < 4; ++locks) {
        fake::model().luns.at(3).is_locked = locks & 1;
        fake::model().snapshots.at({3, 2}).is_locked = locks & 2;
        EXPECT_EQ(lun.stopSnapshot(SNAPSHOT), 0);
        Lines expected = {lun_loaded, loaded, "NORViSCSILunIsLocked(3)", "NORViSCSIIsSnapshotLocked(" + SNAPSHOT + ")"};
        if (locks == 3)
            expected.push_back("NORViSCSISnapshotUnload(" + SNAPSHOT + ", 0)");
        EXPECT_EQ(called(), expected) << locks;
    }
}

TEST_F(SnapshotOperations, LoadFlags)
{
    const struct {
        bool trash, unsync_size;
        const char *flags;
    } cases[] = {{false, false, "8"}, {true, false, "9"}, {false, true, "10"}, {true, true, "9"}};
    for (const auto &c : cases) {
        fake::model().snapshots.at({3, 2}).record.flags = 8; // not ours, stays
        EXPECT_EQ(lun.loadSnapshot(SNAPSHOT, c.trash, c.unsync_size), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSISnapshotLoad(" + SNAPSHOT + ", " + c.flags + ")"}));
        fake::model().snapshots.at({3, 2}).record.flags = 8;
        EXPECT_EQ(lun.unloadSnapshot(SNAPSHOT, c.trash, c.unsync_size), 0);
        EXPECT_EQ(called(), (Lines{loaded, "NORViSCSISnapshotUnload(" + SNAPSHOT + ", " + c.flags + ")"}));
    }
}

} // namespace
} // namespace unit

// Export, import, and their progress.
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "tests/unit/Library.h"

#include <limits>

namespace unit {
namespace {

using ISCSI::LIB::LIBLUN::ISCSILIBLUN;

const std::string SNAPSHOT = snapshotUUIDOf(3, 2);

class Transfers : public LibraryTest {
protected:
    Transfers()
    {
        addLUN(lid, "vol1");
        addSnapshot(3, 2, "daily");
        fake::model().exports["/export"] = {{}, "a note", "bob", EPOCH, 1, 0, {}};
    }

    const int lid = privateLUNID();
    const std::string progress_file = "/tmp/iscsi/L" + std::to_string(lid) + ".import_progress";
    ISCSILIBLUN lun{uuidOf(lid)};

    const std::string lun_loaded = "NORViSCSILunConfigGetByUUID(" + uuidOf(lid) + ", 0)";
    const std::string loaded = "NORViSCSISnapshotConfGetByUUID(" + SNAPSHOT + ")";
    const std::string forked = "NLIBCProcForkChildNoWait()";

    std::string waited(int limit) const
    {
        return "NORViSCSILunWaitUntilUnlock(" + uuidOf(lid) + ", " + std::to_string(limit) + ")";
    }
};

TEST_F(Transfers, ExportStartsAndItsCancelWaits)
{
    EXPECT_EQ(lun.exportLUN(SNAPSHOT, "/export/two"), 0);
    EXPECT_EQ(called(), (Lines{loaded, "NORViSCSISnapshotExport(" + SNAPSHOT + ", /export/two)"}));
    EXPECT_STREQ(fake::model().exports.at("/export/two").desc, "before the move");

    fake::model().snapshots.at({3, 2}).is_locked = true;
    EXPECT_EQ(lun.exportCancel(SNAPSHOT), 0);
    const std::string cancelled = "NORViSCSISnapshotExportCancel(" + SNAPSHOT + ")";
    EXPECT_EQ(called(), (Lines{loaded, cancelled, "NORViSCSISnapshotWaitUntilUnlock(" + SNAPSHOT + ", 180)"}));
    EXPECT_EQ(lun.exportCancel(SNAPSHOT), 18990592) << "the platform's code";
    EXPECT_EQ(called(), (Lines{loaded, cancelled}));
}

TEST_F(Transfers, ASuccessfulImportEndsWithASnapshotLikeTheExported)
{
    writeFile(progress_file, "step=\"0\"\n");
    EXPECT_EQ(lun.importLUN("/export"), 0);
    EXPECT_EQ(
        called(),
        (Lines{lun_loaded, "NORViSCSILunImport(" + uuidOf(lid) + ", /export)", forked, waited(0),
               "NLIBCFileGetKeyValue(" + progress_file + ", step, 32)", "NORViSCSISnapshotExportConfigGet(/export)",
               lun_loaded, "NORViSCSIUnusedSnapshotNameFind(" + std::to_string(lid) + ", 256)",
               "NORViSCSISnapshotCreate(" + uuidOf(lid) + ", auto-1, a note, bob, 1234571490, 0, 1, 0)", forked,
               waited(1800), "NORVRETENTIONRunPolicy(Lun#, " + std::to_string(lid) + ", snapshot hooks, 0)"}));
    EXPECT_EQ(logged(), Lines());

    fake::model().exports["/export"] = {{}, "", "", EPOCH, 0, 1, {}};
    EXPECT_EQ(lun.importLUN("/export"), 0);
    EXPECT_EQ(called().at(8), "NORViSCSISnapshotCreate(" + uuidOf(lid) + ", auto-1, , webapi, 1234571490, 0, 0, 1)");
}

TEST_F(Transfers, AnImportThatIsNoSuccessTakesNoSnapshot)
{
    const std::string unread = "Failed to get the status of import.";
    const std::string failed = "The status of import is not success.";
    const struct {
        std::string file, sentence;
        int error; ///< 0: without a closing line
    } cases[] = {
        {"step=18990002\n", failed, 18990002},
        {"step=-3\n", failed, -3},
        {"done_bytes=1\n", unread, 0},
        {"step=" + std::string(32, '0') + "\n", unread, -1}, // no room for the value
    };
    for (const auto &c : cases) {
        writeFile(progress_file, c.file);
        EXPECT_EQ(lun.importLUN("/export"), 0);
        EXPECT_EQ(called().size(), 5u) << c.file;
        const std::string error = std::to_string(c.error) + " (" + ISCSI::ErrorCodeToString(c.error) + ")";
        Lines expected = {"importLUN: " + c.sentence + " info: " + lun.info.toString() + ". error: " + error};
        if (c.error != 0)
            expected.push_back("[E] importLUN: error code: " + error + " [" + lun.info.toString() + "]");
        EXPECT_EQ(logged(), expected);
    }
}

TEST_F(Transfers, ImportCancelWaits)
{
    fake::model().luns.at(lid).is_locked = true;
    EXPECT_EQ(lun.importCancel(), 0);
    EXPECT_EQ(called(), (Lines{lun_loaded, "NORViSCSILunImportCancel(" + uuidOf(lid) + ")", waited(180)}));
    EXPECT_EQ(lun.importCancel(), 18990593);
    EXPECT_EQ(called().size(), 2u);
}

TEST_F(Transfers, ImportProgressIsReadFromItsFile)
{
    unsigned long long done = 9, total = 9;
    int step = 9;
    EXPECT_EQ(lun.getImportProgress(done, total, step), 0);
    EXPECT_EQ(done + total, 0u);
    EXPECT_EQ(step, 18990593);
    EXPECT_EQ(called(), (Lines{lun_loaded, "NLIBCFileExist(" + progress_file + ")"}));

    writeFile(progress_file, "step=0x2\ndone_bytes=18446744073709551615\ntotal_bytes=\"010\"\n");
    EXPECT_EQ(lun.getImportProgress(done, total, step), 0);
    EXPECT_EQ(step, 0) << "decimal only";
    EXPECT_EQ(done, std::numeric_limits<unsigned long long>::max());
    EXPECT_EQ(total, 10u);
}

} // namespace
} // namespace unit

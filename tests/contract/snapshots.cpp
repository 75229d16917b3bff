#include "platform/error.h"
#include "platform/event_log.h"
#include "platform/iscsi_snapshot.h"
#include "platform/retention.h"
#include "tests/contract/Platform.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace contract {
namespace {

class SnapshotContract : public testing::Test, protected Platform {
protected:
    _tag_iscsi_lun_ lun = createLUN("lun");

    ~SnapshotContract() override
    {
        for (auto &snapshot : list()) {
            unlock(snapshot.uuid);
            EXPECT_EQ(NORViSCSISnapshotDelete(&snapshot, "the test"), 0) << snapshot.name;
        }
    }

    static int tryTake(const _tag_iscsi_lun_ &of, const std::string &name, _tag_iscsi_snapshot_ &made, int32_t time = 0)
    {
        made = {};
        set(made.name, name);
        set(made.desc, "the note");
        set(made.taken_by, "the test");
        made.snap_time = time;
        made.app_consistent = 1;
        return NORViSCSISnapshotCreate(&of, &made);
    }

    static _tag_iscsi_snapshot_ take(const _tag_iscsi_lun_ &of, const std::string &name, int32_t time = 1000)
    {
        _tag_iscsi_snapshot_ made;
        EXPECT_EQ(tryTake(of, name, made, time), 0) << name;
        return made;
    }

    static std::vector<_tag_iscsi_snapshot_> list(const _tag_iscsi_snapshot_query_ &query = {})
    {
        _tag_iscsi_snapshot_list_ head{};
        EXPECT_EQ(NORViSCSISnapshotConfLoad(&query, &head), 0);
        std::vector<_tag_iscsi_snapshot_> result;
        const _tag_iscsi_snapshot_ *previous = nullptr;
        for (_tag_iscsi_snapshot_ *record = head.first; record;) {
            EXPECT_EQ(record->previous, previous);
            previous = record;
            result.push_back(*record);
            record = record->next;
        }
        EXPECT_EQ(head.last, previous);
        EXPECT_EQ(head.count, static_cast<int>(result.size()));
        while (_tag_iscsi_snapshot_ *record = head.first) {
            head.first = record->next;
            free(record);
        }
        return result;
    }

    static std::string names(const _tag_iscsi_snapshot_query_ &query = {})
    {
        std::string text;
        for (const auto &snapshot : list(query))
            text += (text.empty() ? "" : " ") + std::string(snapshot.name);
        return text;
    }

    static std::string keys(const _tag_iscsi_snapshot_ &snapshot)
    {
        NLIBC_SZ_LIST *found = NLIBCSzListAlloc(512);
        EXPECT_EQ(NORViSCSISnapshotLockedAppKeysGet(&snapshot, found), 0);
        std::string text;
        for (int i = 0; i < found->count; ++i)
            text += (text.empty() ? "" : " ") + std::string(NLIBCSzListGet(found, i));
        NLIBCSzListFree(found);
        return text;
    }
};

TEST_F(SnapshotContract, ATakenSnapshotIsFoundInEveryWay)
{
    const auto made = take(lun, "one");
    EXPECT_EQ(made.snap_id, 1);
    EXPECT_EQ(strlen(made.uuid), 36u);
    EXPECT_EQ(strlen(made.version), 36u);
    _tag_iscsi_snapshot_ by_uuid{}, by_name{};
    EXPECT_EQ(NORViSCSISnapshotConfGetByUUID(made.uuid, &by_uuid), 0);
    EXPECT_EQ(NORViSCSISnapshotConfGetByLIDAndName(lun.lid, "one", &by_name), 0);
    for (const auto &snapshot : {by_uuid, by_name, list().at(0)}) {
        EXPECT_EQ(snapshot.lid, lun.lid);
        EXPECT_EQ(snapshot.snap_id, 1);
        EXPECT_EQ(snapshot.total_size, lun.size);
        EXPECT_EQ(snapshot.snap_time, 1000);
        EXPECT_EQ(snapshot.flags, 0u);
        EXPECT_EQ(snapshot.app_consistent, 1);
        EXPECT_EQ(snapshot.user_locked, 0);
        EXPECT_STREQ(snapshot.name, "one");
        EXPECT_STREQ(snapshot.status, "Healthy");
        EXPECT_STREQ(snapshot.desc, "the note");
        EXPECT_STREQ(snapshot.taken_by, "the test");
        EXPECT_EQ(snapshot.root_path, volume);
        EXPECT_STREQ(snapshot.uuid, made.uuid);
        EXPECT_STREQ(snapshot.version, made.version);
    }
    bool is_locked = true;
    EXPECT_EQ(NORViSCSIIsSnapshotLocked(&by_uuid, &is_locked), 0);
    EXPECT_FALSE(is_locked);
    EXPECT_EQ(NORViSCSISnapshotWaitUntilUnlock(&by_uuid, 1), 0);
    EXPECT_EQ(NORViSCSILunWaitUntilUnlock(&lun, 1), 0);
}

TEST_F(SnapshotContract, ListingsAreByLUNAndNumberAndMayBeRestricted)
{
    const auto other = createLUN("other");
    take(other, "c", 3000);
    take(lun, "b", 2000);
    take(lun, "a", 1000);
    EXPECT_EQ(names(), "b a c");
    _tag_iscsi_snapshot_query_ query{};
    query.query_flags = NORV_SNAPSHOT_QUERY_LID;
    query.query_lid = lun.lid;
    EXPECT_EQ(names(query), "b a");
    query.query_flags |= NORV_SNAPSHOT_QUERY_TIME;
    query.query_time = 2000;
    EXPECT_EQ(names(query), "b");
    query.query_flags = NORV_SNAPSHOT_QUERY_TIME;
    EXPECT_EQ(names(query), "b c");
    query.query_time = 3001;
    EXPECT_EQ(names(query), "");
}

TEST_F(SnapshotContract, BadRequestsLeaveNothing)
{
    take(lun, "taken");
    const auto allocated = createLUN("allocated", NORV_LUN_TYPE_FILE);
    auto in_trash = createLUN("in trash");
    in_trash.options = NORV_LUN_OPTION_TRASH;
    EXPECT_EQ(NORViSCSILunUnload(&in_trash), 0);
    _tag_iscsi_lun_ none{};
    set(none.uuid, NO_UUID);
    const struct {
        int err;
        const _tag_iscsi_lun_ &lun;
        const char *name;
    } cases[] = {
        {NORV_ERR_SNAPSHOT_NAME, lun, "taken"},   {NORV_ERR_SNAPSHOT_NAME, lun, ""},
        {NORV_ERR_SNAPSHOT_NAME, lun, "a/b"},     {NORV_ERR_SNAPSHOT_NAME, lun, ".."},
        {NORV_ERR_SNAPSHOT_NAME, lun, "a\nb"},    {NORV_ERR_LUN_TYPE, allocated, "n"},
        {NORV_ERR_LUN_NOT_LOADED, in_trash, "n"}, {NORV_ERR_NO_SUCH_LUN, none, "n"},
    };
    for (const auto &[err, of, name] : cases) {
        _tag_iscsi_snapshot_ made;
        EXPECT_EQ(tryTake(of, name, made), err) << of.name << ' ' << name;
        EXPECT_EQ(made.snap_id, 0);
    }
    EXPECT_EQ(names(), "taken");

    _tag_iscsi_snapshot_ found{}, gone{};
    set(gone.uuid, NO_UUID);
    EXPECT_EQ(NORViSCSISnapshotConfGetByUUID(NO_UUID, &found), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotConfGetByLIDAndName(lun.lid, "TAKEN", &found), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotDelete(&gone, "the test"), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotRestore(&gone, &lun), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotLoad(&gone), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotUnload(&gone), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotExport(&gone, (volume + "/export").c_str()), NORV_ERR_NO_SUCH_SNAPSHOT);
    auto clone = lun;
    set(clone.name, "clone");
    EXPECT_EQ(NORViSCSISnapshotClone(&gone, &clone), NORV_ERR_NO_SUCH_SNAPSHOT);
}

TEST_F(SnapshotContract, NamesAndNumbersComeBackAfterADeletion)
{
    char name[256] = "";
    EXPECT_EQ(NORViSCSIUnusedSnapshotNameFind(lun.lid, name, sizeof(name)), 0);
    const auto first = take(lun, name);
    EXPECT_EQ(NORViSCSIUnusedSnapshotNameFind(lun.lid, name, sizeof(name)), 0);
    EXPECT_STRNE(first.name, name);
    EXPECT_EQ(take(lun, name).snap_id, 2);
    EXPECT_EQ(NORViSCSISnapshotDelete(&first, "the test"), 0);
    EXPECT_EQ(NORViSCSISnapshotDelete(&first, "the test"), NORV_ERR_NO_SUCH_SNAPSHOT);
    const auto again = take(lun, first.name);
    EXPECT_EQ(again.snap_id, 1);
    EXPECT_STRNE(again.uuid, first.uuid);
}

TEST_F(SnapshotContract, LocksKeepASnapshot)
{
    const auto snapshot = take(lun, "n");
    const auto remove = [&] { return NORViSCSISnapshotDelete(&snapshot, "the test"); };
    EXPECT_EQ(keys(snapshot), "");
    for (const char *key : {"b", "a", "b"})
        EXPECT_EQ(NORViSCSISnapshotLockByAppKey(&snapshot, key), 0);
    EXPECT_EQ(NORViSCSISnapshotLockByAppKey(&snapshot, ""), NORV_ERR_APP_KEY);
    EXPECT_EQ(keys(snapshot), "a b");
    EXPECT_EQ(remove(), NORV_ERR_SNAPSHOT_LOCKED);
    EXPECT_EQ(NORViSCSISnapshotUnlockByAppKey(&snapshot, "c"), 0) << "none is no failure";
    EXPECT_EQ(NORViSCSISnapshotUnlockByAppKey(&snapshot, "b"), 0);
    EXPECT_EQ(remove(), NORV_ERR_SNAPSHOT_LOCKED);
    EXPECT_EQ(NORViSCSISnapshotUnlockByAppKey(&snapshot, "a"), 0);
    EXPECT_EQ(remove(), 0);

    _tag_iscsi_snapshot_ kept{};
    set(kept.name, "kept");
    kept.user_locked = 1;
    EXPECT_EQ(NORViSCSISnapshotCreate(&lun, &kept), 0);
    EXPECT_EQ(NORViSCSISnapshotDelete(&kept, "the test"), NORV_ERR_SNAPSHOT_USER_LOCKED);
}

TEST_F(SnapshotContract, ASnapshotMovesToTheTrashAndBack)
{
    const auto snapshot = take(lun, "n");
    const auto flags = [&] { return list().at(0).flags; };
    EXPECT_EQ(NORViSCSISnapshotLoad(&snapshot), 0);
    EXPECT_EQ(NORViSCSISnapshotUnload(&snapshot), 0);
    auto wanted = snapshot;
    wanted.flags = NORV_SNAPSHOT_UNSYNC_SIZE;
    EXPECT_EQ(NORViSCSISnapshotLoad(&wanted), 0);
    EXPECT_EQ(NORViSCSISnapshotUnload(&wanted), 0);
    EXPECT_EQ(flags(), 0u);
    wanted.flags = NORV_SNAPSHOT_TRASH;
    EXPECT_EQ(NORViSCSISnapshotUnload(&wanted), 0);
    EXPECT_EQ(flags(), static_cast<uint32_t>(NORV_SNAPSHOT_TRASH));
    EXPECT_EQ(NORViSCSISnapshotLoad(&snapshot), NORV_ERR_SNAPSHOT_NOT_LOADED);
    EXPECT_EQ(NORViSCSISnapshotLoad(&wanted), 0);
    EXPECT_EQ(flags(), 0u);
}

TEST_F(SnapshotContract, RestoreAndClonesAreOfTheSnapshotsLUN)
{
    const auto other = createLUN("other");
    const auto snapshot = take(lun, "n");
    EXPECT_EQ(NORViSCSISnapshotRestore(&snapshot, &other), NORV_ERR_NO_SUCH_SNAPSHOT);
    EXPECT_EQ(NORViSCSISnapshotRestore(&snapshot, &lun), 0);
    EXPECT_EQ(NORViSCSILunWaitUntilUnlock(&lun, 30), 0);
    _tag_iscsi_lun_ restored{};
    EXPECT_EQ(NORViSCSILunConfigGetByUUID(lun.uuid, &restored, 0), 0);
    EXPECT_NE(restored.restored_time, 0);

    // Callers pass a copy of the source's record with a new name.
    auto of_snapshot = lun, of_lun = lun, taken = lun;
    set(of_snapshot.name, "of the snapshot");
    set(of_lun.name, "of the LUN");
    EXPECT_EQ(NORViSCSISnapshotClone(&snapshot, &of_snapshot), 0);
    EXPECT_EQ(NORViSCSILunClone(&lun, &of_lun), 0);
    EXPECT_EQ(NORViSCSISnapshotClone(&snapshot, &taken), NORV_ERR_LUN_NAME_EXISTS);
    EXPECT_EQ(NORViSCSILunClone(&lun, &taken), NORV_ERR_LUN_NAME_EXISTS);
    for (const auto &clone : {of_snapshot, of_lun}) {
        EXPECT_EQ(NORViSCSILunWaitUntilUnlock(&clone, 30), 0);
        _tag_iscsi_lun_ found{};
        EXPECT_EQ(NORViSCSILunConfigGetByUUID(clone.uuid, &found, 0), 0);
        EXPECT_STRNE(found.uuid, lun.uuid);
        EXPECT_NE(found.lid, lun.lid);
        EXPECT_STREQ(found.name, clone.name);
        EXPECT_EQ(found.size, lun.size);
    }
}

TEST_F(SnapshotContract, AnExportTellsOfItsSnapshotAndIsImportedOnce)
{
    const auto snapshot = take(lun, "n");
    const std::string folder = volume + "/export";
    _tag_iscsi_export_config_ config{};
    EXPECT_EQ(NORViSCSISnapshotExportConfigGet(folder.c_str(), &config), NORV_ERR_FILE_NOT_FOUND);
    EXPECT_EQ(NORViSCSILunImport(&lun, folder.c_str()), NORV_ERR_FILE_NOT_FOUND);
    EXPECT_EQ(NORViSCSISnapshotExport(&snapshot, "export"), NORV_ERR_EXPORT_LOCATION) << "no absolute path";
    EXPECT_EQ(NORViSCSISnapshotExportCancel(&snapshot), NORV_ERR_NOT_EXPORTING);
    EXPECT_EQ(NORViSCSILunImportCancel(&lun), NORV_ERR_NOT_IMPORTING);

    EXPECT_EQ(NORViSCSISnapshotExport(&snapshot, folder.c_str()), 0);
    EXPECT_EQ(NORViSCSISnapshotWaitUntilUnlock(&snapshot, 30), 0);
    EXPECT_EQ(NORViSCSISnapshotExport(&snapshot, folder.c_str()), NORV_ERR_FILE_EXISTS);
    EXPECT_EQ(NORViSCSISnapshotExportConfigGet(folder.c_str(), &config), 0);
    EXPECT_STREQ(config.desc, "the note");
    EXPECT_STREQ(config.taken_by, "the test");
    EXPECT_EQ(config.snap_time, 1000);
    EXPECT_EQ(config.app_consistent, 1);
    EXPECT_EQ(config.user_locked, 0);

    const auto other = createLUN("other");
    EXPECT_EQ(NORViSCSILunImport(&other, folder.c_str()), 0);
    EXPECT_EQ(NORViSCSILunWaitUntilUnlock(&other, 30), 0);
    EXPECT_EQ(NORViSCSISnapshotExportCancel(&snapshot), NORV_ERR_NOT_EXPORTING);
    EXPECT_EQ(NORViSCSILunImportCancel(&other), NORV_ERR_NOT_IMPORTING);
}

TEST_F(SnapshotContract, RetentionKeepsTheNewestAndTheLocked)
{
    const auto other = createLUN("other");
    take(lun, "oldest", 1000);
    take(lun, "newest", 4000);
    take(lun, "locked", 2000);
    take(lun, "old", 3000);
    take(other, "not its own", 500);
    const auto locked = list().at(2);
    EXPECT_EQ(NORViSCSISnapshotLockByAppKey(&locked, "backup"), 0);
    const std::string key = std::to_string(lun.lid);
    const auto run = [&] {
        return NORVRETENTIONRunPolicy("Lun#", key.c_str(), NORVRETAINERiSCSIRetentionTargetGet,
                                      NORVRETAINERiSCSIRetentionTargetDelete, 0);
    };
    EXPECT_EQ(run(), 0);
    EXPECT_EQ(names(), "oldest newest locked old not its own") << "no policy keeps all";
    addRetentionPolicy(lun.lid);
    EXPECT_EQ(run(), 0);
    EXPECT_EQ(names(), "newest locked not its own");
    EXPECT_EQ(run(), 0);
    EXPECT_EQ(names(), "newest locked not its own");
}

TEST(EventContract, AnEventTakesUpToFourTexts)
{
    const Platform platform;
    EXPECT_EQ(NORVLogSet1(9, 1, 0x13d00002, "lun", "2026/01/01 00:00:00", nullptr, nullptr), 0);
    EXPECT_EQ(NORVLogSet1(1, 3, 0x13000038, "lun", "Regular File", "/volume1", ""), 0);
    EXPECT_EQ(NORVLogSet1(1, 0, 0x13000038, "lun", "", "", ""), NORV_ERR_BAD_PARAMETER);
    EXPECT_EQ(NORVLogSet1(1, 4, 0x13000038, "lun", "", "", ""), NORV_ERR_BAD_PARAMETER);
}

} // namespace
} // namespace contract

#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "tests/unit/BadJson.h"

#include <algorithm>
#include <cstring>
#include <limits>

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;

constexpr int ACTION_LOCK = 1, APP_KEYS = 2;
const std::string UUID = snapshotUUIDOf(7, 3);

const char *const EVERY_FIELD =
    "uuid: u ,snapshot_id: 3 ,parent_lun_id: 7 ,total_size: 1073741824 (1GB) ,mapped_size: 1536 (1KB,512bytes)"
    " ,is_action_locked: true ,is_app_consistent: false ,is_user_locked: true ,name: daily ,status: Healthy"
    " ,description: a note ,root_path: /volume1 ,taken_by: alice ,version: v"
    " ,create_time: Sat Feb 14 00:31:30 UTC 2009 ,snapshot_time: Sat Feb 14 00:31:31 UTC 2009"
    " ,locked_app_keys: a b";

ISCSISnapshotInfo everyField()
{
    return {3,         7,        GIB,        1536,    EPOCH, EPOCH + 1, false, true,      "daily",
            "Healthy", "a note", "/volume1", "alice", "u",   "v",       true,  {"b", "a"}};
}

class SnapshotRecord : public LibraryTest {
protected:
    ISCSISnapshotInfo snapshot{UUID};

    const std::string loaded = "NORViSCSISnapshotConfGetByUUID(" + UUID + ")";
    const std::string asked_lock = "NORViSCSIIsSnapshotLocked(" + UUID + ")";

    static fake::Snapshot &addDaily()
    {
        fake::Snapshot &daily = addSnapshot(7, 3, "daily");
        daily.is_locked = true;
        daily.app_keys = {"b", "a"};
        return daily;
    }
};

TEST_F(SnapshotRecord, RendersAsText)
{
    EXPECT_EQ(everyField().toString(), EVERY_FIELD);
    snapshot.create_time = std::numeric_limits<long>::max();
    EXPECT_NE(snapshot.toString().find(" ,create_time: "), std::string::npos) << "absurd times still render";
}

TEST_F(SnapshotRecord, IsReadFromTheSDKs)
{
    auto &record = addSnapshot(7, 3, "daily").record;
    EXPECT_EQ(ISCSISnapshotInfo(record).toString(),
              "uuid: " + UUID +
                  " ,snapshot_id: 3 ,parent_lun_id: 7 ,total_size: 1073741824 (1GB) ,mapped_size: 65536 (64KB)"
                  " ,is_action_locked: false ,is_app_consistent: true ,is_user_locked: false ,name: daily"
                  " ,status: Healthy ,description: before the move ,root_path: /volume1 ,taken_by: alice ,version: " +
                  snapshotUUIDOf(7, 9999) +
                  " ,create_time: Sat Feb 14 00:32:30 UTC 2009 ,snapshot_time: Sat Feb 14 00:31:33 UTC 2009"
                  " ,locked_app_keys: ");

    // A platform that forgot a NUL must not make us read on.
    memset(record.name, 'n', sizeof(record.name));
    memset(record.version, 'v', sizeof(record.version));
    EXPECT_EQ(ISCSISnapshotInfo(record).name, std::string(256, 'n'));
    EXPECT_EQ(ISCSISnapshotInfo(record).version, std::string(37, 'v'));
}

// JSON.

const char *const JSON = R"({"snapshot_id": 3, "parent_lun_id": 7, "total_size": 1073741824, "mapped_size": 1536,
    "create_time": 1234571490, "snapshot_time": 1234571491, "is_app_consistent": false, "is_user_locked": true,
    "name": "daily", "status": "Healthy", "description": "a note", "root_path": "/volume1", "taken_by": "alice",
    "uuid": "u", "version": "v", "is_action_locked": true, "locked_app_keys": ["a", "b"]})";

TEST_F(SnapshotRecord, JsonReplacesWhatWasThere)
{
    for (const char *json : {R"({"other": 1})", "[1]", "\"text\"", "null"}) {
        Json::Value out = parsed(json);
        EXPECT_EQ(everyField().toJsonFormat(out), 0);
        EXPECT_EQ(parsed(out.toStyledString()), parsed(JSON));
    }
    Json::Value out;
    EXPECT_EQ(ISCSISnapshotInfo().toJsonFormat(out), 0);
    EXPECT_EQ(out.size(), 17u);
    EXPECT_EQ(out["locked_app_keys"], Json::Value(Json::arrayValue));
    EXPECT_EQ(out["version"], "");

    snapshot = ISCSISnapshotInfo();
    snapshot.snapshot_id = -1;
    out = "untouched";
    EXPECT_EQ(snapshot.toJsonFormat(out), 18990201);
    EXPECT_EQ(out, "untouched");
    EXPECT_EQ(logged(),
              Lines{"toJsonFormat: Not enough info to create snapshot info in Json format: " + snapshot.toString()});
}

TEST_F(SnapshotRecord, JsonIsReadAndItsKeysAreMerged)
{
    snapshot = ISCSISnapshotInfo();
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(snapshot.loadFromJson(parsed(JSON)), 0);
        EXPECT_EQ(snapshot.toString(), EVERY_FIELD);
    }
    Json::Value in = parsed(JSON);
    in["locked_app_keys"] = parsed(R"(["c", "a"])");
    in["total_size"] = parsed("18446744073709551615");
    in.removeMember("is_action_locked");
    EXPECT_EQ(snapshot.loadFromJson(in), 0);
    EXPECT_EQ(snapshot.locked_app_keys, (std::set<std::string>{"a", "b", "c"}));
    EXPECT_EQ(snapshot.total_size, std::numeric_limits<unsigned long long>::max());
    EXPECT_FALSE(snapshot.is_action_locked);

    for (const char *none : {"null", "7", "\"d\"", R"({"d": "e"})", "[]"}) {
        in["locked_app_keys"] = parsed(none);
        EXPECT_EQ(snapshot.loadFromJson(in), 0) << none;
        EXPECT_EQ(snapshot.locked_app_keys.size(), 3u) << none;
    }
}

TEST_F(SnapshotRecord, BadJsonChangesNothing)
{
    snapshot = everyField();
    expectBadJsonRefused(
        snapshot, parsed(JSON), {"loadFromJson: Failed to get snapshot info from Json."},
        {{{"snapshot_id", "parent_lun_id", "create_time", "snapshot_time"}, true, NO_INT},
         {{"total_size", "mapped_size"}, true, NO_SIZE},
         {{"is_app_consistent", "is_user_locked"}, true, NO_FLAG},
         {{"name", "status", "description", "root_path", "taken_by", "uuid", "version"}, true, NO_TEXT},
         {{"is_action_locked"}, false, NO_FLAG},
         {{"locked_app_keys"}, false, {"[3]", "[\"c\", null]", "[[\"c\"]]", "[\"c\\u0000d\"]"}}});
}

// Loading and locks.

TEST_F(SnapshotRecord, LoadsWhatTheFlagsAskFor)
{
    addDaily();
    const Lines keys = {"NLIBCSzListAlloc(512)", "NORViSCSISnapshotLockedAppKeysGet(" + UUID + ")", "NLIBCSzListGet(0)",
                        "NLIBCSzListGet(1)"};
    for (int flags = 0; flags <= (ACTION_LOCK | APP_KEYS); ++flags) {
        Lines expected = {loaded};
        if (flags & ACTION_LOCK)
            expected.push_back(asked_lock);
        if (flags & APP_KEYS)
            expected.insert(expected.end(), keys.begin(), keys.end());
        snapshot = ISCSISnapshotInfo(UUID);
        snapshot.locked_app_keys = {"old"};
        EXPECT_EQ(snapshot.loadFromConfig(flags), 0);
        EXPECT_EQ(called(), expected) << flags;
        EXPECT_EQ(snapshot.version, snapshotUUIDOf(7, 9999));
        EXPECT_EQ(snapshot.is_action_locked, (flags & ACTION_LOCK) != 0);
        EXPECT_EQ(snapshot.locked_app_keys,
                  (flags & APP_KEYS ? std::set<std::string>{"a", "b"} : std::set<std::string>{"old"}));
    }

    addSnapshot(7, 4, "other").record.uuid[0] = '\0'; // a platform that leaves the UUID out
    snapshot = ISCSISnapshotInfo("");
    EXPECT_EQ(snapshot.loadFromConfig(0), 18990201);
    EXPECT_EQ(logged(), Lines{"loadFromConfig: Snapshot UUID is empty."});
}

TEST_F(SnapshotRecord, ARecordWithoutASnapshotIsFilledFirst)
{
    addDaily();
    for (int number : {0, 257, -1, 1, 256}) {
        const bool is_filled = number == 1 || number == 256;
        _tag_iscsi_snapshot_ record{};
        record.snap_id = number;
        UUID.copy(record.uuid, sizeof(record.uuid) - 1);
        EXPECT_EQ(snapshot.loadActionLock(record), 0);
        EXPECT_EQ(called(), is_filled ? Lines{asked_lock} : (Lines{loaded, asked_lock})) << number;
        EXPECT_TRUE(snapshot.is_action_locked);
        EXPECT_STREQ(record.name, is_filled ? "" : "daily");
        EXPECT_EQ(snapshot.name, "") << "nothing but the fact is taken";

        record.snap_id = number;
        EXPECT_EQ(snapshot.loadLockedAppKeys(record), 0);
        EXPECT_EQ(called().front(), is_filled ? "NLIBCSzListAlloc(512)" : loaded);
        EXPECT_EQ(snapshot.locked_app_keys, (std::set<std::string>{"a", "b"}));
    }
}

TEST_F(SnapshotRecord, AppKeysLockAndUnlock)
{
    const auto &keys = addSnapshot(7, 3, "daily").app_keys;
    const std::string longest(127, 'k');
    EXPECT_EQ(snapshot.lockSnapshotByAppKey(longest), 0);
    EXPECT_EQ(snapshot.lockSnapshotByAppKey("backup"), 0);
    EXPECT_EQ(keys, (std::set<std::string>{"backup", longest}));
    EXPECT_TRUE(snapshot.locked_app_keys.empty()) << "callers reload";
    EXPECT_EQ(snapshot.unlockSnapshotByAppKey("backup"), 0);
    EXPECT_EQ(keys, std::set<std::string>{longest});

    EXPECT_EQ(snapshot.lockSnapshotByAppKey(longest + "k"), 18990025);
    EXPECT_EQ(logged().back(), "lockSnapshotByAppKey: Failed to copy app key: " + longest + "k.");
    EXPECT_EQ(snapshot.unlockSnapshotByAppKey(longest + "k"), 18990025);
    EXPECT_EQ(logged().back(), "unlockSnapshotByAppKey: Failed to copy app key: " + longest + "k.");
    EXPECT_EQ(keys.size(), 1u);
}

// Progress.

TEST_F(SnapshotRecord, SyncProgressIsThatOfTheDataPath)
{
    auto &daily = addSnapshot(7, 3, "daily");
    auto &record = daily.record;
    strcpy(record.root_path, "/vol1");
    unsigned long long done = 0, total = 0;
    for (const auto &[flags, folder] : {std::pair<uint32_t, const char *>{8, "@Snapshot"}, {9, "@EP_trash"}}) {
        record.flags = flags;
        daily.copied = flags;
        daily.to_copy = 1ULL << 40;
        called();
        EXPECT_EQ(snapshot.loadSyncProgress(done, total), 0);
        EXPECT_EQ(called().back(),
                  std::string("NORViSCSIChildLunSyncProgressGet(/vol1/") + folder + "/SNAPSHOT_L7_S3_daily)");
        EXPECT_EQ(done, flags);
        EXPECT_EQ(total, 1ULL << 40);
    }
    memset(record.root_path, 'r', sizeof(record.root_path));
    EXPECT_EQ(snapshot.loadSyncProgress(done, total), 18990011);
    EXPECT_EQ(called().back(), "NORViSCSIChildLunSyncProgressGet(" + std::string(319, 'r') + ")");
    EXPECT_EQ(done, 9u) << "untouched";
}

TEST_F(SnapshotRecord, ExportProgressIsReadFromItsFile)
{
    const int lid = privateLUNID();
    const std::string path = "/tmp/iscsi/L" + std::to_string(lid) + "_S3.export_progress";
    addSnapshot(lid, 3, "daily");
    snapshot = ISCSISnapshotInfo(snapshotUUIDOf(lid, 3));
    unsigned long long done = 9, total = 9;
    int step = 9;
    EXPECT_EQ(snapshot.getExportProgress(done, total, step), 0);
    EXPECT_EQ(done + total, 0u);
    EXPECT_EQ(step, 18990592);

    const struct {
        const char *text;
        int step;
        unsigned long long done, total;
    } cases[] = {
        {"step=2\ndone_bytes=10\ntotal_bytes=20\n", 2, 10, 20},
        {"total_bytes = \"0x14\"\ndone_bytes = \"0xa\"\nstep = \"-7\"\n", -7, 10, 20},
        {"step=010\ndone_bytes=18446744073709551615\ntotal_bytes=1\n", 10, UINT64_MAX, 1},
    };
    for (const auto &c : cases) {
        writeFile(path, c.text);
        EXPECT_EQ(snapshot.getExportProgress(done, total, step), 0) << c.text;
        EXPECT_EQ(step, c.step) << c.text;
        EXPECT_EQ(done, c.done) << c.text;
        EXPECT_EQ(total, c.total) << c.text;
    }
    EXPECT_EQ(called().back(), "NLIBCFileGetKeyValue(" + path + ", total_bytes, 128)");
}

// Lists.

class SnapshotLists : public LibraryTest {
protected:
    SnapshotLists()
    {
        addLUN(3, "lun");
        addLUN(4, "other");
        addSnapshot(4, 1, "other's");
        addSnapshot(3, 9, "ninth").app_keys = {"b", "a"};
        addSnapshot(3, 2, "second").is_locked = true;
    }

    std::vector<ISCSISnapshotInfo> snapshots{ISCSISnapshotInfo("old")};

    std::string names() const
    {
        std::string names;
        for (const auto &snapshot : snapshots)
            names += snapshot.name + " ";
        return names;
    }
};

TEST_F(SnapshotLists, AreInThePlatformsOrderAndSortNewestFirst)
{
    const struct {
        int lid;
        long time;
        const char *query, *names;
    } cases[] = {
        {3, 0, "2, 3, 0", "second ninth "},
        {0, 0, "2, 0, 0", ""},
        {-1, EPOCH + 9, "64, 0, 1234571499", "ninth "},
        {4, EPOCH, "66, 4, 1234571490", "other's "},
        {-1, 0, "0, 0, 0", "second ninth other's "},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(c.lid, snapshots, c.time, 0), 0);
        EXPECT_EQ(names(), c.names);
        EXPECT_EQ(called(), Lines{std::string("NORViSCSISnapshotConfLoad(") + c.query + ")"});
    }
    std::sort(snapshots.begin(), snapshots.end(), ISCSISnapshotInfo::CompareBySnapshotTime);
    EXPECT_EQ(names(), "ninth second other's ");
    EXPECT_FALSE(ISCSISnapshotInfo::CompareBySnapshotTime(snapshots[0], snapshots[0]));
}

TEST_F(SnapshotLists, LockFactsComeWhenAskedFor)
{
    for (int filter = 0; filter < 8; ++filter) {
        EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(3, snapshots, 0, filter), 0);
        ISCSISnapshotInfo second(fake::model().snapshots.at({3, 2}).record),
            ninth(fake::model().snapshots.at({3, 9}).record);
        second.is_action_locked = (filter & ACTION_LOCK) != 0;
        if (filter & APP_KEYS)
            ninth.locked_app_keys = {"a", "b"};
        ASSERT_EQ(snapshots.size(), 2u);
        EXPECT_EQ(snapshots[0].toString(), second.toString()) << filter;
        EXPECT_EQ(snapshots[1].toString(), ninth.toString()) << filter;
    }
    fake::failCall("NORViSCSIIsSnapshotLocked", 2, INJECTED);
    EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(-1, snapshots, 0, ACTION_LOCK), INJECTED);
    EXPECT_EQ(names(), "second ") << "what came before the failing one";
    fake::failCall("NLIBCSzListGet", 2, 0);
    EXPECT_EQ(ISCSISnapshotInfo::ListSnapshot(-1, snapshots, 0, APP_KEYS), 18990309);
    EXPECT_EQ(names(), "second ");
}

} // namespace
} // namespace unit

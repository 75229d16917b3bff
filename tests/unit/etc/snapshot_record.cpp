#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "tests/unit/Library.h"

#include <cstring>
#include <limits>

namespace unit {
namespace {

using ISCSI::ISCSISnapshotInfo;

constexpr int ACTION_LOCK = 1, APP_KEYS = 2;
const std::string UUID = snapshotUUIDOf(7, 3);

const char *const NO_FIELD =
    "uuid:  ,snapshot_id: 0 ,parent_lun_id: 0 ,total_size: 0 (0bytes) ,mapped_size: 0 (0bytes)"
    " ,is_action_locked: false ,is_app_consistent: false ,is_user_locked: false ,name:  ,status:  ,description:"
    "  ,root_path:  ,taken_by:  ,version:  ,create_time: Thu Jan 01 00:00:00 UTC 1970"
    " ,snapshot_time: Thu Jan 01 00:00:00 UTC 1970 ,locked_app_keys: ";

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
    EXPECT_EQ(ISCSISnapshotInfo().toString(), NO_FIELD);
    snapshot = ISCSISnapshotInfo("u");
    EXPECT_EQ(snapshot.uuid, "u");
    snapshot.uuid.clear();
    EXPECT_EQ(snapshot.toString(), NO_FIELD);
    snapshot.create_time = std::numeric_limits<long>::max();
    EXPECT_NE(snapshot.toString().find(" ,create_time: "), std::string::npos) << "absurd times still render";
}

TEST_F(SnapshotRecord, ReadsTheSDKRecordAtItsOffsets)
{
    _tag_iscsi_snapshot_ record{};
    char *bytes = reinterpret_cast<char *>(&record);
    const auto putNumber = [&](size_t offset, auto value) { memcpy(bytes + offset, &value, sizeof(value)); };
    putNumber(0, int32_t(7));
    putNumber(4, int32_t(3));
    putNumber(16, uint64_t(GIB));
    putNumber(24, uint64_t(1536));
    putNumber(32, int32_t(EPOCH));
    putNumber(36, int32_t(EPOCH + 1));
    putNumber(41, uint8_t(1));
    strcpy(bytes + 42, "daily");
    strcpy(bytes + 298, "Healthy");
    strcpy(bytes + 330, "a note");
    strcpy(bytes + 1354, "/volume1");
    strcpy(bytes + 5449, "alice");
    strcpy(bytes + 5481, "u");
    strcpy(bytes + 5518, "v");
    snapshot = ISCSISnapshotInfo(record);
    EXPECT_FALSE(snapshot.is_action_locked);
    EXPECT_TRUE(snapshot.locked_app_keys.empty());
    snapshot.is_action_locked = true;
    snapshot.locked_app_keys = {"a", "b"};
    EXPECT_EQ(snapshot.toString(), EVERY_FIELD);

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
    const Json::Value good = parsed(JSON);
    snapshot = everyField();
    const auto refuses = [&](const Json::Value &in, const std::string &what) {
        EXPECT_EQ(snapshot.loadFromJson(in), 18990201) << what;
        EXPECT_EQ(logged(), Lines{"loadFromJson: Failed to get snapshot info from Json."}) << what;
        EXPECT_EQ(snapshot.toString(), EVERY_FIELD) << what;
    };
    for (const char *json : {"null", "[]", "\"text\"", "7", "{}"})
        refuses(parsed(json), json);

    const Lines ids = {"snapshot_id", "parent_lun_id", "create_time", "snapshot_time"};
    const Lines sizes = {"total_size", "mapped_size"};
    const Lines flags = {"is_app_consistent", "is_user_locked"};
    const Lines texts = {"name", "status", "description", "root_path", "taken_by", "uuid", "version"};
    const struct {
        Lines keys;
        bool is_required;
        Lines wrong;
    } kinds[] = {
        {ids, true, {"null", "\"3\"", "true", "[3]", "3.5", "2147483648", "-2147483649"}},
        {sizes, true, {"null", "\"3\"", "{}", "1e99", "-1", "18446744073709551616"}},
        {flags, true, {"null", "\"true\"", "[]", "1.5"}},
        {texts, true, {"null", "3", "false", "[\"a\"]", "\"a\\u0000b\""}},
        {{"is_action_locked"}, false, {"null", "\"false\"", "[]"}},
        {{"locked_app_keys"}, false, {"[3]", "[\"c\", null]", "[[\"c\"]]", "[\"c\\u0000d\"]"}},
    };
    for (const auto &kind : kinds) {
        for (const auto &key : kind.keys) {
            Json::Value in = good;
            in.removeMember(key);
            if (kind.is_required)
                refuses(in, "no " + key);
            for (const auto &value : kind.wrong) {
                in[key] = parsed(value);
                refuses(in, key + ": " + value);
            }
        }
    }
}

// Loading and locks.

TEST_F(SnapshotRecord, LoadsWhatTheFlagsAskFor)
{
    addDaily();
    const std::string keys_of = "NORViSCSISnapshotLockedAppKeysGet(" + UUID + ")";
    const struct {
        int flags;
        bool is_locked;
        std::set<std::string> keys;
        Lines calls;
    } cases[] = {
        {0, false, {"old"}, {loaded}},
        {ACTION_LOCK, true, {"old"}, {loaded, asked_lock}},
        {APP_KEYS,
         false,
         {"a", "b"},
         {loaded, "NLIBCSzListAlloc(512)", keys_of, "NLIBCSzListGet(0)", "NLIBCSzListGet(1)"}},
        {3,
         true,
         {"a", "b"},
         {loaded, asked_lock, "NLIBCSzListAlloc(512)", keys_of, "NLIBCSzListGet(0)", "NLIBCSzListGet(1)"}},
    };
    for (const auto &c : cases) {
        snapshot = ISCSISnapshotInfo(UUID);
        snapshot.locked_app_keys = {"old"};
        EXPECT_EQ(snapshot.loadFromConfig(c.flags), 0);
        EXPECT_EQ(called(), c.calls) << c.flags;
        EXPECT_EQ(snapshot.name, "daily");
        EXPECT_EQ(snapshot.version, snapshotUUIDOf(7, 9999));
        EXPECT_EQ(snapshot.is_action_locked, c.is_locked);
        EXPECT_EQ(snapshot.locked_app_keys, c.keys);
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

    const Lines refused = {"StringCopy: Failed to copy string: " + longest + "k"};
    EXPECT_EQ(snapshot.lockSnapshotByAppKey(longest + "k"), 18990025);
    EXPECT_EQ(logged(), (Lines{refused[0], "lockSnapshotByAppKey: Failed to copy app key: " + longest + "k."}));
    EXPECT_EQ(snapshot.unlockSnapshotByAppKey(longest + "k"), 18990025);
    EXPECT_EQ(logged(), (Lines{refused[0], "unlockSnapshotByAppKey: Failed to copy app key: " + longest + "k."}));
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
    EXPECT_EQ(std::vector<unsigned long long>({done, total}), std::vector<unsigned long long>({0, 0}));
    EXPECT_EQ(step, 18990592);

    const unsigned long long most = std::numeric_limits<unsigned long long>::max();
    const struct {
        const char *text;
        const char *missing; ///< null when the file is complete
        int step;
        unsigned long long done, total;
    } cases[] = {
        {"step=2\ndone_bytes=10\ntotal_bytes=20\n", nullptr, 2, 10, 20},
        {"total_bytes = \"0x14\"\ndone_bytes = \"0xa\"\nstep = \"-7\"\n", nullptr, -7, 10, 20},
        {"step=010\ndone_bytes=18446744073709551615\ntotal_bytes=18446744073709551615\n", nullptr, 10, most, most},
        {"", "step", 9, 9, 9},
        {"step=5\n", "done_bytes", 5, 9, 9},
        {"step=5\ndone_bytes=10\ntotal=20\n", "total_bytes", 5, 10, 9},
    };
    for (const auto &c : cases) {
        writeFile(path, c.text);
        done = total = 9;
        step = 9;
        EXPECT_EQ(snapshot.getExportProgress(done, total, step), c.missing ? 18990017 : 0) << c.text;
        EXPECT_EQ(logged(), c.missing ? Lines{": Failed to get export progress from '" + path + "': key = " + c.missing}
                                      : Lines());
        EXPECT_EQ(step, c.step) << c.text;
        EXPECT_EQ(done, c.done) << c.text;
        EXPECT_EQ(total, c.total) << c.text;
    }
    EXPECT_EQ(called().back(), "NLIBCFileGetKeyValue(" + path + ", total_bytes, 128)");
}

} // namespace
} // namespace unit

#include "iscsiwebapi/ISCSILUNInfo.h"
#include "tests/unit/BadJson.h"

#include <cstring>
#include <limits>

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;

constexpr int LOCKED = 2, MAPPED = 4, EXTENT_SIZE = 8, ALLOCATED_SIZE = 16, STATUS = 32;

const char *const EVERY_FIELD =
    "uuid: 1a2b3c4d-0000-4000-8000-000000000003 ,lun_id: 3 ,name: vol1 ,type: ADV ,location: /volume1"
    " ,is_action_locked: true ,is_mapped: false ,size: 1073741824 (1GB) ,extent_size: 65536 (64KB)"
    " ,allocated_size: 1536 (1KB,512bytes) ,status: normal ,restored_time: Sat Feb 14 00:31:30 UTC 2009";
ISCSILUNInfo everyField()
{
    return {3, NORV_LUN_TYPE_ADV, 1234571490, GIB, uuidOf(3), "vol1", "/volume1", true, false, 65536, 1536, "normal"};
}

class LUNRecord : public LibraryTest {};

TEST_F(LUNRecord, RendersAsText)
{
    EXPECT_EQ(everyField().toString(), EVERY_FIELD);
    ISCSILUNInfo lun;
    for (long absurd : {std::numeric_limits<long>::max(), std::numeric_limits<long>::min()}) {
        lun.restored_time = absurd;
        EXPECT_NE(lun.toString().find(" ,restored_time: "), std::string::npos);
    }

    const struct {
        int type;
        const char *name;
    } names[] = {{0, "unknown"},  {1, "BLOCK"}, {2, "unknown"},  {3, "FILE"},     {7, "THIN"},     {15, "ADV"},
                 {16, "unknown"}, {31, "SINK"}, {47, "unknown"}, {71, "unknown"}, {79, "unknown"}, {-1, "unknown"}};
    for (const auto &c : names) {
        lun.type = static_cast<_tag_iscsi_lun_type>(c.type);
        EXPECT_NE(lun.toString().find(std::string(" ,type: ") + c.name + " ,location"), std::string::npos) << c.type;
    }
}

TEST_F(LUNRecord, IsThatOfTheSDKWithoutTheLiveState)
{
    _tag_iscsi_lun_ record;
    memset(&record, 0xEE, sizeof(record));
    ASSERT_EQ(everyField().fillISCSILUN(record), 0);
    EXPECT_EQ(record.options, 0u);
    ISCSILUNInfo expected = everyField();
    expected.is_action_locked = false;
    expected.allocated_size = 0;
    expected.status.clear();
    EXPECT_EQ(ISCSILUNInfo(record).toString(), expected.toString());

    // A platform that forgot a NUL must not make us read on.
    memset(record.name, 'n', sizeof(record.name));
    memset(record.location, 'l', sizeof(record.location));
    memset(record.uuid, 'u', sizeof(record.uuid));
    const ISCSILUNInfo lun(record);
    EXPECT_EQ(lun.name, std::string(256, 'n'));
    EXPECT_EQ(lun.location, std::string(4095, 'l'));
    EXPECT_EQ(lun.uuid, std::string(37, 'u'));
}

TEST_F(LUNRecord, TextsThatDoNotFitAreRefusedInOrder)
{
    const struct {
        std::string ISCSILUNInfo::*field;
        size_t longest;
        const char *name;
    } cases[] = {{&ISCSILUNInfo::uuid, 36, "UUID"},
                 {&ISCSILUNInfo::location, 4094, "location"},
                 {&ISCSILUNInfo::name, 255, "name"}};
    for (const auto &c : cases) {
        ISCSILUNInfo lun = everyField();
        _tag_iscsi_lun_ record{};
        lun.*c.field = std::string(c.longest, 'x');
        EXPECT_EQ(lun.fillISCSILUN(record), 0) << c.name;
        EXPECT_EQ(logged(), Lines());

        lun.*c.field += 'y';
        EXPECT_EQ(lun.fillISCSILUN(record), 18990025) << c.name;
        EXPECT_EQ(logged(),
                  (Lines{"StringCopy: Failed to copy string: " + lun.*c.field,
                         std::string("fillISCSILUN: Failed to copy LUN ") + c.name + ". lun: " + lun.toString()}));
    }
}

// Loading by UUID.

using LoadLUN = LibraryTest;

TEST_F(LoadLUN, TakesTheRecordAndOnlyTheStateAskedFor)
{
    addLUN(3, "vol1").is_locked = true;
    ISCSILUNInfo lun(uuidOf(3)), expected(recordOf(3));
    lun.extent_size = expected.extent_size = 1;
    lun.status = expected.status = "old";
    _tag_iscsi_lun_ record;
    memset(&record, 0xEE, sizeof(record));
    EXPECT_EQ(lun.loadFromConfig(record, 0), 0);
    EXPECT_EQ(lun.toString(), expected.toString());
    EXPECT_EQ(record.lid, 3);
    EXPECT_EQ(called(), Lines{"NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 0)"});
}

TEST_F(LoadLUN, LiveStateComesInTheOrderOfTheFlags)
{
    addLUN(3, "vol1").map_file.mapped_size = 1536;
    addTarget(5, "five");
    addMapping(5, 3);
    ISCSILUNInfo lun(uuidOf(3));
    _tag_iscsi_lun_ record{};
    const std::string path = "/volume1/@iSCSITrg/iSCSI_3_Extent_vol1_000";
    EXPECT_EQ(lun.loadFromConfig(record, LOCKED | MAPPED | EXTENT_SIZE | ALLOCATED_SIZE | STATUS), 0);
    EXPECT_EQ(called(), (Lines{
                            "NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 62)",
                            "NORViSCSILunIsLocked(3)",
                            "NORViSCSIConfGet(0x7220, 3)",
                            "NORVExtentPoolMapFileMappedSizeGet(" + path + ", /volume1)",
                            "NLIBCExec(/usr/norv/sbin/epck, --vaaick, nolog)",
                            "NORViSCSILunProgressGet(3)",
                            "NORViSCSIFamilyConfGetByLID(3)",
                        }));
    ISCSILUNInfo expected = everyField();
    expected.is_action_locked = false;
    expected.is_mapped = true;
    expected.restored_time = 0;
    EXPECT_EQ(lun.toString(), expected.toString());
}

TEST_F(LoadLUN, AListIsReplacedInThePlatformsOrder)
{
    std::vector<ISCSILUNInfo> luns{ISCSILUNInfo("old")};
    EXPECT_EQ(ISCSILUNInfo::ListLUN(luns, 62), 0);
    EXPECT_TRUE(luns.empty());

    addLUN(9, "nine").is_locked = true;
    addLUN(2, "two").health = "Unhealthy";
    EXPECT_EQ(ISCSILUNInfo::ListLUN(luns, 0), 0);
    ASSERT_EQ(luns.size(), 2u);
    EXPECT_EQ(luns[0].name, "two");
    EXPECT_EQ(luns[1].toString(), ISCSILUNInfo(recordOf(9)).toString());
    EXPECT_EQ(called().back(), "NORViSCSILunConfigGetAll()") << "no live state without a filter";

    EXPECT_EQ(ISCSILUNInfo::ListLUN(luns, ISCSILUNInfo::LOAD_LOCKED | ISCSILUNInfo::LOAD_STATUS), 0);
    ASSERT_EQ(luns.size(), 2u);
    EXPECT_EQ(luns[0].status, "Unhealthy");
    EXPECT_TRUE(luns[1].is_action_locked);
}

TEST_F(LoadLUN, ByIDAndByName)
{
    addLUN(3, "vol1");
    addLUN(9, "UPPER");
    std::string uuid;
    int lid = 0;
    EXPECT_EQ(ISCSILUNInfo::GetUUIDByLID(3, uuid), 0);
    EXPECT_EQ(uuid, uuidOf(3));
    EXPECT_EQ(ISCSILUNInfo::GetUUIDByLUNName("UPPER", uuid), 0);
    EXPECT_EQ(uuid, uuidOf(9));
    EXPECT_EQ(ISCSILUNInfo::GetLIDByLUNName("UPPER", lid), 0);
    EXPECT_EQ(lid, 9);
    EXPECT_EQ(ISCSILUNInfo::GetUUIDByLID(4, uuid), 18990531);
    EXPECT_EQ(ISCSILUNInfo::GetUUIDByLUNName("upper", uuid), 18990531);
    EXPECT_EQ(ISCSILUNInfo::GetLIDByLUNName("upper", lid), 18990531);
    EXPECT_EQ(uuid + std::to_string(lid), uuidOf(9) + "9");
    EXPECT_EQ(logged(), (Lines{"GetUUIDByLID: No such LUN. LUN ID: 4", "GetUUIDByLUNName: No such LUN. Name: upper",
                               "GetLIDByLUNName: No such LUN. Name: upper"}));
}

// JSON.

const char *const JSON = R"({"lun_id": 4, "type": 7, "restored_time": 60, "size": 18446744073709551615,
    "uuid": "u", "name": "n", "location": "/l", "is_action_locked": false, "is_mapped": true,
    "extent_size": 4294967295, "allocated_size": 2, "status": "s"})";
const ISCSILUNInfo READ_FROM_JSON(4, NORV_LUN_TYPE_THIN, 60, UINT64_MAX, "u", "n", "/l", false, true, UINT32_MAX, 2,
                                  "s");

class LUNJson : public LibraryTest {
protected:
    ISCSILUNInfo lun = everyField();
};

TEST_F(LUNJson, WritesItsKeysBesideOthers)
{
    Json::Value out = parsed(R"({"other": [1], "name": 3})");
    EXPECT_EQ(lun.toJsonFormat(out), 0);
    // Signed and unsigned numbers are different values to the comparison.
    EXPECT_EQ(parsed(out.toStyledString()),
              parsed(R"({"other": [1], "lun_id": 3, "type": 15, "restored_time": 1234571490,
        "size": 1073741824, "uuid": "1a2b3c4d-0000-4000-8000-000000000003", "name": "vol1", "location": "/volume1",
        "is_action_locked": true, "is_mapped": false, "extent_size": 65536, "allocated_size": 1536,
        "status": "normal"})"));

    ISCSILUNInfo back;
    EXPECT_EQ(back.loadFromJson(out), 0);
    EXPECT_EQ(back.toString(), EVERY_FIELD);
}

TEST_F(LUNJson, ARecordWithoutIdentityHasNone)
{
    for (const char *json : {"{}", R"({"other": 1})", "null", "[1]", "\"text\""}) {
        Json::Value out = parsed(json);
        EXPECT_EQ(ISCSILUNInfo().toJsonFormat(out), 3328);
        EXPECT_EQ(out, parsed(json));
        EXPECT_EQ(logged(), Lines{"toJsonFormat: Not enough info to create LUN info in Json format: " +
                                  ISCSILUNInfo().toString()});
    }
    for (const char *json : {"[1]", "\"text\"", "7"}) {
        Json::Value out = parsed(json);
        EXPECT_EQ(lun.toJsonFormat(out), 0) << "an output that cannot take keys must not throw";
    }
}

TEST_F(LUNJson, ReadsEveryKeyAndKeepsWhatIsAbsent)
{
    EXPECT_EQ(lun.loadFromJson(parsed(JSON)), 0);
    EXPECT_EQ(lun.toString(), READ_FROM_JSON.toString());

    lun = everyField();
    Json::Value required = parsed(JSON);
    for (const char *key : {"is_action_locked", "is_mapped", "extent_size", "allocated_size", "status"})
        required.removeMember(key);
    EXPECT_EQ(lun.loadFromJson(required), 0);
    ISCSILUNInfo expected = READ_FROM_JSON;
    expected.is_action_locked = true;
    expected.is_mapped = false;
    expected.extent_size = 65536;
    expected.allocated_size = 1536;
    expected.status = "normal";
    EXPECT_EQ(lun.toString(), expected.toString());
}

TEST_F(LUNJson, KnownTypesAreKeptAndOthersAreNone)
{
    for (int type : {1, 3, 7, 15, 31, 47, 71, 79, 0, 2, -1, 16, 143, INT32_MAX}) {
        Json::Value in = parsed(JSON);
        in["type"] = type;
        EXPECT_EQ(lun.loadFromJson(in), 0);
        const std::set<int> known = {1, 3, 7, 15, 31, 47, 71, 79};
        EXPECT_EQ(lun.type, known.count(type) ? type : 0);
    }
}

TEST_F(LUNJson, BadInputChangesNothing)
{
    expectBadJsonRefused(lun, parsed(JSON), {"loadFromJson: Failed to get LUN info from Json."},
                         {{{"lun_id", "type", "restored_time"}, true, NO_INT},
                          {{"size"}, true, NO_SIZE},
                          {{"allocated_size"}, false, NO_SIZE},
                          {{"extent_size"}, false, {"null", "\"3\"", "3.5", "-1", "4294967296"}},
                          {{"uuid", "name", "location"}, true, NO_TEXT},
                          {{"status"}, false, NO_TEXT},
                          {{"is_action_locked", "is_mapped"}, false, NO_FLAG}});
}

} // namespace
} // namespace unit

#include "iscsiwebapi/ISCSILUNInfo.h"
#include "tests/unit/Library.h"

#include <cstring>
#include <functional>
#include <limits>

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;

constexpr int LOCKED = 2, MAPPED = 4, EXTENT_SIZE = 8, ALLOCATED_SIZE = 16, STATUS = 32;

const char *const EVERY_FIELD =
    "uuid: 1a2b3c4d-0000-4000-8000-000000000003 ,lun_id: 3 ,name: vol1 ,type: ADV ,location: /volume1"
    " ,is_action_locked: true ,is_mapped: false ,size: 1073741824 (1GB) ,extent_size: 65536 (64KB)"
    " ,allocated_size: 1536 (1KB,512bytes) ,status: normal ,restored_time: Sat Feb 14 00:31:30 UTC 2009";
const char *const NO_FIELD = "uuid:  ,lun_id: 0 ,name:  ,type: unknown ,location:  ,is_action_locked: false"
                             " ,is_mapped: false ,size: 0 (0bytes) ,extent_size: 0 (0bytes)"
                             " ,allocated_size: 0 (0bytes) ,status:  ,restored_time: Thu Jan 01 00:00:00 UTC 1970";

ISCSILUNInfo everyField()
{
    return {3, NORV_LUN_TYPE_ADV, 1234571490, GIB, uuidOf(3), "vol1", "/volume1", true, false, 65536, 1536, "normal"};
}

class LUNRecord : public LibraryTest {};

TEST_F(LUNRecord, RendersAsText)
{
    EXPECT_EQ(everyField().toString(), EVERY_FIELD);
    EXPECT_EQ(ISCSILUNInfo().toString(), NO_FIELD);

    const struct {
        int type;
        const char *name;
    } names[] = {{0, "unknown"},  {1, "BLOCK"}, {2, "unknown"},  {3, "FILE"},     {7, "THIN"},     {15, "ADV"},
                 {16, "unknown"}, {31, "SINK"}, {47, "unknown"}, {71, "unknown"}, {79, "unknown"}, {-1, "unknown"}};
    for (const auto &c : names) {
        ISCSILUNInfo lun;
        lun.type = static_cast<_tag_iscsi_lun_type>(c.type);
        EXPECT_NE(lun.toString().find(std::string(" ,type: ") + c.name + " ,location"), std::string::npos) << c.type;
    }
}

TEST_F(LUNRecord, AbsurdTimesStillRender)
{
    ISCSILUNInfo lun;
    for (long time : {std::numeric_limits<long>::max(), std::numeric_limits<long>::min()}) {
        lun.restored_time = time;
        EXPECT_NE(lun.toString().find(" ,restored_time: "), std::string::npos);
    }
}

TEST_F(LUNRecord, FillsTheSDKRecordAtItsOffsets)
{
    _tag_iscsi_lun_ record;
    memset(&record, 0xEE, sizeof(record));
    ASSERT_EQ(everyField().fillISCSILUN(record), 0);
    EXPECT_EQ(at<int32_t>(&record, 0), 3);
    EXPECT_EQ(at<uint32_t>(&record, 8), 0u);
    EXPECT_EQ(at<uint32_t>(&record, 16), 65536u);
    EXPECT_EQ(at<uint64_t>(&record, 24), GIB);
    EXPECT_EQ(at<int32_t>(&record, 32), 1234571490);
    EXPECT_EQ(at<int32_t>(&record, 36), 15);
    EXPECT_STREQ(textAt(&record, 44), uuidOf(3).c_str());
    EXPECT_STREQ(textAt(&record, 81), "");
    EXPECT_STREQ(textAt(&record, 118), "/volume1");
    EXPECT_STREQ(textAt(&record, 4213), "vol1");
    for (size_t offset = 4213 + 5; offset < 4480; ++offset)
        ASSERT_EQ(at<char>(&record, offset), '\0') << offset;
}

TEST_F(LUNRecord, ReadsTheSDKRecordAndLeavesTheLiveState)
{
    _tag_iscsi_lun_ record;
    ASSERT_EQ(everyField().fillISCSILUN(record), 0);
    EXPECT_EQ(ISCSILUNInfo(record).toString(),
              "uuid: 1a2b3c4d-0000-4000-8000-000000000003 ,lun_id: 3 ,name: vol1 ,type: ADV ,location: /volume1"
              " ,is_action_locked: false ,is_mapped: false ,size: 1073741824 (1GB) ,extent_size: 65536 (64KB)"
              " ,allocated_size: 0 (0bytes) ,status:  ,restored_time: Sat Feb 14 00:31:30 UTC 2009");

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
        size_t next_offset; ///< of the text behind it, left zero
    } cases[] = {
        {&ISCSILUNInfo::uuid, 36, "UUID", 118},
        {&ISCSILUNInfo::location, 4094, "location", 4213},
        {&ISCSILUNInfo::name, 255, "name", 4469},
    };
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
        EXPECT_EQ(at<char>(&record, c.next_offset), '\0') << c.name;
        EXPECT_EQ(at<uint64_t>(&record, 24), GIB);
    }
}

// Loading by UUID.

using LoadLUN = LibraryTest;

TEST_F(LoadLUN, TakesTheRecordAndOnlyTheStateAskedFor)
{
    addLUN(3, "vol1").is_locked = true;
    ISCSILUNInfo lun(uuidOf(3));
    lun.extent_size = 1;
    lun.status = "old";
    _tag_iscsi_lun_ record;
    memset(&record, 0xEE, sizeof(record));
    EXPECT_EQ(lun.loadFromConfig(record, 0), 0);
    EXPECT_EQ(lun.lun_id, 3);
    EXPECT_EQ(lun.name, "vol1");
    EXPECT_EQ(lun.location, "/volume1");
    EXPECT_EQ(lun.size, GIB);
    EXPECT_EQ(lun.type, NORV_LUN_TYPE_ADV);
    EXPECT_EQ(record.lid, 3);
    EXPECT_EQ(lun.extent_size, 1u);
    EXPECT_FALSE(lun.is_action_locked);
    EXPECT_EQ(lun.status, "old");
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
    EXPECT_TRUE(lun.is_mapped);
    EXPECT_EQ(lun.extent_size, 65536u);
    EXPECT_EQ(lun.allocated_size, 1536u);
    EXPECT_EQ(lun.status, "normal");
}

// JSON.

const char *const JSON = R"({"lun_id": 4, "type": 7, "restored_time": 60, "size": 18446744073709551615,
    "uuid": "u", "name": "n", "location": "/l", "is_action_locked": false, "is_mapped": true,
    "extent_size": 4294967295, "allocated_size": 2, "status": "s"})";
const char *const READ_FROM_JSON =
    "uuid: u ,lun_id: 4 ,name: n ,type: THIN ,location: /l ,is_action_locked: false ,is_mapped: true"
    " ,size: 18446744073709551615 (15EB,1023PB,1023TB,1023GB,1023MB,1023KB,1023bytes)"
    " ,extent_size: 4294967295 (3GB,1023MB,1023KB,1023bytes) ,allocated_size: 2 (2bytes) ,status: s"
    " ,restored_time: Thu Jan 01 00:01:00 UTC 1970";

class LUNJson : public LibraryTest {
protected:
    ISCSILUNInfo lun = everyField();

    void refuses(const Json::Value &in, const std::string &what)
    {
        EXPECT_EQ(lun.loadFromJson(in), 18990201) << what;
        EXPECT_EQ(logged(), Lines{"loadFromJson: Failed to get LUN info from Json."}) << what;
        EXPECT_EQ(lun.toString(), EVERY_FIELD) << what;
    }
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
        EXPECT_EQ(logged(),
                  Lines{std::string("toJsonFormat: Not enough info to create LUN info in Json format: ") + NO_FIELD});
    }
    for (const char *json : {"[1]", "\"text\"", "7"}) {
        Json::Value out = parsed(json);
        EXPECT_EQ(lun.toJsonFormat(out), 0) << "an output that cannot take keys must not throw";
    }
}

TEST_F(LUNJson, ReadsEveryKeyAndKeepsWhatIsAbsent)
{
    EXPECT_EQ(lun.loadFromJson(parsed(JSON)), 0);
    EXPECT_EQ(lun.toString(), READ_FROM_JSON);

    lun = everyField();
    Json::Value required = parsed(JSON);
    for (const char *key : {"is_action_locked", "is_mapped", "extent_size", "allocated_size", "status"})
        required.removeMember(key);
    EXPECT_EQ(lun.loadFromJson(required), 0);
    EXPECT_TRUE(lun.is_action_locked);
    EXPECT_EQ(lun.extent_size, 65536u);
    EXPECT_EQ(lun.allocated_size, 1536u);
    EXPECT_EQ(lun.status, "normal");
    EXPECT_EQ(lun.name, "n");
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
    const Json::Value good = parsed(JSON);
    for (const char *key : {"lun_id", "type", "restored_time", "size", "uuid", "name", "location"}) {
        Json::Value in = good;
        in.removeMember(key);
        refuses(in, std::string("no ") + key);
    }

    const std::string not_a_number[] = {"null", "\"3\"", "true", "[3]", "{}", "3.5", "1e99"};
    const std::string not_a_text[] = {"null", "3", "false", "[\"a\"]", "{\"a\": \"b\"}", "\"a\\u0000b\""};
    const std::string not_a_flag[] = {"null", "\"true\"", "[]", "{}"};
    const auto refusesEach = [&](const char *key, const auto &values) {
        for (const std::string &value : values) {
            Json::Value in = good;
            in[key] = parsed(value);
            refuses(in, key + (": " + value));
        }
    };
    for (const char *key : {"lun_id", "type", "restored_time", "size", "extent_size", "allocated_size"})
        refusesEach(key, not_a_number);
    for (const char *key : {"uuid", "name", "location", "status"})
        refusesEach(key, not_a_text);
    for (const char *key : {"is_action_locked", "is_mapped"})
        refusesEach(key, not_a_flag);

    const std::string no_int[] = {"2147483648", "-2147483649", "18446744073709551615"};
    const std::string no_unsigned[] = {"-1", "4294967296"};
    const std::string no_unsigned_64[] = {"-1", "18446744073709551616"};
    for (const char *key : {"lun_id", "type", "restored_time"})
        refusesEach(key, no_int);
    refusesEach("extent_size", no_unsigned);
    for (const char *key : {"size", "allocated_size"})
        refusesEach(key, no_unsigned_64);
}

TEST_F(LUNJson, WhatIsNoObjectIsRefused)
{
    for (const char *json : {"null", "[]", "[1, 2]", "\"text\"", "7", "true", "{}"})
        refuses(parsed(json), json);
    Json::Value deep;
    for (int i = 0; i < 500; ++i) {
        Json::Value outer;
        outer["name"] = deep;
        deep = outer;
    }
    refuses(deep, "nested objects");
}

} // namespace
} // namespace unit

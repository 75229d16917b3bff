#include "iscsiwebapi/ISCSITargetInfo.h"
#include "tests/unit/Library.h"

#include <cstring>
#include <string_view>
#include <utility>

namespace unit {
namespace {

using ISCSI::ISCSITargetInfo;

const char *const EVERY_FIELD =
    "tid: 5 ,name: five ,iqn: iqn.2000-01.example:five ,mapping_index: 2 ,is_enabled: true"
    " ,has_header_checksum: false ,has_data_checksum: true ,max_recv_seg_bytes: 262144 (256KB)"
    " ,max_send_seg_bytes: 4097 (4KB,1bytes) ,max_sessions: 8 ,auth_type: 2 ,user: alice ,mutual_user: bob";

ISCSITargetInfo everyField()
{
    return {5,     "five",       "iqn.2000-01.example:five", 2, true, false, true, 262144, 4097, 8, 2, "alice", SECRET,
            "bob", MUTUAL_SECRET};
}

using TargetRecord = LibraryTest;

TEST_F(TargetRecord, TextFormHasNoSecrets)
{
    EXPECT_EQ(everyField().toString(), EVERY_FIELD);
    const ISCSITargetInfo request("n", "i", false, true, false, 1, 2, 3, 4, "u", "p", "mu", "mp");
    EXPECT_EQ(request.toString(),
              "tid: 0 ,name: n ,iqn: i ,mapping_index: 0 ,is_enabled: false ,has_header_checksum: true"
              " ,has_data_checksum: false ,max_recv_seg_bytes: 1 (1bytes) ,max_send_seg_bytes: 2 (2bytes)"
              " ,max_sessions: 3 ,auth_type: 4 ,user: u ,mutual_user: mu");
    EXPECT_EQ(request.password + request.mutual_password, "pmp");
}

TEST_F(TargetRecord, FillsTheSDKsAndIsLoadedWithBothSecretsOfOneValue)
{
    auto &known = addTarget(5, "old").record;
    known.reserved_5 = 0x55;
    known.reserved_8 = 0x88;
    ASSERT_EQ(everyField().fillISCSITARGET(known), 0);
    EXPECT_EQ(known.reserved_5, 0x55) << "not ours to touch";
    EXPECT_EQ(known.reserved_8, 0);
    EXPECT_STREQ(known.password, SECRET);
    EXPECT_STREQ(known.mutual_password, MUTUAL_SECRET);

    ISCSITargetInfo target(5);
    target.mapping_index = 2; // no part of it
    _tag_iscsi_target_ record;
    memset(&record, 0xEE, sizeof(record));
    EXPECT_EQ(target.loadFromConfig(record), 0);
    EXPECT_EQ(called(), Lines{"NORViSCSIConfGet(0x1001, 5)"});
    EXPECT_EQ(target.toString(), EVERY_FIELD);
    EXPECT_EQ(target.password, SECRET);
    EXPECT_EQ(target.mutual_password, SECRET);
    const auto bytes = [](const _tag_iscsi_target_ &of) {
        return std::string_view(reinterpret_cast<const char *>(&of), sizeof(of));
    };
    EXPECT_EQ(bytes(record), bytes(known));
}

TEST_F(TargetRecord, UnknownAuthTypesAreMarked)
{
    for (unsigned int type : {0u, 1u, 2u, 3u, 5u, 0xFFFFFFFFu}) {
        const unsigned int expected = type > 2 ? 0xFFFFFFFF : type;
        ISCSITargetInfo target = everyField();
        target.auth_type = type;
        _tag_iscsi_target_ record{};
        EXPECT_EQ(target.fillISCSITARGET(record), 0);
        EXPECT_EQ(record.auth_type, expected);

        addTarget(5, "five").record.auth_type = type;
        EXPECT_EQ(target.loadFromConfig(record), 0);
        EXPECT_EQ(target.auth_type, expected);
        std::vector<ISCSITargetInfo> all;
        EXPECT_EQ(ISCSITargetInfo::ListTarget(all, ""), 0);
        EXPECT_EQ(all.at(0).auth_type, expected);
    }
}

TEST_F(TargetRecord, TextsThatDoNotFitAreRefusedInOrder)
{
    const struct {
        std::string ISCSITargetInfo::*field;
        size_t longest;
        const char *what;
        bool is_secret;
    } cases[] = {
        {&ISCSITargetInfo::name, 255, "name", false},
        {&ISCSITargetInfo::iqn, 255, "IQN", false},
        {&ISCSITargetInfo::user, 63, "user name", false},
        {&ISCSITargetInfo::password, 63, "password", true},
        {&ISCSITargetInfo::mutual_user, 63, "mutual user name", false},
        {&ISCSITargetInfo::mutual_password, 63, "mutual password", true},
    };
    for (const auto &c : cases) {
        ISCSITargetInfo target = everyField();
        target.*c.field = std::string(c.longest, 'x');
        _tag_iscsi_target_ record{};
        EXPECT_EQ(target.fillISCSITARGET(record), 0);
        EXPECT_EQ(logged(), Lines());

        target.*c.field += 'x';
        record = {};
        EXPECT_EQ(target.fillISCSITARGET(record), 18990025);
        EXPECT_EQ(logged(), (Lines{c.is_secret ? "SecretCopy: Failed to copy string: ***"
                                               : "StringCopy: Failed to copy string: " + target.*c.field,
                                   "fillISCSITARGET: Failed to copy target " + std::string(c.what) +
                                       ". target: " + target.toString()}));
        EXPECT_EQ(record.tid, 0);
        EXPECT_EQ(record.max_sessions, 0u);
    }
}

TEST_F(TargetRecord, LoadingAnUnknownTargetChangesNothing)
{
    addTarget(5, "five");
    ISCSITargetInfo target = everyField();
    target.tid = 9;
    const std::string before = target.toString();
    _tag_iscsi_target_ record{};
    EXPECT_EQ(target.loadFromConfig(record), 18990722);
    EXPECT_EQ(logged(), Lines{"loadFromConfig: No such target. target ID: 9"});
    EXPECT_EQ(target.toString(), before);
    EXPECT_EQ(target.mutual_password, MUTUAL_SECRET);
    EXPECT_EQ(record.tid, 0);
}

TEST_F(TargetRecord, JsonReplacesWhatWasThere)
{
    const Json::Value expected = parsed(R"({"target_id": 5, "name": "five", "iqn": "iqn.2000-01.example:five",
        "mapping_index": 2, "is_enabled": true, "has_header_checksum": false, "has_data_checksum": true,
        "max_recv_seq_bytes": 262144, "max_send_seq_bytes": 4097, "max_sessions": 8, "auth_type": 2,
        "user": "alice", "password": "opensesame-in", "mutual_user": "bob", "mutual_password": "opensesame-out"})");
    for (const char *json : {"null", R"({"other": 1})", "[1, 2]"}) {
        Json::Value out = parsed(json);
        EXPECT_EQ(everyField().toJsonFormat(out), 0);
        // Signed and unsigned numbers are different values to the comparison.
        EXPECT_EQ(parsed(out.toStyledString()), expected);

        out = parsed(json);
        EXPECT_EQ(ISCSITargetInfo(5).toJsonFormat(out), 3328);
        EXPECT_EQ(out, parsed(json));
        EXPECT_EQ(logged(), Lines{"toJsonFormat: Not enough info to create target info in Json format: " +
                                  ISCSITargetInfo(5).toString()});
    }
}

TEST_F(TargetRecord, ListsAllTargetsOrThoseOfALUN)
{
    addLUN(3, "vol1");
    addTarget(2, "two");
    addTarget(40, "forty");
    addMapping(40, 3, 7);
    addMapping(2, 3, 1);
    addMapping(2, 4, 2);
    const auto list = [](const std::string &lun_uuid) {
        std::vector<ISCSITargetInfo> targets{ISCSITargetInfo(9)};
        EXPECT_EQ(ISCSITargetInfo::ListTarget(targets, lun_uuid), 0);
        std::string result;
        for (const auto &target : targets)
            result += target.name + " " + std::to_string(target.mapping_index) + " ";
        return result;
    };
    EXPECT_EQ(list(""), "two -1 forty -1 ");
    EXPECT_EQ(called(), Lines{"NORViSCSIConfGet(0x7000)"});
    EXPECT_EQ(list(uuidOf(3)), "two 1 forty 7 ");
    EXPECT_EQ(called(), (Lines{"NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 0)",
                               "NORViSCSIConfGet(0x7020, " + uuidOf(3) + ")"}));
    fake::model().mappings.clear();
    EXPECT_EQ(list(uuidOf(3)), "");
}

TEST_F(TargetRecord, NamesAreLookedUpWithTheirOwnQuery)
{
    addTarget(40, "forty");
    int tid = -5;
    EXPECT_EQ(ISCSITargetInfo::GetTIDByTargetName("forty", tid), 0);
    EXPECT_EQ(tid, 40);
    EXPECT_EQ(called(), Lines{"NORViSCSIConfTargetLoad(0x1004, forty)"});
    EXPECT_EQ(ISCSITargetInfo::GetTIDByTargetName("none", tid), 18990713);
    EXPECT_EQ(logged(), Lines{"GetTIDByTargetName: No such target. Name: none"});
    EXPECT_EQ(tid, 40);
}

} // namespace
} // namespace unit

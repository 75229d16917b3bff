#include "iscsiwebapi/ISCSITargetInfo.h"
#include "tests/unit/Library.h"

#include <cstring>
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

class TargetRecord : public LibraryTest {};

TEST_F(TargetRecord, TextFormHasNoSecrets)
{
    EXPECT_EQ(everyField().toString(), EVERY_FIELD);
    EXPECT_EQ(ISCSITargetInfo(7).toString(),
              "tid: 7 ,name:  ,iqn:  ,mapping_index: 0 ,is_enabled: false ,has_header_checksum: false"
              " ,has_data_checksum: false ,max_recv_seg_bytes: 0 (0bytes) ,max_send_seg_bytes: 0 (0bytes)"
              " ,max_sessions: 0 ,auth_type: 0 ,user:  ,mutual_user: ");
    const ISCSITargetInfo request("n", "i", false, true, false, 1, 2, 3, 4, "u", "p", "mu", "mp");
    EXPECT_EQ(request.toString(),
              "tid: 0 ,name: n ,iqn: i ,mapping_index: 0 ,is_enabled: false ,has_header_checksum: true"
              " ,has_data_checksum: false ,max_recv_seg_bytes: 1 (1bytes) ,max_send_seg_bytes: 2 (2bytes)"
              " ,max_sessions: 3 ,auth_type: 4 ,user: u ,mutual_user: mu");
    EXPECT_EQ(request.password + request.mutual_password, "pmp");
}

TEST_F(TargetRecord, FillsTheSDKRecordAtItsOffsets)
{
    _tag_iscsi_target_ record{};
    record.reserved_5 = 0x55;
    record.reserved_8 = 0x88;
    ASSERT_EQ(everyField().fillISCSITARGET(record), 0);
    EXPECT_EQ(at<int32_t>(&record, 0), 5);
    EXPECT_EQ(at<uint8_t>(&record, 4), 1);
    EXPECT_EQ(at<uint8_t>(&record, 5), 0x55) << "not ours to touch";
    EXPECT_EQ(at<uint8_t>(&record, 6), 0);
    EXPECT_EQ(at<uint8_t>(&record, 7), 1);
    EXPECT_EQ(at<uint8_t>(&record, 8), 0);
    EXPECT_STREQ(textAt(&record, 9), "five");
    EXPECT_STREQ(textAt(&record, 265), "iqn.2000-01.example:five");
    EXPECT_EQ(at<uint32_t>(&record, 524), 262144u);
    EXPECT_EQ(at<uint32_t>(&record, 528), 4097u);
    EXPECT_EQ(at<uint32_t>(&record, 532), 8u);
    EXPECT_EQ(at<uint32_t>(&record, 536), 2u);
    EXPECT_STREQ(textAt(&record, 540), "alice");
    EXPECT_STREQ(textAt(&record, 604), SECRET);
    EXPECT_STREQ(textAt(&record, 668), "bob");
    EXPECT_STREQ(textAt(&record, 732), MUTUAL_SECRET);
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
        const char *sentence; ///< null where the text is left to us
        size_t next_offset;
        bool is_secret;
    } cases[] = {
        {&ISCSITargetInfo::name, 255, "Failed to copy target name", 265, false},
        {&ISCSITargetInfo::iqn, 255, "Failed to copy target IQN", 540, false},
        {&ISCSITargetInfo::user, 63, "Failed to copy target user name", 604, false},
        {&ISCSITargetInfo::password, 63, nullptr, 668, true},
        {&ISCSITargetInfo::mutual_user, 63, nullptr, 732, false},
        {&ISCSITargetInfo::mutual_password, 63, nullptr, 796, true},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.next_offset);
        ISCSITargetInfo target = everyField();
        target.*c.field = std::string(c.longest, 'x');
        _tag_iscsi_target_ record{};
        EXPECT_EQ(target.fillISCSITARGET(record), 0);
        EXPECT_EQ(logged(), Lines());

        target.*c.field = SECRET + std::string(c.longest, 'x');
        if (!c.is_secret)
            target.*c.field = std::string(c.longest + 1, 'x');
        record = {};
        EXPECT_EQ(target.fillISCSITARGET(record), 18990025);
        const Lines lines = logged(); // which fails the test if a secret is in a line
        ASSERT_EQ(lines.size(), 2u);
        EXPECT_EQ(lines[0], (c.is_secret ? "SecretCopy: Failed to copy string: ***"
                                         : "StringCopy: Failed to copy string: " + target.*c.field));
        if (c.sentence) {
            EXPECT_EQ(lines[1], std::string("fillISCSITARGET: ") + c.sentence + ". target: " + target.toString());
        }
        EXPECT_EQ(at<char>(&record, c.next_offset), '\0') << "written behind the failing field";
        EXPECT_EQ(record.tid, 0);
        EXPECT_EQ(record.max_sessions, 0u);
    }
}

TEST_F(TargetRecord, LoadingGivesBothSecretsTheSameValue)
{
    addTarget(5, "five");
    addTarget(6, "six");
    ISCSITargetInfo target(6);
    _tag_iscsi_target_ record;
    memset(&record, 0xEE, sizeof(record));
    EXPECT_EQ(target.loadFromConfig(record), 0);
    EXPECT_EQ(target.toString(),
              "tid: 6 ,name: six ,iqn: iqn.2000-01.example:six ,mapping_index: 0 ,is_enabled: true"
              " ,has_header_checksum: true ,has_data_checksum: false ,max_recv_seg_bytes: 262144 (256KB)"
              " ,max_send_seg_bytes: 4096 (4KB) ,max_sessions: 2 ,auth_type: 2 ,user: alice ,mutual_user: bob");
    EXPECT_EQ(target.password, SECRET);
    EXPECT_EQ(target.mutual_password, SECRET);
    EXPECT_EQ(record.tid, 6);
    EXPECT_STREQ(record.mutual_password, MUTUAL_SECRET);
    EXPECT_EQ(called(), Lines{"NORViSCSIConfGet(0x1001, 6)"});
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
    for (const char *json : {"null", R"({"other": 1})", "[1, 2]", "\"text\"", "7"}) {
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

// Lists and lookups.

class TargetLookup : public LibraryTest {
protected:
    TargetLookup()
    {
        addLUN(3, "vol1");
        addLUN(4, "vol2");
        addTarget(2, "two");
        addTarget(40, "forty");
        addTarget(41, "300");
        addMapping(40, 3, 7);
        addMapping(2, 3, 1);
        addMapping(2, 4, 2);
    }

    using IndexByName = std::vector<std::pair<std::string, int>>;

    IndexByName list(const std::string &lun_uuid)
    {
        std::vector<ISCSITargetInfo> targets{ISCSITargetInfo(9)};
        EXPECT_EQ(ISCSITargetInfo::ListTarget(targets, lun_uuid), 0);
        IndexByName result;
        for (const auto &target : targets)
            result.emplace_back(target.name, target.mapping_index);
        return result;
    }
};

TEST_F(TargetLookup, ListsAllTargetsOrThoseOfALUN)
{
    EXPECT_EQ(list(""), (IndexByName{{"two", -1}, {"forty", -1}, {"300", -1}}));
    EXPECT_EQ(called(), Lines{"NORViSCSIConfGet(0x7000)"});
    EXPECT_EQ(list(uuidOf(3)), (IndexByName{{"two", 1}, {"forty", 7}}));
    EXPECT_EQ(called(), (Lines{"NORViSCSILunConfigGetByUUID(" + uuidOf(3) + ", 0)",
                               "NORViSCSIConfGet(0x7020, " + uuidOf(3) + ")"}));
    EXPECT_EQ(list(uuidOf(4)), (IndexByName{{"two", 2}}));
    fake::model().mappings.clear();
    EXPECT_EQ(list(uuidOf(4)), IndexByName());
}

TEST_F(TargetLookup, SelectorsThatResolve)
{
    const std::pair<std::string, int> cases[] = {
        {"7", 7},   {"1", 1},    {"256", 256}, {"007", 7}, {"+7", 7},     {" 7", 7},
        {"7up", 7}, {"tg#1", 2}, {"TG#2", 40}, {"two", 2}, {"forty", 40}, {"300", 41},
    };
    for (const auto &[selector, expected] : cases) {
        int tid = -5;
        EXPECT_EQ(ISCSITargetInfo::GetTID(selector, tid), 0) << selector;
        EXPECT_EQ(tid, expected) << selector;
    }
    called();
    int tid = 0;
    EXPECT_EQ(ISCSITargetInfo::GetTID("7", tid), 0);
    EXPECT_EQ(called(), Lines()) << "an ID needs no lookup";
    EXPECT_EQ(logged(), Lines());
}

TEST_F(TargetLookup, SelectorsThatDoNot)
{
    for (const char *selector : {"tg#0", "tg#4", "tg#4294967297", "tg#18446744073709551617", "tg#-1"}) {
        int tid = -5;
        EXPECT_EQ(ISCSITargetInfo::GetTID(selector, tid), 18990710) << selector;
        EXPECT_EQ(tid, -5);
        const Lines lines = logged();
        ASSERT_EQ(lines.size(), 1u) << selector;
        EXPECT_EQ(lines[0].find(": Index of target is out of range. index: "), 0u) << lines[0];
        EXPECT_NE(lines[0].find(", #nodes: 3"), std::string::npos) << lines[0];
    }
    const std::string names[] = {"",   "0",     "257",   "-7",   "4294967297", "18446744073709551617",  "TWO", "tg#",
                                 "tg", "tg#1 ", "lun#1", "%s%n", "x7",         std::string(200000, '9')};
    for (const auto &selector : names) {
        int tid = -5;
        EXPECT_EQ(ISCSITargetInfo::GetTID(selector, tid), 18990710) << selector.substr(0, 60);
        EXPECT_EQ(tid, -5);
        EXPECT_EQ(logged(), (Lines{"GetTIDByTargetName: No such target. Name: " + selector,
                                   ": Invalid target ID, name or index. input: " + selector}));
    }
}

TEST_F(TargetLookup, NamesAreLookedUpWithTheirOwnQuery)
{
    int tid = -5;
    EXPECT_EQ(ISCSITargetInfo::GetTIDByTargetName("forty", tid), 0);
    EXPECT_EQ(tid, 40);
    EXPECT_EQ(called(), Lines{"NORViSCSIConfTargetLoad(0x1004, forty)"});
    EXPECT_EQ(ISCSITargetInfo::GetTIDByTargetName("none", tid), 18990713);
    EXPECT_EQ(tid, 40);
}

} // namespace
} // namespace unit

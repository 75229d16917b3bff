#include "iscsiwebapi/ISCSILIBTarget.h"
#include "tests/unit/Library.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBTarget::ISCSILIBTarget;
using Masking = std::map<std::string, ISCSI_TARGET_AUTHORITY>;

constexpr auto NONE = NORV_AUTHORITY_NONE;
constexpr auto READ = NORV_AUTHORITY_READ;
constexpr auto READ_WRITE = NORV_AUTHORITY_READ_WRITE;

const std::string LONGEST_IQN(255, 'q');
const std::string TOO_LONG_IQN(256, 'q');

using MaskingTest = LibraryTest;

TEST_F(MaskingTest, IsReadAsAMapWhereTheFirstOfARepeatedIQNWins)
{
    addTarget(5, "five").masking = {{"iqn.b", 1}, {"iqn.a", 3}, {"iqn.b", 0}, {"", 3}};
    Masking masking = {{"before", READ}};
    EXPECT_EQ(ISCSILIBTarget::GetTargetMasking(5, masking), 0);
    EXPECT_EQ(masking, (Masking{{"", READ_WRITE}, {"iqn.a", READ_WRITE}, {"iqn.b", READ}}));
}

TEST_F(MaskingTest, ConvertsToEntriesInKeyOrder)
{
    std::vector<_tag_struct_iscsi_acl_> entries(7);
    EXPECT_EQ(ISCSILIBTarget::TargetMaskMap2Vec(5, {{"iqn.a", READ}, {TOO_LONG_IQN, READ}}, entries), 18990711);
    EXPECT_EQ(entries.size(), 7u);
    EXPECT_EQ(
        logged(),
        (Lines{"StringCopy: Failed to copy string: " + TOO_LONG_IQN,
               "[E] TargetMaskMap2Vec: error code: 18990701 (Bad target iqn) [invalid iqn: " + TOO_LONG_IQN + "]"}));

    const Masking masking = {{"iqn.b", READ}, {LONGEST_IQN, NONE}, {"iqn.a", READ_WRITE}};
    EXPECT_EQ(ISCSILIBTarget::TargetMaskMap2Vec(5, masking, entries), 0);
    ASSERT_EQ(entries.size(), 3u);
    auto entry = entries.begin();
    for (const auto &[iqn, permission] : masking) {
        EXPECT_EQ(entry->tid, 5);
        EXPECT_EQ(entry->iqn, iqn);
        EXPECT_EQ(entry++->permission, permission);
    }
    EXPECT_EQ(ISCSILIBTarget::TargetMaskMap2Vec(5, {}, entries), 0);
    EXPECT_TRUE(entries.empty());
}

TEST_F(MaskingTest, SettingSendsTheDifference)
{
    const struct {
        const char *name;
        std::vector<std::pair<std::string, int>> current;
        const char *request;
        Lines changes; ///< calls that change the masking
    } cases[] = {
        {"NothingOfNothing", {}, "[]", {}},
        {"EqualNeedsNoCall",
         {{"iqn.a", 3}, {"iqn.b", 0}},
         R"([{"iqn": "iqn.b", "permission": "-"}, {"iqn": "iqn.a", "permission": "rw"}])",
         {}},
        {"CreateThenUpdateThenDelete",
         {{"iqn.drop", 3}, {"iqn.change", 3}, {"iqn.drop2", 1}, {"iqn.keep", 1}},
         R"([{"iqn": "iqn.keep", "permission": "r"}, {"iqn": "iqn.change", "permission": "r"},
         {"iqn": "iqn.new", "permission": "-"}, {"iqn": "iqn.before", "permission": "rw"}])",
         {"NORViSCSIMaskingsCreate(5, iqn.before=3 iqn.new=0)", "NORViSCSIMaskingsUpdate(5, iqn.change=1)",
          "NORViSCSIMaskingsRemove(5, iqn.drop=3 iqn.drop2=1)"}},
        {"EmptyDeletesAllButTheNameless",
         {{"iqn.a", 3}, {"", 3}, {"iqn.b", 1}},
         "[]",
         {"NORViSCSIMaskingsRemove(5, iqn.a=3 iqn.b=1)"}},
        {"TheNamelessAloneStays", {{"", 3}}, "[]", {}},
        {"TheDefaultEntryIsAnEntryLikeOthers",
         {{"iqn.2001-01.norv:default", 3}},
         R"([{"iqn": "iqn.2001-01.norv:default", "permission": "-"}])",
         {"NORViSCSIMaskingsUpdate(5, iqn.2001-01.norv:default=0)"}},
        {"ElementsWithoutIQNAreIgnored",
         {{"", 3}},
         R"([{"iqn": "", "permission": "r"}, {"permission": "rw"}, {"iqn": "iqn.a", "permission": "r", "more": []}])",
         {"NORViSCSIMaskingsCreate(5, iqn.a=1)"}},
        {"TheLastOfARepeatedNewIQNCounts",
         {},
         R"([{"iqn": "iqn.a", "permission": "r"}, {"iqn": "iqn.a", "permission": "rw"}])",
         {"NORViSCSIMaskingsCreate(5, iqn.a=3)"}},
        {"CaseMakesAnotherIQN",
         {{"iqn.a", 3}},
         R"([{"iqn": "IQN.A", "permission": "rw"}])",
         {"NORViSCSIMaskingsCreate(5, IQN.A=3)", "NORViSCSIMaskingsRemove(5, iqn.a=3)"}},
        {"ARepeatedKnownIQNIsCreatedAgain",
         {{"iqn.a", 1}},
         R"([{"iqn": "iqn.a", "permission": "r"}, {"iqn": "iqn.a", "permission": "rw"}])",
         {"NORViSCSIMaskingsCreate(5, iqn.a=3)"}},
        {"ARepeatedChangedIQNIsCreatedAndUpdated",
         {{"iqn.a", 1}},
         R"([{"iqn": "iqn.a", "permission": "-"}, {"iqn": "iqn.a", "permission": "rw"}])",
         {"NORViSCSIMaskingsCreate(5, iqn.a=3)", "NORViSCSIMaskingsUpdate(5, iqn.a=0)"}},
    };

    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        addTarget(5, "five").masking = c.current;
        EXPECT_EQ(ISCSILIBTarget::ACLMasksSet(5, parsed(c.request)), 0);
        Lines expected = {"NORViSCSITargetMaskingGet(5)"};
        expected.insert(expected.end(), c.changes.begin(), c.changes.end());
        EXPECT_EQ(called(), expected);
        EXPECT_EQ(logged(), Lines());
    }
}

TEST_F(MaskingTest, BadRequestsChangeNothing)
{
    const std::string good = R"({"iqn": "iqn.new", "permission": "rw"})";
    addTarget(5, "five").masking = {{"iqn.a", 3}};
    const auto refuses = [](const std::string &request, int code) {
        EXPECT_EQ(ISCSILIBTarget::ACLMasksSet(5, parsed(request)), code) << request;
        EXPECT_EQ(called({"NORViSCSIMaskings"}), Lines()) << request;
        const Lines lines = logged();
        ASSERT_EQ(lines.size(), code == 18990201 ? 1u : 0u) << request;
        if (code == 18990201) {
            EXPECT_EQ(lines[0].find("[E] ACLMasksSet: error code: 18990201 (Invalid input) ["), 0u) << lines[0];
        }
    };
    for (const char *no_list : {"null", "{}", R"({"iqn": "iqn.new", "permission": "rw"})", "\"iqn.new\"", "5"})
        refuses(no_list, 18990201);
    for (const char *no_entry :
         {"null", "[]", "5", "\"rw\"", R"({"iqn": 5, "permission": "rw"})", R"({"iqn": null, "permission": "rw"})",
          R"({"iqn": ["iqn.x"], "permission": "rw"})", R"({"iqn": "iqn.x", "permission": 3})",
          R"({"iqn": "iqn.x", "permission": {"rw": 1}})"})
        refuses("[" + good + ", " + no_entry + "]", 18990201);
    for (const char *no_permission : {"{}", R"({"iqn": "iqn.x"})", R"({"iqn": "", "permission": "x"})"})
        refuses("[" + good + ", " + no_permission + "]", 18990708);
    for (const char *text : {"", "RW", "R", "w", "wr", "rw ", "none", "--", "3"})
        refuses("[" + good + R"(, {"iqn": "iqn.x", "permission": ")" + text + "\"}]", 18990708);
}

TEST_F(MaskingTest, ATooLongIQNStopsTheSequence)
{
    addTarget(5, "five").masking = {{"iqn.a", 3}};
    Json::Value request(Json::arrayValue);
    request.append(parsed(R"({"iqn": "iqn.new", "permission": "rw"})"));
    request.append(parsed(R"({"permission": "r"})"));
    request[1]["iqn"] = TOO_LONG_IQN;
    EXPECT_EQ(ISCSILIBTarget::ACLMasksSet(5, request), 18990711);
    EXPECT_EQ(called(), Lines{"NORViSCSITargetMaskingGet(5)"});
    request[1]["iqn"] = LONGEST_IQN;
    EXPECT_EQ(ISCSILIBTarget::ACLMasksSet(5, request), 0);
}

} // namespace
} // namespace unit

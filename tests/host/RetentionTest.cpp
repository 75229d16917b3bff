#include "HostTest.h"

#include "host/services/Retention.h"
#include "platform/iscsi_snapshot.h"
#include "platform/retention.h"

#include <cstdlib>
#include <ctime>
#include <map>

namespace norvhost {
namespace {

constexpr int64_t hour = 3600, day = 24 * hour;
constexpr int64_t noon = 1767268800; // Thursday 2026-01-01 12:00 UTC

/// Which ones stay, as their places in the list: "0,2".
std::string kept(const std::vector<RetentionCandidate> &candidates, const RetentionPolicy &policy, int64_t now)
{
    std::string places;
    const auto decisions = decideRetention(candidates, policy, now);
    for (size_t i = 0; i < decisions.size(); ++i) {
        EXPECT_FALSE(decisions[i].reason.empty());
        if (decisions[i].kept)
            places += (places.empty() ? "" : ",") + std::to_string(i);
    }
    return places;
}

std::vector<RetentionCandidate> at(std::initializer_list<int64_t> times)
{
    std::vector<RetentionCandidate> candidates;
    for (const int64_t time : times)
        candidates.push_back({time, ""});
    return candidates;
}

TEST(RetentionDecisionTest, Table)
{
    const Zone zone("UTC0");
    const struct {
        const char *what;
        std::vector<RetentionCandidate> candidates;
        RetentionPolicy policy;
        const char *kept;
        int64_t now = noon;
    } cases[] = {
        {"nothing", {}, {3, 0, 0, 0}, ""},
        {"newest, in whatever order they are listed",
         at({noon - 3, noon - 1, noon - 4, noon - 2}),
         {2, 0, 0, 0},
         "1,3"},
        {"fewer than the rule keeps", at({noon - 1}), {9, 0, 0, 0}, "0"},
        {"same time: the later of the list", at({noon, noon, noon}), {2, 0, 0, 0}, "1,2"},
        {"locked ones stay and do not count",
         {{noon - 1, "locked"}, {noon - 2, ""}, {noon - 3, ""}, {noon - 4, "locked"}},
         {1, 0, 0, 0},
         "0,1,3"},
        {"hours: the newest of each",
         at({noon - 2 * hour, noon - hour, noon - hour + 59, noon - 1, noon}),
         {0, 3, 0, 0},
         "0,3,4"},
        {"only hours that have one count", at({noon - 90 * day, noon - 50 * day, noon}), {0, 2, 0, 0}, "1,2"},
        {"days from midnight",
         at({noon - 2 * day, noon - day, noon - day + 1, noon - 12 * hour - 1, noon - 12 * hour}),
         {0, 0, 2, 0},
         "3,4"},
        {"weeks from Monday", at({noon - 10 * day, noon - 4 * day, noon - 3 * day, noon}), {0, 0, 0, 2}, "1,3"},
        {"rules add up",
         at({noon - 9 * day, noon - 8 * day, noon - day, noon - 2 * hour, noon - hour, noon}),
         {1, 2, 2, 2},
         "1,2,4,5"},
        {"from the future: stays, does not count",
         at({noon - 2, noon - 1, noon + 1, noon + 400 * day}),
         {1, 0, 0, 0},
         "1,2,3"},
        {"clock far ahead", at({noon - 2 * hour, noon - hour, noon}), {0, 2, 0, 0}, "1,2", noon + 9999 * day},
        {"clock far behind", at({noon - 2 * hour, noon - hour, noon}), {1, 0, 0, 0}, "0,1,2", 0},
        {"before the epoch", at({-2 * day, -day, -1}), {0, 0, 2, 0}, "0,2"},
    };
    for (const auto &c : cases)
        EXPECT_EQ(c.kept, kept(c.candidates, c.policy, c.now)) << c.what;
}

TEST(RetentionDecisionTest, SlotsAreLocalTimeAndTheHourThatComesTwiceIsTwo)
{
    const Zone zone("CET-1CEST,M3.5.0,M10.5.0/3");
    constexpr int64_t first_two = 1792886400; // 2026-10-25 02:00 CEST; an hour later it is 02:00 CET
    EXPECT_EQ("1,3", kept(at({first_two, first_two + 59, first_two + hour, first_two + hour + 59}), {0, 2, 0, 0},
                          first_two + day));
    constexpr int64_t midnight = noon - 13 * hour; // 2026-01-01 00:00 CET
    EXPECT_EQ("0,2", kept(at({midnight - 1, midnight, midnight + 1}), {0, 0, 2, 0}, noon));
}

TEST(RetentionPolicyTest, TextBothWays)
{
    RetentionPolicy policy;
    ASSERT_EQ(0, parseRetention(retentionText({7, 24, 0, 4}), policy)) << iscsi_host_last_error();
    EXPECT_EQ(7, policy.newest);
    EXPECT_EQ(24, policy.hourly);
    EXPECT_EQ(0, policy.daily);
    EXPECT_EQ(4, policy.weekly);
    for (const char *bad :
         {"", "keep=3", "[]", "null", "{}", "{\"newest\":0}", "{\"newest\":-1}", "{\"newest\":\"3\"}",
          "{\"newest\":1.5}", "{\"newest\":99999999999}", "{\"yearly\":1}", "{\"newest\":3} x", "{\"newest\":3,}"}) {
        EXPECT_EQ(NORV_ERR_BAD_PARAMETER, parseRetention(bad, policy)) << bad;
        EXPECT_EQ(7, policy.newest);
    }
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, parseRetention(std::string(2000, '['), policy));
}

/// Runs of policies, on things that the test itself keeps.
struct RetentionRunTest : HostTest {
    RetentionRunTest() { things.clear(), refused.clear(), calls = 0; }

    static inline std::map<std::string, long> things; ///< by UUID
    static inline std::string refused;                ///< the one that cannot be deleted
    static inline int calls;

    static int get(const char *key, _tag_retention_target_ **targets)
    {
        EXPECT_STREQ("1", key);
        ++calls;
        for (const auto &[uuid, time] : things) {
            auto *target = static_cast<_tag_retention_target_ *>(calloc(1, sizeof(_tag_retention_target_)));
            uuid.copy(target->uuid, 36);
            target->time = time;
            target->next = *targets;
            *targets = target;
        }
        return refused == "listing" ? 7 : 0;
    }
    static int remove(const char *, const _tag_retention_target_ *target)
    {
        if (target->uuid == refused)
            return 7;
        things.erase(target->uuid);
        return 0;
    }
    int run() { return NORVRETENTIONRunPolicy("Lun#", "1", get, remove, 0); }
};

TEST_F(RetentionRunTest, DeletesWhatThePolicyDoesNotKeep)
{
    create("a", NORV_LUN_TYPE_ADV);
    const std::map<std::string, long> all = {{"a", 10}, {"b", 20}, {"c", 30}, {"d", 40}};
    things = all;
    EXPECT_EQ(0, run()) << "no policy keeps all";
    EXPECT_EQ(0, calls);

    ASSERT_EQ(0, iscsihost::setRetentionPolicy(1, {2, 0, 0, 0})) << iscsi_host_last_error();
    refused = "listing";
    EXPECT_GT(0, run());
    EXPECT_EQ(all, things) << "a list that may be cut decides nothing";

    refused = "a";
    EXPECT_GT(0, run());
    EXPECT_EQ((std::map<std::string, long>{{"a", 10}, {"c", 30}, {"d", 40}}), things) << "the others go all the same";
    refused.clear();
    EXPECT_EQ(0, run());
    EXPECT_EQ(2u, things.size());
    EXPECT_GT(0, NORVRETENTIONRunPolicy("Lun#", nullptr, get, remove, 0));
}

TEST_F(RetentionRunTest, PoliciesBelongToLuns)
{
    _tag_iscsi_lun_ lun = create("a", NORV_LUN_TYPE_ADV);
    RetentionPolicy policy;
    EXPECT_EQ(NORV_ERR_NO_SUCH_LUN, iscsihost::setRetentionPolicy(9, {1, 0, 0, 0}));
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, iscsihost::setRetentionPolicy(lun.lid, {}));
    ASSERT_EQ(0, iscsihost::setRetentionPolicy(lun.lid, {1, 0, 0, 2}));
    ASSERT_EQ(0, iscsihost::setRetentionPolicy(lun.lid, {3, 0, 0, 2}));
    ASSERT_EQ(0, iscsihost::getRetentionPolicy(lun.lid, policy));
    EXPECT_EQ(3, policy.newest);
    EXPECT_EQ(2, policy.weekly);
    ASSERT_EQ(0, NORViSCSILunDelete(&lun)) << iscsi_host_last_error();
    ASSERT_EQ(lun.lid, create("b", NORV_LUN_TYPE_ADV).lid);
    ASSERT_EQ(0, iscsihost::getRetentionPolicy(lun.lid, policy));
    EXPECT_EQ(0, policy.newest) << "the next LUN with this ID has none";
}

TEST_F(RetentionRunTest, WhatIsNoLun)
{
    _tag_retention_target_ *targets = nullptr;
    for (const char *key : {"", "x", "1x", "0", "1025", "-1"})
        EXPECT_EQ(NORV_ERR_LUN_ID, NORVRETAINERiSCSIRetentionTargetGet(key, &targets)) << key;
    EXPECT_EQ(NORV_ERR_LUN_ID, NORVRETAINERiSCSIRetentionTargetGet(nullptr, &targets));
    EXPECT_EQ(nullptr, targets);
    std::vector<iscsihost::RetentionVerdict> verdicts;
    EXPECT_EQ(NORV_ERR_NO_SUCH_LUN, iscsihost::tryRetention(9, nullptr, verdicts));
    const _tag_retention_target_ gone = {};
    EXPECT_EQ(0, NORVRETAINERiSCSIRetentionTargetDelete("1", &gone)) << "somebody else deleted it";
}

} // namespace
} // namespace norvhost

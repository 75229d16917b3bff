#include "HostTest.h"

#include "host/services/ScheduleRule.h"
#include "host/services/Schedules.h"
#include "host/state/Database.h"
#include "platform/schedule.h"

#include <cstdlib>
#include <ctime>
#include <fstream>
#include <sys/stat.h>

namespace norvhost {
namespace {

constexpr const char *berlin = "CET-1CEST,M3.5.0,M10.5.0/3";

int64_t parseTime(const char *text)
{
    tm time = {};
    EXPECT_NE(nullptr, strptime(text, "%Y-%m-%d %H:%M:%S %z", &time)) << text;
    const long offset = time.tm_gmtoff;
    return timegm(&time) - offset;
}

std::string nextText(const char *rule_text, const char *now)
{
    ScheduleRule rule;
    EXPECT_EQ(0, parseScheduleRule(rule_text, rule)) << iscsi_host_last_error();
    const auto next = nextRun(rule, 0, parseTime(now));
    if (!next)
        return "never";
    const auto time = static_cast<time_t>(*next);
    char text[64];
    strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S %z", localtime(&time));
    return text;
}

TEST(ScheduleRuleTest, NextRuns)
{
    const struct {
        const char *zone, *rule, *now, *next;
    } cases[] = {
        {"UTC0", "* * * * *", "2026-01-01 12:00:00 +0000", "2026-01-01 12:01:00 +0000"},
        {"UTC0", "* * * * *", "2026-01-01 11:59:59 +0000", "2026-01-01 12:00:00 +0000"},
        {"UTC0", "*/15 * * * *", "2026-01-01 12:45:00 +0000", "2026-01-01 13:00:00 +0000"},
        {"UTC0", "5-20/10,50 8,20 * * *", "2026-01-01 08:15:00 +0000", "2026-01-01 08:50:00 +0000"},
        {"UTC0", "5-20/10,50 8,20 * * *", "2026-01-01 08:50:00 +0000", "2026-01-01 20:05:00 +0000"},
        {"UTC0", "0 0 * * mon-fri", "2026-01-02 00:00:00 +0000", "2026-01-05 00:00:00 +0000"},
        {"UTC0", "0 0 * * 7", "2026-01-02 00:00:00 +0000", "2026-01-04 00:00:00 +0000"},
        {"UTC0", "0 0 * * 5-7", "2026-01-04 00:00:00 +0000", "2026-01-09 00:00:00 +0000"},
        {"UTC0", "30 6 1 * Mon", "2026-01-02 00:00:00 +0000", "2026-01-05 06:30:00 +0000"},
        {"UTC0", "30 6 1 * Mon", "2026-01-26 06:30:00 +0000", "2026-02-01 06:30:00 +0000"},
        {"UTC0", "0 0 31 * *", "2026-01-31 00:00:00 +0000", "2026-03-31 00:00:00 +0000"},
        {"UTC0", "59 23 31 DEC *", "2026-12-31 23:59:00 +0000", "2027-12-31 23:59:00 +0000"},
        {"UTC0", "0 0 29 2 *", "2096-02-29 00:00:00 +0000", "2104-02-29 00:00:00 +0000"},
        {"UTC0", "0 0 31 feb *", "2026-01-01 00:00:00 +0000", "never"},
        {"UTC0", "hourly", "2026-01-01 12:00:00 +0000", "2026-01-01 13:00:00 +0000"},
        {"UTC0", "Daily", "2026-01-01 12:00:00 +0000", "2026-01-02 00:00:00 +0000"},
        {"UTC0", "weekly", "2026-01-01 12:00:00 +0000", "2026-01-04 00:00:00 +0000"},
        {"UTC0", "monthly", "2026-01-01 12:00:00 +0000", "2026-02-01 00:00:00 +0000"},
        // Local time, and a zone with half an hour.
        {berlin, "0 4 * * *", "2026-01-01 03:30:00 +0000", "2026-01-02 04:00:00 +0100"},
        {"IST-5:30", "0 * * * *", "2026-01-01 12:00:00 +0000", "2026-01-01 18:00:00 +0530"},
        // Spring: 02:00 to 02:59 does not exist on 2026-03-29.
        {berlin, "30 2 * * *", "2026-03-28 12:00:00 +0100", "2026-03-29 03:00:00 +0200"},
        {berlin, "30 2 * * *", "2026-03-29 03:00:00 +0200", "2026-03-30 02:30:00 +0200"},
        {berlin, "0 3 * * *", "2026-03-28 12:00:00 +0100", "2026-03-29 03:00:00 +0200"},
        {berlin, "30 * * * *", "2026-03-29 01:30:00 +0100", "2026-03-29 03:30:00 +0200"},
        {berlin, "30 2 * * mon", "2026-03-28 12:00:00 +0100", "2026-03-30 02:30:00 +0200"},
        // Autumn: 02:00 to 02:59 comes twice on 2026-10-25.
        {berlin, "30 2 * * *", "2026-10-25 00:00:00 +0200", "2026-10-25 02:30:00 +0200"},
        {berlin, "30 2 * * *", "2026-10-25 02:30:00 +0200", "2026-10-26 02:30:00 +0100"},
        {berlin, "30 2 * * *", "2026-10-25 02:10:00 +0100", "2026-10-26 02:30:00 +0100"},
        {berlin, "30 * * * *", "2026-10-25 02:30:00 +0200", "2026-10-25 02:30:00 +0100"},
        {berlin, "0 3 * * *", "2026-10-25 00:00:00 +0200", "2026-10-25 03:00:00 +0100"},
        // Half an hour only, and a midnight that is skipped.
        {"LHST-10:30LHDT-11,M10.1.0,M4.1.0", "15 2 * * *", "2026-10-03 12:00:00 +1030", "2026-10-04 02:30:00 +1100"},
        {"<-04>4<-03>,M9.1.0/0,M4.1.0/0", "0 0 * * *", "2026-09-05 12:00:00 -0400", "2026-09-06 01:00:00 -0300"},
        {"<-04>4<-03>,M9.1.0/0,M4.1.0/0", "0 7 7 9 *", "2026-09-05 12:00:00 -0400", "2026-09-07 07:00:00 -0300"},
    };
    for (const auto &c : cases) {
        const Zone zone(c.zone);
        EXPECT_EQ(c.next, nextText(c.rule, c.now)) << c.rule << " after " << c.now;
    }
}

TEST(ScheduleRuleTest, IntervalsCountFromTheirAnchor)
{
    const struct {
        const char *rule;
        int64_t anchor, now, next;
    } cases[] = {
        {"1m", 100, 100, 160},      {"15m", 1000, 1000 + 899, 1000 + 900},
        {"1h", 1000, 37005, 40600},                                            // ten runs missed
        {"2d", 1000, 999, 1000},    {"1w", 5000000, 0, 5000000 % (7 * 86400)}, // the clock was put back
        {"366d", 0, 0, 31622400},
    };
    for (const auto &c : cases) {
        ScheduleRule rule;
        ASSERT_EQ(0, parseScheduleRule(c.rule, rule)) << iscsi_host_last_error();
        EXPECT_EQ(c.next, nextRun(rule, c.anchor, c.now)) << c.rule;
    }
}

TEST(ScheduleRuleTest, WhatIsNoRuleSaysWhichFieldIsWrong)
{
    const struct {
        const char *rule, *reason;
    } cases[] = {
        {"", "empty"},
        {"  ", "empty"},
        {"1.5h", "neither an interval"},
        {"-1h", "neither an interval"},
        {"@daily", "neither an interval"},
        {"0m", "interval"},
        {"367d", "interval"},
        {"99999999999999999999h", "neither an interval"},
        {"9000000000000000000w", "interval"},
        {"* * * *", "4 fields"},
        {"* * * * * *", "6 fields"},
        {"60 * * * *", "minute: 60"},
        {"* 24 * * *", "hour: 24"},
        {"* * 0 * *", "day of the month: 0"},
        {"* * * 13 *", "month: 13"},
        {"* * * foo *", "month: 'foo'"},
        {"* * * * 8", "day of the week: 8"},
        {"* * * * fri-mon", "day of the week: the range fri-mon runs backwards"},
        {"5/10 * * * *", "minute: the step in '5/10' needs a range"},
        {"*/0 * * * *", "minute: the step in '*/0'"},
        {"1,,2 * * * *", "minute: ''"},
        {"1- * * * *", "minute: ''"},
        {"1-2-3 * * * *", "minute: '2-3'"},
        {"+1 * * * *", "minute: '+1'"},
        {"** * * * *", "minute: '**'"},
        {"mon * * * *", "minute: 'mon'"},
    };
    for (const auto &c : cases) {
        ScheduleRule rule;
        rule.period = 77;
        EXPECT_EQ(NORV_ERR_BAD_PARAMETER, parseScheduleRule(c.rule, rule)) << c.rule;
        EXPECT_NE(nullptr, strstr(iscsi_host_last_error(), c.reason)) << iscsi_host_last_error();
        EXPECT_EQ(77, rule.period) << "untouched";
    }
}

struct ScheduleTest : HostTest {
    int64_t add(const _tag_iscsi_lun_ &lun, const char *rule)
    {
        int64_t id = 0;
        EXPECT_EQ(0, iscsihost::addSchedule("snapshot", lun.lid, rule, id)) << iscsi_host_last_error();
        return id;
    }
    std::vector<iscsihost::Schedule> list()
    {
        std::vector<iscsihost::Schedule> schedules;
        EXPECT_EQ(0, iscsihost::listSchedules(schedules)) << iscsi_host_last_error();
        return schedules;
    }
    /// The LUNs whose jobs were due, in one text.
    std::string claim(int64_t now)
    {
        std::vector<iscsihost::Schedule> due;
        EXPECT_EQ(0, claimDueSchedules(now, due)) << iscsi_host_last_error();
        std::string names;
        for (const auto &schedule : due)
            names += schedule.lun_name;
        return names;
    }
    void setNextRun(int64_t id, int64_t time)
    {
        Query query("UPDATE schedules SET next_run = ?2 WHERE id = ?1");
        EXPECT_EQ(0, query.bind(id).bind(time).run());
    }
};

TEST_F(ScheduleTest, DueJobsAreClaimedOnceAndMissedRunsAreOne)
{
    const int64_t start = time(nullptr);
    add(create("a", NORV_LUN_TYPE_ADV), "1h");
    add(create("b", NORV_LUN_TYPE_ADV), "2h");
    int64_t backup;
    ASSERT_EQ(0, iscsihost::addSchedule("backup", 1, "1m", backup));
    const int64_t first = list()[0].next_run;
    EXPECT_LE(start + 3600, first);
    EXPECT_GE(time(nullptr) + 3600, first);

    EXPECT_EQ("", claim(first - 1));
    EXPECT_EQ("a", claim(first));
    EXPECT_EQ("", claim(first));
    EXPECT_EQ(first, list()[0].last_run);
    EXPECT_EQ("ab", claim(first + 180010));
    EXPECT_EQ("", claim(first + 180020));
    EXPECT_EQ(first + 183600, list()[0].next_run) << "counted on from the first";
    EXPECT_EQ("", claim(first)) << "the clock was put back";
    EXPECT_EQ(first + 3600, list()[0].next_run);
    EXPECT_EQ("ab", claim(first + 3600));
    setNextRun(list()[0].id, 0);
    EXPECT_EQ("", claim(first + 3600)) << "a row of an older version runs at its time, not at once";
}

TEST_F(ScheduleTest, TwoRunnersNeverTakeTheSameJob)
{
    for (int i = 0; i < 20; ++i)
        add(create("lun" + std::to_string(i), NORV_LUN_TYPE_ADV), "1m");
    closeDatabase();
    const int64_t now = time(nullptr) + 3600;
    EXPECT_EQ(20, inChildren(8, [now](int) {
                  std::vector<iscsihost::Schedule> due;
                  return claimDueSchedules(now, due) == 0 ? static_cast<int>(due.size()) : 100;
              }));
}

TEST_F(ScheduleTest, JobsBelongToLuns)
{
    _tag_iscsi_lun_ lun = create("a", NORV_LUN_TYPE_ADV);
    const int64_t id = add(lun, "*/5 * * * *");
    int64_t none = -1;
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, iscsihost::addSchedule("snapshot", lun.lid, "x * * * *", none));
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, iscsihost::addSchedule("snapshot", lun.lid, "0 0 30 2 *", none));
    EXPECT_NE(nullptr, strstr(iscsi_host_last_error(), "never"));
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, iscsihost::addSchedule("snapshot", lun.lid, "1h", none));
    EXPECT_EQ(NORV_ERR_NO_SUCH_LUN, iscsihost::addSchedule("snapshot", 9, "1h", none));
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, iscsihost::addSchedule("other", lun.lid, "1h", none));
    EXPECT_EQ(-1, none);
    int64_t backup = 0;
    ASSERT_EQ(0, iscsihost::addSchedule("backup", lun.lid, "daily", backup));
    ASSERT_EQ(0, update(lun, "renamed", lun.size));
    EXPECT_EQ(backup, NORViSCSILunTaskGetSchIDByName("renamed"));
    EXPECT_EQ(-1, NORViSCSILunTaskGetSchIDByName("a"));

    lun.options = NORV_LUN_OPTION_TRASH;
    ASSERT_EQ(0, NORViSCSILunUnload(&lun)) << iscsi_host_last_error();
    EXPECT_EQ("", claim(time(nullptr) + 3600)) << "a LUN in the trash is left alone";
    ASSERT_EQ(0, NORViSCSILunLoad(&lun)) << iscsi_host_last_error();
    EXPECT_EQ("renamed", claim(time(nullptr) + 3600));

    ASSERT_EQ(0, NORViSCSILunDelete(&lun)) << iscsi_host_last_error();
    EXPECT_TRUE(list().empty());
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, iscsihost::removeSchedule(id));
    EXPECT_EQ(0, iscsihost::removeSchedule(add(create("b", NORV_LUN_TYPE_ADV), "1h")));
}

/// What is run is the program of that name in PATH, each argument as it is.
TEST_F(ScheduleTest, RunsTheCommandForEachDueJob)
{
    const std::string folder = root + "/bin", log = root + "/log";
    mkdir(folder.c_str(), 0700);
    std::ofstream(folder + "/iscsictl") << "#!/bin/sh\nprintf '<%s>' \"$@\" >> " << log
                                        << "\n[ \"$3\" != \"$REFUSED\" ] || { echo 'out of space' >&2; exit 1; }\n";
    chmod((folder + "/iscsictl").c_str(), 0700);
    const char *const set_path = getenv("PATH");
    const std::string path = set_path ? set_path : "/usr/bin:/bin";
    const _tag_iscsi_lun_ good = create("good", NORV_LUN_TYPE_ADV), bad = create("bad", NORV_LUN_TYPE_ADV);
    for (const int64_t id : {add(bad, "1h"), add(good, "1h")})
        setNextRun(id, 1);
    setenv("PATH", (folder + ":" + path).c_str(), 1);
    setenv("REFUSED", bad.uuid, 1);
    std::vector<iscsihost::ScheduleRun> runs;
    EXPECT_EQ(NORV_ERR_UNKNOWN, iscsihost::runDueSchedules(runs));
    setenv("PATH", path.c_str(), 1);

    ASSERT_EQ(2u, runs.size()) << "the failure of one does not keep the other from running";
    EXPECT_EQ("out of space", runs[0].reason);
    EXPECT_EQ(0, runs[1].code);
    std::vector<iscsihost::Event> events;
    ASSERT_EQ(0, iscsihost::listEvents(0, 9, events));
    ASSERT_EQ(1u, events.size());
    EXPECT_EQ(3, events[0].level);
    EXPECT_EQ("The scheduled snapshot of the LUN bad could not be taken: out of space.", events[0].message);
    std::string said;
    std::getline(std::ifstream(log), said);
    const std::string rest = "><--scheduled><--taken-by><schedule>";
    EXPECT_EQ("<snapshot><take><" + std::string(bad.uuid) + rest + "<snapshot><take><" + good.uuid + rest, said);
    EXPECT_EQ(0, iscsihost::runDueSchedules(runs));
    EXPECT_TRUE(runs.empty());
}

} // namespace
} // namespace norvhost

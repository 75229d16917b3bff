#include "HostTest.h"

#include "host/services/Events.h"
#include "host/state/Database.h"
#include "platform/event_log.h"

namespace norvhost {
namespace {

struct EventTest : HostTest {
    std::vector<iscsihost::Event> newest(int64_t since, int64_t count)
    {
        std::vector<iscsihost::Event> events;
        EXPECT_EQ(0, iscsihost::listEvents(since, count, events)) << iscsi_host_last_error();
        return events;
    }
};

TEST_F(EventTest, EveryEventHasItsSentence)
{
    const struct {
        unsigned number;
        const char *text1, *text2, *text3, *text4;
        const char *message;
    } cases[] = {
        {0x13000027, "new", "Regular File", "/vol", "", "Cloning to the LUN new (Regular File, on /vol) started."},
        {0x13d0000c, "new", "2026/01/02 03:04:05", "lunA", nullptr,
         "The snapshot of 2026/01/02 03:04:05 of the LUN lunA could not be cloned to the LUN new."},
        {0x13D0000D, "lunA", "Out of volume space", nullptr, nullptr,
         "The snapshot of the LUN lunA on the destination of its replication could not be taken: Out of volume "
         "space."},
        {0x12345, "a", nullptr, "c", "", "Event 0x00012345: a, c"},
        {0xffffffff, nullptr, nullptr, nullptr, nullptr, "Event 0xffffffff"},
        {0x13d00002, "%2%s%n", "a\nb\x7f", nullptr, nullptr, "The LUN %2%s%n was restored to its snapshot of a?b?."},
    };
    for (const auto &c : cases) {
        const int64_t begin = time(nullptr);
        ASSERT_EQ(0, NORVLogSet1(9, 3, c.number, c.text1, c.text2, c.text3, c.text4)) << iscsi_host_last_error();
        const auto events = newest(0, 1);
        ASSERT_EQ(1u, events.size());
        EXPECT_EQ(c.message, events[0].message);
        EXPECT_EQ(c.number, events[0].number);
        EXPECT_EQ(9, events[0].scope);
        EXPECT_EQ(3, events[0].level);
        EXPECT_LE(begin, events[0].time);
        EXPECT_GE(time(nullptr), events[0].time);
    }
}

TEST_F(EventTest, TheNewestAreListedAndKept)
{
    Transaction transaction;
    Query fill("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 10050) "
               "INSERT INTO events (time, scope, level, number, text1) SELECT i, 1, 1, 1, i FROM n");
    ASSERT_EQ(0, fill.run());
    ASSERT_EQ(0, transaction.commit());
    ASSERT_EQ(0, NORVLogSet1(1, 1, 2, "newest", nullptr, nullptr, nullptr));

    const auto all = newest(0, 100000);
    ASSERT_EQ(static_cast<size_t>(kept_events), all.size());
    EXPECT_EQ(52, all.front().id);
    EXPECT_EQ(10051, all.back().id);
    EXPECT_EQ("Event 0x00000002: newest", all.back().message);

    const auto few = newest(10000, 3);
    ASSERT_EQ(3u, few.size()) << "the newest of those after the ID";
    EXPECT_EQ(10049, few.front().id);
    EXPECT_EQ(1u, newest(10050, 3).size());
    EXPECT_TRUE(newest(10051, 3).empty());
    EXPECT_TRUE(newest(0, 0).empty());
}

} // namespace
} // namespace norvhost

#include "host/services/Events.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "platform/error.h"
#include "platform/event_log.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <ctime>
#include <syslog.h>

namespace norvhost {
namespace {

using Texts = std::array<std::string, 4>;

enum Level {
    information = 1,
    warning = 2,
    error = 3,
};

/// "%1" to "%4" stand for the event's texts.
const struct {
    unsigned number;
    const char *sentence;
} sentences[] = {
    {0x13000027, "Cloning to the LUN %1 (%2, on %3) started."},
    {0x13000037, "Cloning to the LUN %1 (%2, on %3) is done."},
    {0x13000038, "Cloning to the LUN %1 (%2, on %3) failed."},
    {0x13d00002, "The LUN %1 was restored to its snapshot of %2."},
    {0x13d00005, "The LUN %1 could not be restored to its snapshot of %2."},
    {0x13d0000b, "The snapshot of %2 of the LUN %3 was cloned to the LUN %1."},
    {0x13d0000c, "The snapshot of %2 of the LUN %3 could not be cloned to the LUN %1."},
    {0x13d0000d, "The snapshot of the LUN %1 on the destination of its replication could not be taken: %2."},
    {scheduled_snapshot_failed, "The scheduled snapshot of the LUN %1 could not be taken: %2."},
};

std::string filledIn(const char *sentence, const Texts &texts)
{
    std::string message;
    for (const char *c = sentence; *c; ++c)
        if (*c == '%' && c[1] >= '1' && c[1] <= '4')
            message += texts[static_cast<size_t>(*++c - '1')];
        else
            message += *c;
    return message;
}

std::string numberAndTexts(unsigned number, const Texts &texts)
{
    char head[32];
    snprintf(head, sizeof head, "Event 0x%08x", number);
    std::string message = head;
    const char *separator = ": ";
    for (const std::string &text : texts) {
        if (text.empty())
            continue;
        message += separator + text;
        separator = ", ";
    }
    return message;
}

int priorityOf(int level)
{
    return level == error ? LOG_ERR : level == warning ? LOG_WARNING : LOG_INFO;
}

/// One line, whatever the texts hold.
std::string eventMessage(unsigned number, const Texts &texts)
{
    std::string message;
    for (const auto &known : sentences)
        if (known.number == number)
            message = filledIn(known.sentence, texts);
    if (message.empty())
        message = numberAndTexts(number, texts);
    // Names that somebody gave may hold anything; a log line stays one line.
    std::replace_if(
        message.begin(), message.end(), [](char c) { return static_cast<unsigned char>(c) < ' ' || c == 0x7f; }, '?');
    return message;
}

int store(int scope, int level, unsigned number, const Texts &texts)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    Query insert("INSERT INTO events (time, scope, level, number, text1, text2, text3, text4) "
                 "VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8)");
    insert.bind(time(nullptr)).bind(scope).bind(level).bind(number);
    for (const std::string &text : texts)
        insert.bind(text);
    if (int err = insert.run())
        return err;
    Query remove("DELETE FROM events WHERE id <= ?1");
    if (int err = remove.bind(lastInsertId() - kept_events).run())
        return err;
    return transaction.commit();
}

} // namespace

int listEvents(int64_t since, int64_t count, std::vector<iscsihost::Event> &events)
{
    std::vector<iscsihost::Event> found;
    Query query("SELECT id, time, scope, level, number, text1, text2, text3, text4 FROM events WHERE id > ?1 "
                "ORDER BY id DESC LIMIT ?2");
    query.bind(since).bind(std::max<int64_t>(count, 0));
    while (query.next()) {
        Texts texts;
        for (int i = 0; i < 4; ++i)
            texts[static_cast<size_t>(i)] = query.text(5 + i);
        const auto number = static_cast<unsigned>(query.number(4));
        found.push_back({query.number(0), query.number(1), query.integer(2), query.integer(3), number,
                         eventMessage(number, texts)});
    }
    if (query.error())
        return query.error();
    events.assign(std::make_move_iterator(found.rbegin()), std::make_move_iterator(found.rend()));
    return 0;
}

} // namespace norvhost

int NORVLogSet1(int scope, int level, unsigned int number, const char *text1, const char *text2, const char *text3,
                const char *text4)
{
    using namespace norvhost;
    if (level < information || level > error)
        return fail(NORV_ERR_BAD_PARAMETER, "an event's level is 1, 2 or 3, not %d", level);
    const auto orEmpty = [](const char *text) { return text ? text : ""; };
    const Texts texts = {orEmpty(text1), orEmpty(text2), orEmpty(text3), orEmpty(text4)};
    // The line first: it is what is left when the store cannot be written.
    syslog(priorityOf(level), "%s", eventMessage(number, texts).c_str());
    return store(scope, level, number, texts);
}

#include "host/services/ScheduleRule.h"

#include "host/core/LastError.h"
#include "host/services/LocalTime.h"
#include "platform/error.h"

#include <algorithm>
#include <charconv>
#include <string>
#include <strings.h>
#include <vector>

namespace norvhost {
namespace {

constexpr int64_t minute = 60, hour = 60 * minute, day = 24 * hour;
constexpr int64_t longest_period = 366 * day;
/// 29 February can be eight years away.
constexpr int64_t search_limit = 9 * longest_period;

const struct {
    const char *word, *fields;
} words[] = {
    {"hourly", "0 * * * *"},
    {"daily", "0 0 * * *"},
    {"weekly", "0 0 * * sun"},
    {"monthly", "0 0 1 * *"},
};

struct Field {
    const char *name;
    int first, last;
    std::vector<const char *> names; ///< of the values from `first` on
};

std::vector<std::string> split(std::string_view text, std::string_view separators, bool skip_empty)
{
    std::vector<std::string> parts;
    for (size_t begin = 0; begin <= text.size();) {
        const size_t end = std::min(text.find_first_of(separators, begin), text.size());
        if (end > begin || !skip_empty)
            parts.emplace_back(text.substr(begin, end - begin));
        begin = end + 1;
    }
    return parts;
}

bool parseNumber(std::string_view text, int64_t &number)
{
    const auto [rest, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && rest == text.data() + text.size() && number >= 0;
}

int parseValue(const Field &field, const std::string &text, int &value)
{
    for (size_t i = 0; i < field.names.size(); ++i)
        if (strcasecmp(text.c_str(), field.names[i]) == 0) {
            value = field.first + static_cast<int>(i);
            return 0;
        }
    int64_t number;
    if (!parseNumber(text, number))
        return fail(NORV_ERR_BAD_PARAMETER, "%s: '%s' is no number%s", field.name, text.c_str(),
                    field.names.empty() ? "" : " and no name");
    if (number < field.first || number > field.last)
        return fail(NORV_ERR_BAD_PARAMETER, "%s: %s is not within %d to %d", field.name, text.c_str(), field.first,
                    field.last);
    value = static_cast<int>(number);
    return 0;
}

int parseRange(const Field &field, const std::string &text, int &from, int &to)
{
    from = field.first;
    to = field.last;
    if (text == "*")
        return 0;
    const size_t dash = text.find('-');
    if (int err = parseValue(field, text.substr(0, dash), from))
        return err;
    to = from;
    if (dash == std::string::npos)
        return 0;
    if (int err = parseValue(field, text.substr(dash + 1), to))
        return err;
    if (to < from)
        return fail(NORV_ERR_BAD_PARAMETER, "%s: the range %s runs backwards", field.name, text.c_str());
    return 0;
}

/// One element of a list: a value, or a range with or without a step.
template <size_t size>
int parseElement(const Field &field, const std::string &text, std::bitset<size> &set)
{
    const size_t slash = text.find('/');
    const std::string range = text.substr(0, slash);
    int from, to;
    if (int err = parseRange(field, range, from, to))
        return err;
    int64_t step = 1;
    if (slash != std::string::npos) {
        if (range != "*" && range.find('-') == std::string::npos)
            return fail(NORV_ERR_BAD_PARAMETER, "%s: the step in '%s' needs a range or * before it", field.name,
                        text.c_str());
        if (!parseNumber(text.substr(slash + 1), step) || step < 1 || step > field.last)
            return fail(NORV_ERR_BAD_PARAMETER, "%s: the step in '%s' is not within 1 to %d", field.name, text.c_str(),
                        field.last);
    }
    for (int64_t value = from; value <= to; value += step)
        set.set(static_cast<size_t>(value));
    return 0;
}

template <size_t size>
int parseField(const Field &field, const std::string &text, std::bitset<size> &set)
{
    for (const std::string &element : split(text, ",", false))
        if (int err = parseElement(field, element, set))
            return err;
    return 0;
}

int parseFields(const std::vector<std::string> &texts, ScheduleRule &rule)
{
    static const Field minute_field{"minute", 0, 59, {}};
    static const Field hour_field{"hour", 0, 23, {}};
    static const Field day_field{"day of the month", 1, 31, {}};
    static const Field month_field{
        "month", 1, 12, {"jan", "feb", "mar", "apr", "may", "jun", "jul", "aug", "sep", "oct", "nov", "dec"}};
    static const Field weekday_field{"day of the week", 0, 7, {"sun", "mon", "tue", "wed", "thu", "fri", "sat"}};

    if (texts.size() != 5)
        return fail(NORV_ERR_BAD_PARAMETER,
                    "the rule has %zu fields, not the five minute, hour, day of the month, month, day of the week",
                    texts.size());
    std::bitset<8> weekdays;
    if (int err = parseField(minute_field, texts[0], rule.minutes))
        return err;
    if (int err = parseField(hour_field, texts[1], rule.hours))
        return err;
    if (int err = parseField(day_field, texts[2], rule.days))
        return err;
    if (int err = parseField(month_field, texts[3], rule.months))
        return err;
    if (int err = parseField(weekday_field, texts[4], weekdays))
        return err;
    for (size_t i = 0; i < weekdays.size(); ++i)
        if (weekdays.test(i))
            rule.weekdays.set(i % 7);
    return 0;
}

int parsePeriod(const std::string &text, ScheduleRule &rule)
{
    int64_t count, unit;
    switch (text.back()) {
    case 'm':
        unit = minute;
        break;
    case 'h':
        unit = hour;
        break;
    case 'd':
        unit = day;
        break;
    case 'w':
        unit = 7 * day;
        break;
    default:
        unit = 0;
    }
    if (unit == 0 || !parseNumber(text.substr(0, text.size() - 1), count))
        return fail(NORV_ERR_BAD_PARAMETER,
                    "the rule '%s' is neither an interval such as 15m, 1h, 2d or 1w, nor five fields, nor hourly, "
                    "daily, weekly or monthly",
                    text.c_str());
    if (count < 1 || count > longest_period / unit)
        return fail(NORV_ERR_BAD_PARAMETER, "the interval %s is not within 1m to 366d", text.c_str());
    rule.period = count * unit;
    return 0;
}

bool restrictsHours(const ScheduleRule &rule)
{
    return !rule.hours.all();
}

bool namesDay(const ScheduleRule &rule, const tm &local)
{
    if (!rule.months.test(static_cast<size_t>(local.tm_mon) + 1))
        return false;
    const bool month_day = rule.days.test(static_cast<size_t>(local.tm_mday));
    const bool weekday = rule.weekdays.test(static_cast<size_t>(local.tm_wday));
    const bool both_restricted = rule.days.count() < 31 && !rule.weekdays.all();
    return both_restricted ? month_day || weekday : month_day && weekday;
}

bool names(const ScheduleRule &rule, const tm &local)
{
    return namesDay(rule, local) && rule.hours.test(static_cast<size_t>(local.tm_hour)) &&
           rule.minutes.test(static_cast<size_t>(local.tm_min));
}

/// Whether the clock, which was put forward at this time, skipped a minute that the rule names.
bool skippedBefore(const ScheduleRule &rule, int64_t time)
{
    const int64_t offset = localTime(time).tm_gmtoff;
    const int64_t skipped = offset - localTime(time - minute).tm_gmtoff;
    for (int64_t back = minute; back <= skipped; back += minute) {
        const time_t shown = time + offset - back;
        tm local = {};
        gmtime_r(&shown, &local);
        if (names(rule, local))
            return true;
    }
    return false;
}

/// Whether the clock, which was put back, has shown this time before.
bool shownBefore(int64_t time)
{
    const int64_t offset = localTime(time).tm_gmtoff;
    const int64_t earlier_offset = localTime(time - 3 * hour).tm_gmtoff;
    return earlier_offset > offset && localTime(time - (earlier_offset - offset)).tm_gmtoff == earlier_offset;
}

int64_t nextMidnight(int64_t time, tm local)
{
    local.tm_mday += 1;
    local.tm_hour = local.tm_min = local.tm_sec = 0;
    local.tm_isdst = -1;
    const int64_t midnight = mktime(&local);
    // Where the clock skips midnight the answer can lie before it.
    return midnight > time ? midnight : time + hour;
}

std::optional<int64_t> nextNamed(const ScheduleRule &rule, int64_t now)
{
    for (int64_t time = (now / minute + 1) * minute; time - now < search_limit;) {
        const tm local = localTime(time);
        if (restrictsHours(rule) && skippedBefore(rule, time))
            return time;
        if (!namesDay(rule, local))
            time = nextMidnight(time, local);
        else if (!rule.hours.test(static_cast<size_t>(local.tm_hour)))
            time += hour - local.tm_min * minute;
        else if (!rule.minutes.test(static_cast<size_t>(local.tm_min)) || (restrictsHours(rule) && shownBefore(time)))
            time += minute;
        else
            return time;
    }
    return std::nullopt;
}

} // namespace

int parseScheduleRule(std::string_view text, ScheduleRule &rule)
{
    std::vector<std::string> texts = split(text, " \t", true);
    if (texts.empty())
        return fail(NORV_ERR_BAD_PARAMETER, "the rule is empty");
    if (texts.size() == 1)
        for (const auto &known : words)
            if (strcasecmp(texts[0].c_str(), known.word) == 0)
                texts = split(known.fields, " ", true);
    ScheduleRule read;
    if (int err = texts.size() == 1 ? parsePeriod(texts[0], read) : parseFields(texts, read))
        return err;
    rule = read;
    return 0;
}

std::optional<int64_t> nextRun(const ScheduleRule &rule, int64_t anchor, int64_t now)
{
    if (rule.period == 0)
        return nextNamed(rule, now);
    const int64_t since = now - anchor;
    const int64_t periods = since / rule.period - (since % rule.period < 0 ? 1 : 0) + 1;
    return anchor + periods * rule.period;
}

} // namespace norvhost

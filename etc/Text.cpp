#include "etc/Text.h"

#include <ctime>

namespace ISCSI {
namespace {

/// False for a time that no calendar holds.
bool localTime(long seconds, tm &local)
{
    const time_t time = seconds;
    return localtime_r(&time, &local) != nullptr;
}

} // namespace

EventTime::EventTime(long seconds)
{
    tm local;
    if (!localTime(seconds, local) || strftime(text, sizeof(text), "%Y/%m/%d %T", &local) == 0)
        text[0] = '\0';
}

std::string FormatSize(uint64_t bytes)
{
    static const char *const units[] = {"bytes", "KB", "MB", "GB", "TB", "PB", "EB"};

    if (bytes == 0)
        return "0bytes";
    std::string text;
    for (unsigned unit = 7; unit-- > 0;) {
        const uint64_t group = (bytes >> (10 * unit)) & (unit == 6 ? 15 : 1023);
        if (group == 0)
            continue;
        if (!text.empty())
            text += ',';
        text += std::to_string(group);
        text += units[unit];
    }
    return text;
}

TextLine &TextLine::add(const char *label, const std::string &value)
{
    line += label;
    line += value;
    return *this;
}

TextLine &TextLine::add(const char *label, const char *value)
{
    line += label;
    line += value;
    return *this;
}

TextLine &TextLine::add(const char *label, int value)
{
    return add(label, std::to_string(value));
}

TextLine &TextLine::add(const char *label, unsigned int value)
{
    return add(label, std::to_string(value));
}

TextLine &TextLine::add(const char *label, bool value)
{
    return add(label, boolText(value));
}

TextLine &TextLine::addSize(const char *label, uint64_t bytes)
{
    add(label, std::to_string(bytes));
    line += " (";
    line += FormatSize(bytes);
    line += ')';
    return *this;
}

TextLine &TextLine::addTime(const char *label, long seconds)
{
    tm local;
    char text[32];
    if (!localTime(seconds, local) || strftime(text, sizeof(text), "%a %b %d %H:%M:%S %Z %Y", &local) == 0)
        text[0] = '\0';
    return add(label, static_cast<const char *>(text));
}

} // namespace ISCSI

/// Texts of values, as they stand in log lines.
#pragma once

#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

namespace ISCSI {

/// A byte count as a chain of binary units, largest first: 1536 is "1KB,512bytes".
std::string FormatSize(uint64_t bytes);

inline const char *boolText(bool value)
{
    return value ? "true" : "false";
}

/// The text of an SDK record's character field, also when its NUL is missing.
template <size_t size>
std::string fieldText(const char (&field)[size])
{
    return std::string(field, strnlen(field, size));
}

/// A text formatted into a buffer of the size that the platform works with; what does not fit is cut.
template <size_t size>
class BoundedText {
public:
    explicit BoundedText(const char *format, ...) __attribute__((format(printf, 2, 3)))
    {
        va_list arguments;
        va_start(arguments, format);
        if (vsnprintf(text, size, format, arguments) < 0)
            text[0] = '\0';
        va_end(arguments);
    }

    const char *c_str() const { return text; }

private:
    char text[size];
};

/// A point in time as texts for users show it, in local time: "2026/01/31 23:59:59".
class EventTime {
public:
    explicit EventTime(long seconds);
    const char *c_str() const { return text; }

private:
    char text[20];
};

/// A record's text form, built field by field; labels are given whole: " ,name: ".
class TextLine {
public:
    TextLine &add(const char *label, const std::string &value);
    TextLine &add(const char *label, const char *value);
    TextLine &add(const char *label, int value);
    TextLine &add(const char *label, unsigned int value);
    TextLine &add(const char *label, bool value);
    /// A byte count with its size text in parentheses.
    TextLine &addSize(const char *label, uint64_t bytes);
    /// Seconds since the epoch, in local time.
    TextLine &addTime(const char *label, long seconds);

    std::string text() { return std::move(line); }

private:
    std::string line;
};

} // namespace ISCSI

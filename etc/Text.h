/// Texts of values, as they stand in log lines.
#pragma once

#include <cstdint>
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

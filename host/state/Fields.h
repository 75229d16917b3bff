/// Texts of rows in the platform's records.
#pragma once

#include <algorithm>
#include <cstring>
#include <string>
#include <string_view>

namespace norvhost {

/// Copies what fits of the text into a field of fixed width, and ends it with NUL.
template <size_t size>
void copyText(char (&field)[size], std::string_view text)
{
    const size_t length = std::min(text.size(), size - 1);
    memcpy(field, text.data(), length);
    field[length] = '\0';
}

/// What a field of fixed width holds, which may be full to its last byte.
template <size_t size>
std::string_view fieldText(const char (&field)[size])
{
    return {field, strnlen(field, size)};
}

/// With ASCII letters in lower case, as the state has UUIDs.
inline std::string lowerCase(std::string_view text)
{
    std::string result(text);
    for (char &c : result)
        if (c >= 'A' && c <= 'Z')
            c = static_cast<char>(c + 'a' - 'A');
    return result;
}

/// 8-4-4-4-12 hexadecimal digits, of either case.
inline bool isUuid(std::string_view text)
{
    if (text.size() != 36)
        return false;
    for (size_t i = 0; i < text.size(); ++i) {
        const bool hyphen = i == 8 || i == 13 || i == 18 || i == 23;
        const bool digit = text[i] != '\0' && strchr("0123456789abcdefABCDEF", text[i]);
        if (hyphen ? text[i] != '-' : !digit)
            return false;
    }
    return true;
}

} // namespace norvhost

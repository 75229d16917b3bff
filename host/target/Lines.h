/// Reading a text line by line.
#pragma once

#include <charconv>
#include <string_view>

namespace norvhost {

class Lines {
public:
    explicit Lines(std::string_view text) : rest(text) {}

    bool atEnd() const { return rest.empty(); }
    std::string_view line() const { return rest.substr(0, rest.find('\n')); }
    bool starts(std::string_view prefix) const { return line().substr(0, prefix.size()) == prefix; }
    void next()
    {
        const size_t end = rest.find('\n');
        rest.remove_prefix(end == rest.npos ? rest.size() : end + 1);
    }

private:
    std::string_view rest;
};

/// A decimal number that fills the whole text.
template <class Number>
bool parseNumber(std::string_view text, Number &number)
{
    const char *const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, number);
    return !text.empty() && result.ec == std::errc() && result.ptr == end;
}

} // namespace norvhost

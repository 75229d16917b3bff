#include "cli/Display.h"

#include <algorithm>
#include <cstdio>
#include <cwchar>
#include <locale.h>

namespace cli {
namespace {

/// UTF-8 for the time of a conversion, whatever the caller's locale is.
class Utf8Locale {
public:
    Utf8Locale() : utf8(newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr)), previous(utf8 ? uselocale(utf8) : nullptr) {}
    Utf8Locale(const Utf8Locale &) = delete;
    ~Utf8Locale()
    {
        if (utf8) {
            uselocale(previous);
            freelocale(utf8);
        }
    }

private:
    locale_t utf8;
    locale_t previous;
};

bool isPlain(const std::string &text)
{
    return std::all_of(text.begin(), text.end(), [](char c) { return c >= ' ' && c <= '~' && c != '\\'; });
}

/// Characters without a width of their own that steer how text is laid out; combining marks are not
/// among them.
bool isInvisible(wchar_t c)
{
    return c == 0xAD || (c >= 0x200B && c <= 0x200F) || (c >= 0x2028 && c <= 0x202E) || (c >= 0x2060 && c <= 0x206F) ||
           c == 0xFEFF || (c >= 0xFFF9 && c <= 0xFFFB) || c >= 0xE0000;
}

/// A backslash, the kind of escape, and the value in so many hexadecimal digits.
std::string escaped(char kind, int digits, unsigned value)
{
    char text[16];
    snprintf(text, sizeof(text), "\\%c%0*x", kind, digits, value);
    return text;
}

std::string escapedCharacter(wchar_t c)
{
    switch (c) {
    case L'\n':
        return "\\n";
    case L'\t':
        return "\\t";
    case L'\\':
        return "\\\\";
    default:
        break;
    }
    const auto value = static_cast<unsigned>(c);
    return value < 0x80 ? escaped('x', 2, value) : value <= 0xFFFF ? escaped('u', 4, value) : escaped('U', 8, value);
}

std::string padded(const std::string &cell, size_t width, Align align)
{
    const std::string space(width - shownWidth(cell), ' ');
    return align == Align::Right ? space + cell : cell + space;
}

void endLine(std::string &text)
{
    text.erase(text.find_last_not_of(' ') + 1);
    text += '\n';
}

} // namespace

std::string shown(const std::string &text)
{
    if (isPlain(text))
        return text;
    const Utf8Locale utf8;
    std::string out;
    mbstate_t state{};
    for (size_t i = 0; i < text.size();) {
        wchar_t c = 0;
        const size_t length = text[i] == '\0' ? 1 : mbrtowc(&c, text.data() + i, text.size() - i, &state);
        if (length == static_cast<size_t>(-1) || length == static_cast<size_t>(-2)) {
            state = {};
            out += escaped('x', 2, static_cast<unsigned char>(text[i++]));
            continue;
        }
        if (c == L'\\' || wcwidth(c) < 0 || c == 0 || isInvisible(c))
            out += escapedCharacter(c);
        else
            out.append(text, i, length);
        i += length;
    }
    return out;
}

size_t shownWidth(const std::string &shown)
{
    if (isPlain(shown))
        return shown.size();
    const Utf8Locale utf8;
    size_t width = 0;
    mbstate_t state{};
    for (size_t i = 0; i < shown.size();) {
        wchar_t c = 0;
        const size_t length = mbrtowc(&c, shown.data() + i, shown.size() - i, &state);
        const bool whole = length != static_cast<size_t>(-1) && length != static_cast<size_t>(-2) && length != 0;
        width += whole ? static_cast<size_t>(std::max(wcwidth(c), 0)) : 1;
        i += whole ? length : 1;
    }
    return width;
}

void Table::add(std::vector<std::string> cells)
{
    for (std::string &cell : cells)
        cell = shown(cell);
    rows.push_back(std::move(cells));
}

std::string Table::text() const
{
    std::vector<size_t> widths;
    for (size_t i = 0; i < columns.size(); ++i) {
        widths.push_back(columns[i].first.size());
        for (const auto &row : rows)
            widths[i] = std::max(widths[i], shownWidth(row[i]));
    }
    std::string out;
    const auto addLine = [&](auto cell) {
        for (size_t i = 0; i < columns.size(); ++i)
            out += (i == 0 ? "" : "  ") + padded(cell(i), widths[i], columns[i].second);
        endLine(out);
    };
    addLine([&](size_t i) { return columns[i].first; });
    for (const auto &row : rows)
        addLine([&](size_t i) { return row[i]; });
    return out;
}

std::string keyValues(const std::vector<std::pair<std::string, std::string>> &pairs)
{
    size_t width = 0;
    for (const auto &[key, value] : pairs)
        width = std::max(width, shownWidth(key));
    std::string out;
    for (const auto &[key, value] : pairs) {
        out += padded(key + ":", width + 1, Align::Left) + "  " + shown(value);
        endLine(out);
    }
    return out;
}

} // namespace cli

#include "cli/Size.h"

#include <cstdio>
#include <cstring>

namespace cli {
namespace {

constexpr char UNITS[] = "BKMGTPE";
constexpr uint64_t BLOCK = 512;

bool isDigit(char c)
{
    return c >= '0' && c <= '9';
}

/// The exponent of 1024 that a unit stands for; -1 for what is no unit.
int unitPower(const std::string &unit)
{
    if (unit.empty())
        return 0;
    const char upper = unit[0] >= 'a' && unit[0] <= 'z' ? static_cast<char>(unit[0] - 'a' + 'A') : unit[0];
    const char *found = strchr(UNITS, upper);
    if (!found || upper == '\0')
        return -1;
    const std::string rest = unit.substr(1);
    const bool known = rest.empty() || (found != UNITS && (rest == "B" || rest == "b" || rest == "iB" || rest == "ib"));
    return known ? static_cast<int>(found - UNITS) : -1;
}

} // namespace

std::optional<uint64_t> parseSize(const std::string &text)
{
    size_t i = 0;
    uint64_t whole = 0;
    for (; i < text.size() && isDigit(text[i]); ++i) {
        if (__builtin_mul_overflow(whole, 10u, &whole) ||
            __builtin_add_overflow(whole, static_cast<uint64_t>(text[i] - '0'), &whole))
            return std::nullopt;
    }
    if (i == 0)
        return std::nullopt;

    long double fraction = 0;
    bool has_fraction = false;
    if (i < text.size() && text[i] == '.') {
        long double place = 1;
        for (++i; i < text.size() && isDigit(text[i]); ++i) {
            place *= 10;
            fraction = fraction * 10 + static_cast<long double>(text[i] - '0');
            has_fraction = true;
        }
        if (!has_fraction || place > 1e18L)
            return std::nullopt;
        fraction /= place;
    }

    const int power = unitPower(text.substr(i));
    if (power < 0 || (has_fraction && power == 0))
        return std::nullopt;
    const uint64_t unit = uint64_t{1} << (10 * power);
    uint64_t bytes = 0;
    const auto part = static_cast<uint64_t>(fraction * static_cast<long double>(unit)) / BLOCK * BLOCK;
    if (__builtin_mul_overflow(whole, unit, &bytes) || __builtin_add_overflow(bytes, part, &bytes))
        return std::nullopt;
    return bytes;
}

std::string shownSize(uint64_t bytes)
{
    int power = 0;
    while (power < 6 && bytes >> (10 * (power + 1)) != 0)
        ++power;
    if (power == 0)
        return std::to_string(bytes);
    const uint64_t unit = uint64_t{1} << (10 * power);
    // The remainder is below the unit: its hundredths are counted without overflow, unit by unit.
    const uint64_t hundredths = power == 6 ? (bytes % unit) / (unit / 100) : (bytes % unit) * 100 / unit;
    char text[32];
    snprintf(text, sizeof(text), "%llu.%02llu", static_cast<unsigned long long>(bytes / unit),
             static_cast<unsigned long long>(hundredths > 99 ? 99 : hundredths));
    std::string shown(text);
    while (shown.back() == '0')
        shown.pop_back();
    if (shown.back() == '.')
        shown.pop_back();
    return shown + UNITS[power];
}

} // namespace cli

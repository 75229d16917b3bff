#include "etc/Selector.h"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

// The formats below come from SelectorKind tables, which are ours.
#pragma GCC diagnostic ignored "-Wformat-nonliteral"

namespace ISCSI {

bool isUUID(const std::string &text)
{
    unsigned int digit[32];
    char behind = 0;
    return sscanf(text.c_str(),
                  "%1x%1x%1x%1x%1x%1x%1x%1x-%1x%1x%1x%1x-%1x%1x%1x%1x-%1x%1x%1x%1x-"
                  "%1x%1x%1x%1x%1x%1x%1x%1x%1x%1x%1x%1x%c",
                  &digit[0], &digit[1], &digit[2], &digit[3], &digit[4], &digit[5], &digit[6], &digit[7], &digit[8],
                  &digit[9], &digit[10], &digit[11], &digit[12], &digit[13], &digit[14], &digit[15], &digit[16],
                  &digit[17], &digit[18], &digit[19], &digit[20], &digit[21], &digit[22], &digit[23], &digit[24],
                  &digit[25], &digit[26], &digit[27], &digit[28], &digit[29], &digit[30], &digit[31], &behind) == 32;
}

bool isIndex(const SelectorKind &kind, const std::string &selector, unsigned int &index)
{
    std::string lower = selector;
    std::transform(lower.begin(), lower.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
    unsigned int number = 0;
    char behind = 0;
    if (sscanf(lower.c_str(), kind.index_pattern, &number, &behind) != 1)
        return false;
    // sscanf lets a number that does not fit, or is negative, wrap around to one that does.
    errno = 0;
    const long long whole = strtoll(strchr(lower.c_str(), '#') + 1, nullptr, 10);
    const bool fits = errno == 0 && whole >= 0 && whole <= UINT_MAX;
    index = fits ? static_cast<unsigned int>(whole) : UINT_MAX;
    return true;
}

int failOutOfRange(const SelectorKind &kind, unsigned int index, size_t count, Site site)
{
    return failShort(site, kind.bad_code, kind.out_of_range, static_cast<int>(index), count);
}

int failInvalid(const SelectorKind &kind, const std::string &selector, Site site)
{
    return failShort(site, kind.bad_code, kind.invalid, selector.c_str());
}

} // namespace ISCSI

#include "host/target/Name.h"

#include <algorithm>

namespace norvhost {
namespace {

bool isDigit(char c)
{
    return c >= '0' && c <= '9';
}

bool isLetter(char c)
{
    return c >= 'a' && c <= 'z';
}

bool isHex(char c)
{
    return isDigit(c) || (c >= 'a' && c <= 'f');
}

bool isNameCharacter(char c)
{
    return isDigit(c) || isLetter(c) || c == '-' || c == '.' || c == ':' || c == '_';
}

/// "yyyy-mm.<reversed domain name>[:<anything>]"
bool isQualified(std::string_view text)
{
    if (text.size() < 9 || !std::all_of(text.begin(), text.begin() + 4, isDigit) || text[4] != '-' ||
        !isDigit(text[5]) || !isDigit(text[6]) || text[7] != '.')
        return false;
    const int month = (text[5] - '0') * 10 + (text[6] - '0');
    if (month < 1 || month > 12)
        return false;
    const std::string_view domain = text.substr(8, text.find(':') == text.npos ? text.npos : text.find(':') - 8);
    return !domain.empty() && domain.front() != '.' && domain.back() != '.' && domain.find("..") == domain.npos &&
           std::all_of(text.begin(), text.end(), isNameCharacter);
}

} // namespace

bool normaliseName(std::string_view name, std::string &normal)
{
    if (name.size() < 5 || name.size() > iscsi_name_max)
        return false;
    std::string lower(name);
    for (char &c : lower)
        if (c >= 'A' && c <= 'Z')
            c = static_cast<char>(c - 'A' + 'a');

    const std::string_view kind = std::string_view(lower).substr(0, 4);
    const std::string_view rest = std::string_view(lower).substr(4);
    const bool hex = std::all_of(rest.begin(), rest.end(), isHex);
    const bool valid = (kind == "iqn." && isQualified(rest)) || (kind == "eui." && hex && rest.size() == 16) ||
                       (kind == "naa." && hex && (rest.size() == 16 || rest.size() == 32));
    if (valid)
        normal = std::move(lower);
    return valid;
}

bool normaliseTargetName(std::string_view name, std::string &normal)
{
    return name.find('_') == name.npos && normaliseName(name, normal);
}

} // namespace norvhost

#include "host/target/Masking.h"

#include "host/target/Name.h"

#include <algorithm>

namespace norvhost {

int Masking::of(std::string_view initiator) const
{
    std::string name;
    if (!normaliseName(initiator, name))
        return NORV_AUTHORITY_NONE;
    const auto entry = named.find(name);
    return entry == named.end() ? others : entry->second;
}

bool Masking::gives(int permission) const
{
    return others == permission ||
           std::any_of(named.begin(), named.end(), [=](const auto &entry) { return entry.second == permission; });
}

bool Masking::isOpen(int permission) const
{
    return others == permission &&
           std::all_of(named.begin(), named.end(), [=](const auto &entry) { return entry.second == permission; });
}

} // namespace norvhost

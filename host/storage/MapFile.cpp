#include "host/storage/MapFile.h"

#include <charconv>

namespace norvhost {
namespace {

constexpr std::string_view prefix = "iSCSI_";

/// Kinds with all of these bits number their files in five digits, the others in three.
constexpr int five_digit_bits = 71;

} // namespace

std::string mapFileName(const _tag_iscsi_lun_ &lun)
{
    std::string name(prefix);
    name += std::to_string(lun.lid);
    name += isExtentPool(lun.type) ? "_Extent_" : "_";
    name += lun.name;
    name += (lun.type & five_digit_bits) == five_digit_bits ? "_00000" : "_000";
    return name;
}

std::string mapFileFolder(const _tag_iscsi_lun_ &lun)
{
    return std::string(lun.location) + "/" + (isInTrash(lun) ? trash_folder : data_folder);
}

std::string dataPath(const _tag_iscsi_lun_ &lun)
{
    return isBlock(lun.type) ? std::string(lun.location) : mapFileFolder(lun) + "/" + mapFileName(lun);
}

bool parseMapFileName(std::string_view file_name, int &lid)
{
    if (file_name.substr(0, prefix.size()) != prefix || file_name.substr(file_name.find_last_of('_') + 1).size() < 3)
        return false;
    if (file_name.find_last_not_of('0') != file_name.find_last_of('_'))
        return false;
    const char *begin = file_name.data() + prefix.size();
    const char *end = file_name.data() + file_name.size();
    const auto [rest, error] = std::from_chars(begin, end, lid);
    return error == std::errc() && rest != end && *rest == '_' && lid >= 1 && lid <= NORV_LUN_ID_MAX;
}

} // namespace norvhost

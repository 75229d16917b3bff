#include "host/storage/MapFile.h"

#include "host/state/Fields.h"

#include <charconv>

namespace norvhost {
namespace {

constexpr std::string_view prefix = "iSCSI_";
constexpr std::string_view snapshot_prefix = "SNAPSHOT_L";

/// Kinds with all of these bits number their files in five digits, the others in three.
constexpr int five_digit_bits = 71;

/// Takes a number within 1 to `most` and the "_" behind it off the front.
bool takeNumber(std::string_view &text, int most, int &number)
{
    const char *end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number);
    if (error != std::errc() || rest == end || *rest != '_' || number < 1 || number > most)
        return false;
    text.remove_prefix(static_cast<size_t>(rest + 1 - text.data()));
    return true;
}

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

std::string importPath(const _tag_iscsi_lun_ &lun)
{
    _tag_iscsi_lun_ import = lun;
    copyText(import.name, "#import"); // '#' is not allowed in names
    return dataPath(import);
}

bool parseMapFileName(std::string_view file_name, int &lid)
{
    if (file_name.substr(0, prefix.size()) != prefix || file_name.substr(file_name.find_last_of('_') + 1).size() < 3)
        return false;
    if (file_name.find_last_not_of('0') != file_name.find_last_of('_'))
        return false;
    file_name.remove_prefix(prefix.size());
    return takeNumber(file_name, NORV_LUN_ID_MAX, lid);
}

std::string snapshotFolderName(const _tag_iscsi_snapshot_ &snapshot)
{
    return std::string(snapshot_prefix) + std::to_string(snapshot.lid) + "_S" + std::to_string(snapshot.snap_id) + "_" +
           snapshot.name;
}

std::string snapshotFolder(const _tag_iscsi_snapshot_ &snapshot)
{
    return std::string(snapshot.root_path) + "/" + (isInTrash(snapshot) ? trash_folder : snapshot_folder) + "/" +
           snapshotFolderName(snapshot);
}

std::string snapshotDataPath(const _tag_iscsi_snapshot_ &snapshot)
{
    return snapshotDataPath(snapshotFolder(snapshot));
}

std::string snapshotDataPath(const std::string &folder)
{
    return folder + "/data";
}

bool parseSnapshotFolderName(std::string_view folder_name, int &lid)
{
    int snap_id;
    if (folder_name.substr(0, snapshot_prefix.size()) != snapshot_prefix)
        return false;
    folder_name.remove_prefix(snapshot_prefix.size());
    if (!takeNumber(folder_name, NORV_LUN_ID_MAX, lid) || folder_name.substr(0, 1) != "S")
        return false;
    folder_name.remove_prefix(1);
    return takeNumber(folder_name, NORV_SNAPSHOT_ID_MAX, snap_id) && !folder_name.empty();
}

} // namespace norvhost

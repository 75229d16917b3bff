#include "host/storage/LunChecks.h"

#include "host/core/LastError.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/MapFile.h"
#include "host/storage/Volumes.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string>
#include <sys/statvfs.h>

namespace norvhost {
namespace {

constexpr uint64_t block_size = 512;
constexpr uint64_t smallest_lun = 1 << 20;

bool isAsciiAllowed(unsigned char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           (c != '\0' && strchr(" ._-:@+=()", c));
}

/// Whether a non-ASCII code point shows as itself: no control, space, direction mark, private or unassigned range.
bool isVisible(uint32_t c)
{
    static const struct {
        uint32_t first, last;
    } hidden[] = {
        {0x80, 0xa0},     {0xad, 0xad},     {0x61c, 0x61c},   {0x1680, 0x1680}, {0x180e, 0x180e},
        {0x2000, 0x200f}, {0x2028, 0x202f}, {0x205f, 0x206f}, {0x3000, 0x3000}, {0xd800, 0xf8ff},
        {0xfdd0, 0xfdef}, {0xfe00, 0xfe0f}, {0xfeff, 0xfeff}, {0xfff0, 0xffff}, {0xe0000, 0x10ffff},
    };
    return std::none_of(std::begin(hidden), std::end(hidden),
                        [c](const auto &range) { return c >= range.first && c <= range.last; });
}

/// Takes one UTF-8 sequence of two to four bytes off the front; false for an invalid one.
bool takeCodePoint(std::string_view &text, uint32_t &code_point)
{
    const auto lead = static_cast<unsigned char>(text[0]);
    const size_t length = lead >= 0xf0 ? 4 : lead >= 0xe0 ? 3 : 2;
    if (lead < 0xc2 || lead > 0xf4 || text.size() < length)
        return false;
    code_point = lead & (0xffu >> (length + 1));
    for (size_t i = 1; i < length; ++i) {
        const auto c = static_cast<unsigned char>(text[i]);
        if ((c & 0xc0) != 0x80)
            return false;
        code_point = code_point << 6 | (c & 0x3f);
    }
    text.remove_prefix(length);
    const bool overlong = (length == 3 && code_point < 0x800) || (length == 4 && code_point < 0x10000);
    return !overlong && code_point <= 0x10ffff;
}

bool isKnownType(int type)
{
    switch (type) {
    case NORV_LUN_TYPE_BLOCK:
    case NORV_LUN_TYPE_FILE:
    case NORV_LUN_TYPE_THIN:
    case NORV_LUN_TYPE_ADV:
    case NORV_LUN_TYPE_SINK:
    case NORV_LUN_TYPE_47:
    case NORV_LUN_TYPE_71:
    case NORV_LUN_TYPE_79:
        return true;
    default:
        return false;
    }
}

int checkDevice(_tag_iscsi_lun_ &lun)
{
    const std::string path = lun.location;
    if (path.empty() || path[0] != '/' || (path + "/").find("/../") != std::string::npos)
        return fail(NORV_ERR_LUN_LOCATION, "a BLOCK LUN's location is the absolute path of a block device");
    return freeDeviceSize(path, lun.size);
}

int checkVolume(_tag_iscsi_lun_ &lun)
{
    VolumeRow volume;
    if (int err = loadVolume(lun.location, volume))
        return err;
    if (int err = checkMounted(volume))
        return err;
    struct statvfs status;
    if (statvfs(lun.location, &status) != 0)
        return failErrno(NORV_ERR_VOLUME_INFO, errno, "cannot look at the volume %s", lun.location);
    if (status.f_flag & ST_RDONLY)
        return fail(NORV_ERR_NO_PERMISSION, "the volume %s is mounted read-only", lun.location);
    if (isExtentPool(lun.type) && lun.extent_size == 0)
        lun.extent_size = static_cast<uint32_t>(status.f_bsize);
    return 0;
}

/// An ASCII character as an error shows it.
std::string characterName(char character)
{
    if (character > ' ' && character < 0x7f)
        return {'\'', character, '\''};
    return "the character with code " + std::to_string(character);
}

int checkName(int code, std::string_view name)
{
    if (name.empty())
        return fail(code, "the name is empty");
    if (name.size() > 255)
        return fail(code, "the name has %zu bytes, 255 are allowed", name.size());
    if (name == "." || name == "..")
        return fail(code, "the name is a folder's");
    if (name.front() == ' ' || name.back() == ' ')
        return fail(code, "the name begins or ends with a space");
    if (isUuid(name))
        return fail(code, "the name looks like a UUID");
    for (std::string_view rest = name; !rest.empty();) {
        if (static_cast<unsigned char>(rest[0]) < 0x80) {
            if (!isAsciiAllowed(static_cast<unsigned char>(rest[0])))
                return fail(code,
                            "the name holds %s, which is not allowed: letters, digits, spaces inside and "
                            ". _ - : @ + = ( ) are",
                            characterName(rest[0]).c_str());
            rest.remove_prefix(1);
            continue;
        }
        uint32_t code_point;
        if (!takeCodePoint(rest, code_point))
            return fail(code, "the name is not valid UTF-8");
        if (!isVisible(code_point))
            return fail(code, "the name holds the invisible character U+%04X", static_cast<unsigned>(code_point));
    }
    return 0;
}

template <size_t size>
bool terminated(const char (&text)[size])
{
    return memchr(text, '\0', size);
}

} // namespace

int checkLunName(std::string_view name)
{
    return checkName(NORV_ERR_LUN_NAME, name);
}

int checkSnapshotName(const _tag_iscsi_snapshot_ &snapshot)
{
    if (int err = checkName(NORV_ERR_SNAPSHOT_NAME, snapshot.name))
        return err;
    const size_t room = snapshotNameRoom(snapshot.root_path), length = strlen(snapshot.name);
    if (length > room)
        return fail(NORV_ERR_SNAPSHOT_NAME, "the name has %zu bytes, %zu fit into the path of a snapshot on %s", length,
                    room, snapshot.root_path);
    return 0;
}

size_t snapshotNameRoom(const std::string &root_path)
{
    _tag_iscsi_snapshot_ longest = {};
    longest.lid = NORV_LUN_ID_MAX;
    longest.snap_id = NORV_SNAPSHOT_ID_MAX;
    const size_t name_limit = map_file_name_size - 1, path_limit = map_file_path_size - 1;
    snprintf(longest.root_path, sizeof longest.root_path, "%s", root_path.c_str());
    const size_t name_used = snapshotFolderName(longest).size(), path_used = snapshotFolder(longest).size();
    return std::min(name_limit - name_used, path_limit - std::min(path_limit, path_used));
}

int checkMapFileLength(const _tag_iscsi_lun_ &lun)
{
    _tag_iscsi_lun_ longest = lun;
    longest.lid = NORV_LUN_ID_MAX;
    const size_t name_length = mapFileName(longest).size(), path_length = dataPath(longest).size();
    if (name_length >= map_file_name_size)
        return fail(NORV_ERR_LUN_NAME, "the name has %zu bytes; %zu fit into the name of this kind's file",
                    strlen(lun.name), strlen(lun.name) - (name_length - map_file_name_size + 1));
    if (path_length >= map_file_path_size)
        return fail(NORV_ERR_LUN_LOCATION, "name and location are together %zu bytes too long for the file's path",
                    path_length - map_file_path_size + 1);
    return 0;
}

int checkLunSize(uint64_t size)
{
    if (size < smallest_lun)
        return fail(NORV_ERR_LUN_SIZE, "a LUN has at least 1 MiB, not %llu bytes",
                    static_cast<unsigned long long>(size));
    if (size % block_size != 0)
        return fail(NORV_ERR_LUN_SIZE, "the size %llu is no multiple of 512 bytes",
                    static_cast<unsigned long long>(size));
    if (size > INT64_MAX)
        return fail(NORV_ERR_LUN_SIZE, "the size %llu is too large", static_cast<unsigned long long>(size));
    return 0;
}

int checkTerminated(const _tag_iscsi_lun_ &lun)
{
    const bool all = terminated(lun.uuid) && terminated(lun.location) && terminated(lun.name);
    return all ? 0 : fail(NORV_ERR_BAD_PARAMETER, "a text of the LUN record does not end");
}

int checkTerminated(const _tag_iscsi_snapshot_ &snapshot)
{
    const bool all = terminated(snapshot.uuid) && terminated(snapshot.name) && terminated(snapshot.desc) &&
                     terminated(snapshot.taken_by) && terminated(snapshot.root_path) && terminated(snapshot.version);
    return all ? 0 : fail(NORV_ERR_BAD_PARAMETER, "a text of the snapshot record does not end");
}

int checkNewLun(_tag_iscsi_lun_ &lun)
{
    if (int err = checkTerminated(lun))
        return err;
    if (!isKnownType(lun.type))
        return fail(NORV_ERR_LUN_TYPE, "there is no LUN kind %d", lun.type);
    if (int err = checkLunName(lun.name))
        return err;
    if (lun.extent_size % block_size != 0)
        return fail(NORV_ERR_LUN_EXTENT_SIZE, "the extent size %u is no multiple of 512 bytes", lun.extent_size);
    if (isBlock(lun.type))
        return checkDevice(lun);
    if (int err = checkVolume(lun))
        return err;
    if (int err = checkLunSize(lun.size))
        return err;
    return checkMapFileLength(lun);
}

} // namespace norvhost

#include "host/storage/ExportFolder.h"

#include "host/core/KeyValueFile.h"
#include "host/core/LastError.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunChecks.h"
#include "host/storage/MapFile.h"
#include "host/storage/Volumes.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>
#include <sys/statvfs.h>

namespace norvhost {
namespace {

constexpr const char *data_name = "export.data";
constexpr const char *facts_name = "export.lun";
constexpr const char *record_name = "export.record";
constexpr const char *unnamed_record = "export.record.part";
/// In the order in which they are removed: what is killed in between stays a half export.
constexpr const char *all_names[] = {record_name, unnamed_record, facts_name, data_name};

constexpr const char *format_key = "format";
constexpr const char *format = "1";

/// The path without links, of something that need not be there yet.
int resolve(const std::string &path, std::string &canonical)
{
    std::string wanted = path;
    while (wanted.size() > 1 && wanted.back() == '/')
        wanted.pop_back();
    if (wanted.empty() || wanted[0] != '/')
        return fail(NORV_ERR_EXPORT_LOCATION, "'%s' is no absolute path", path.c_str());
    using Path = std::unique_ptr<char, decltype(&free)>;
    if (const Path whole(realpath(wanted.c_str(), nullptr), free); whole) {
        canonical = whole.get();
        return 0;
    }
    const std::string name = wanted.substr(wanted.rfind('/') + 1);
    const Path parent(errno == ENOENT ? realpath((parentOf(wanted) + "/").c_str(), nullptr) : nullptr, free);
    if (!parent)
        return failErrno(NORV_ERR_EXPORT_LOCATION, errno, "cannot reach the folder %s", path.c_str());
    if (name == "." || name == "..")
        return fail(NORV_ERR_EXPORT_LOCATION, "'%s' names no folder", path.c_str());
    canonical = std::string(parent.get()) + (parent.get() == std::string("/") ? "" : "/") + name;
    return 0;
}

/// Where the data of LUNs and snapshots lies nothing else is written.
int checkPlace(const std::string &folder)
{
    std::vector<VolumeRow> volumes;
    if (int err = loadVolumes(volumes))
        return err;
    for (const VolumeRow &volume : volumes)
        for (const char *name : {data_folder, snapshot_folder, trash_folder})
            if ((folder + "/").rfind(volume.path + "/" + name + "/", 0) == 0)
                return fail(NORV_ERR_EXPORT_LOCATION, "%s lies within a folder of LUNs and snapshots", folder.c_str());
    return 0;
}

int openFolder(const std::string &path, FileDescriptor &folder)
{
    folder.reset(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!folder)
        return failErrno(errno == ENOENT ? NORV_ERR_FILE_NOT_FOUND : NORV_ERR_EXPORT_LOCATION, errno,
                         "cannot open the folder %s", path.c_str());
    return 0;
}

bool holds(const FileDescriptor &folder, const char *name)
{
    struct stat status;
    return fstatat(folder.get(), name, &status, AT_SYMLINK_NOFOLLOW) == 0;
}

void removeFiles(const FileDescriptor &folder)
{
    for (const char *name : all_names)
        unlinkat(folder.get(), name, 0);
}

int writeFile(const FileDescriptor &folder, const char *name, const void *data, size_t size)
{
    const FileDescriptor file(openat(folder.get(), name, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot make %s", name);
    const ssize_t written = write(file.get(), data, size);
    if (written != static_cast<ssize_t>(size) || fsync(file.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, written < 0 || errno ? errno : ENOSPC, "cannot write %s", name);
    return 0;
}

/// Opens a regular file of an export. Without following links, and without waiting: whoever made the folder need not
/// be a friend.
int openFile(const FileDescriptor &folder, const char *name, FileDescriptor &file, uint64_t &size)
{
    file.reset(openat(folder.get(), name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file && errno == ENOENT)
        return fail(NORV_ERR_FILE_NOT_FOUND, "the folder holds no complete export: there is no %s", name);
    if (!file && errno == ELOOP)
        return fail(NORV_ERR_BAD_FILE_TYPE, "%s is a symbolic link", name);
    struct stat status;
    if (!file || fstat(file.get(), &status) != 0)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open %s", name);
    if (!S_ISREG(status.st_mode))
        return fail(NORV_ERR_BAD_FILE_TYPE, "%s is no regular file", name);
    size = static_cast<uint64_t>(status.st_size);
    return 0;
}

int readFile(const FileDescriptor &folder, const char *name, void *data, size_t size)
{
    FileDescriptor file;
    uint64_t found = 0;
    if (int err = openFile(folder, name, file, found))
        return err;
    if (found != size)
        return fail(NORV_ERR_BAD_FILE_SIZE, "%s has %llu bytes, not %zu", name, static_cast<unsigned long long>(found),
                    size);
    const ssize_t count = read(file.get(), data, size);
    if (count != static_cast<ssize_t>(size))
        return failErrno(NORV_ERR_READ_FILE, count < 0 ? errno : EIO, "cannot read %s", name);
    return 0;
}

template <size_t size>
bool ends(const char (&text)[size])
{
    return memchr(text, '\0', size) != nullptr;
}

int readRecord(const FileDescriptor &folder, _tag_iscsi_export_config_ &config)
{
    _tag_iscsi_export_config_ read = {};
    if (int err = readFile(folder, record_name, &read, sizeof read))
        return err;
    if (!isUuid({read.reserved_0, sizeof read.reserved_0}) || !ends(read.desc) || !ends(read.taken_by) ||
        read.app_consistent > 1 || read.user_locked > 1)
        return fail(NORV_ERR_BAD_FILE_TYPE, "%s is no record of an export", record_name);
    config = read;
    return 0;
}

std::string factsText(const ExportFacts &facts)
{
    return std::string(format_key) + "=" + format + "\nname=\"" + facts.lun_name +
           "\"\ntype=" + std::to_string(facts.type) + "\nsize=" + std::to_string(facts.size) + "\n";
}

template <class Number>
bool readNumber(const std::string &text, const char *key, Number &number)
{
    const std::string value = findKeyValue(text, key).value_or("");
    const auto [rest, error] = std::from_chars(value.data(), value.data() + value.size(), number);
    return error == std::errc() && rest == value.data() + value.size();
}

int readFacts(const FileDescriptor &folder, ExportFacts &facts)
{
    constexpr uint64_t largest = 4096;
    FileDescriptor file;
    uint64_t size = 0;
    if (int err = openFile(folder, facts_name, file, size))
        return err;
    if (size > largest)
        return fail(NORV_ERR_BAD_FILE_SIZE, "%s has %llu bytes", facts_name, static_cast<unsigned long long>(size));
    std::string text(static_cast<size_t>(size), '\0');
    if (int err = readFile(folder, facts_name, text.data(), text.size()))
        return err;
    ExportFacts read;
    read.lun_name = findKeyValue(text, "name").value_or("");
    if (findKeyValue(text, format_key) != format || !readNumber(text, "type", read.type) ||
        !readNumber(text, "size", read.size) || checkLunSize(read.size) != 0)
        return fail(NORV_ERR_BAD_FILE_TYPE, "%s does not describe an export of format %s", facts_name, format);
    facts = read;
    return 0;
}

} // namespace

int NewExport::open(const std::string &destination)
{
    if (int err = resolve(destination, canonical_path))
        return err;
    if (int err = checkPlace(canonical_path))
        return err;
    made = mkdir(canonical_path.c_str(), 0700) == 0;
    if (!made && errno != EEXIST)
        return failErrno(NORV_ERR_MAKE_DIRECTORY, errno, "cannot make the folder %s", canonical_path.c_str());
    if (int err = openFolder(canonical_path, folder))
        return err;
    for (const char *name : all_names)
        if (holds(folder, name))
            return fail(NORV_ERR_FILE_EXISTS, "%s already holds %s", canonical_path.c_str(), name);
    return made ? flushFolder(parentOf(canonical_path) + "/") : 0;
}

int NewExport::checkSpace(const FileDescriptor &source, uint64_t used) const
{
    struct stat from, to;
    struct statvfs room;
    if (fstat(source.get(), &from) != 0 || fstat(folder.get(), &to) != 0 || fstatvfs(folder.get(), &room) != 0)
        return failErrno(NORV_ERR_VOLUME_INFO, errno, "cannot ask for the free space of %s", canonical_path.c_str());
    const uint64_t available = room.f_bavail * room.f_frsize;
    if (used > available && from.st_dev != to.st_dev)
        return fail(NORV_ERR_OUT_OF_SPACE, "%s has room for %llu bytes, the export needs %llu", canonical_path.c_str(),
                    static_cast<unsigned long long>(available), static_cast<unsigned long long>(used));
    return 0;
}

int NewExport::createData(uint64_t size, const FileDescriptor &source, uint64_t used, FileDescriptor &data)
{
    if (int err = checkSpace(source, used))
        return err;
    data.reset(openat(folder.get(), data_name, O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!data)
        return failErrno(errno == EEXIST ? NORV_ERR_FILE_EXISTS : NORV_ERR_OPEN_FILE, errno, "cannot make %s in %s",
                         data_name, canonical_path.c_str());
    created = true;
    if (ftruncate(data.get(), static_cast<off_t>(size)) != 0)
        return failErrno(NORV_ERR_TRUNCATE_FILE, errno, "cannot set the size of %s", data_name);
    return 0;
}

int NewExport::writeRecord(const ExportFacts &facts, const _tag_iscsi_export_config_ &config)
{
    const std::string text = factsText(facts);
    if (int err = writeFile(folder, facts_name, text.data(), text.size()))
        return err;
    return writeFile(folder, unnamed_record, &config, sizeof config);
}

int NewExport::publish()
{
    if (fsync(folder.get()) != 0 || renameat(folder.get(), unnamed_record, folder.get(), record_name) != 0 ||
        fsync(folder.get()) != 0)
        return failErrno(NORV_ERR_RENAME_FILE, errno, "cannot complete the export in %s", canonical_path.c_str());
    return 0;
}

void NewExport::remove()
{
    if (created)
        removeFiles(folder);
    if (made)
        rmdir(canonical_path.c_str());
}

int removeHalfExport(const std::string &path, bool made_folder)
{
    FileDescriptor folder;
    if (int err = openFolder(path, folder))
        return err == NORV_ERR_FILE_NOT_FOUND ? 0 : err;
    if (holds(folder, record_name))
        return 0;
    removeFiles(folder);
    if (made_folder)
        rmdir(path.c_str());
    return 0;
}

int readExportRecord(const std::string &path, _tag_iscsi_export_config_ &config)
{
    FileDescriptor folder;
    if (int err = openFolder(path, folder))
        return err;
    return readRecord(folder, config);
}

int openExport(const std::string &path, ExportFacts &facts, FileDescriptor &data)
{
    FileDescriptor folder;
    _tag_iscsi_export_config_ config = {};
    if (int err = openFolder(path, folder))
        return err;
    if (int err = readRecord(folder, config))
        return err;
    if (int err = readFacts(folder, facts))
        return err;
    uint64_t size = 0;
    if (int err = openFile(folder, data_name, data, size))
        return err;
    if (size != facts.size)
        return fail(NORV_ERR_BAD_FILE_SIZE, "%s has %llu bytes, the export %llu", data_name,
                    static_cast<unsigned long long>(size), static_cast<unsigned long long>(facts.size));
    return 0;
}

} // namespace norvhost

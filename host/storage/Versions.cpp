#include "host/storage/Versions.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <ctime>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/xattr.h>

namespace norvhost {
namespace {

/// "<base> <current> <size> <modification time in ns>"; the last two as they were when the synchronisation ended.
constexpr const char *version_attribute = "user.norv.version";

struct StoredVersions {
    char base[37] = NORV_ZERO_UUID;
    char current[37] = NORV_ZERO_UUID;
    uint64_t size = 0;
    int64_t modified_ns = 0;
    bool present = false;
};

const char *countAttribute(Transfer transfer)
{
    return transfer == Transfer::sending ? "user.norv.sending" : "user.norv.copying";
}

int lookAt(int fd, const std::string &path, struct stat &status)
{
    if (fstat(fd, &status) != 0)
        return failErrno(NORV_ERR_STAT_PATH, errno, "cannot look at %s", path.c_str());
    return 0;
}

int openMapFile(const std::string &path, FileDescriptor &file, struct stat &status)
{
    file.reset(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file && errno == ELOOP)
        return fail(NORV_ERR_BAD_MAP_FILE, "%s is a symbolic link", path.c_str());
    if (!file)
        return failErrno(errno == ENOENT || errno == ENOTDIR ? NORV_ERR_FILE_NOT_FOUND : NORV_ERR_OPEN_FILE, errno,
                         "cannot open %s", path.c_str());
    if (int err = lookAt(file.get(), path, status))
        return err;
    if (!S_ISREG(status.st_mode))
        return fail(NORV_ERR_BAD_MAP_FILE, "%s is no regular file", path.c_str());
    return 0;
}

/// Empty text for an attribute that is not there.
int readAttribute(int fd, const std::string &path, const char *name, std::string &text)
{
    char buffer[256];
    const ssize_t length = fgetxattr(fd, name, buffer, sizeof buffer);
    if (length < 0 && errno != ENODATA)
        return failErrno(NORV_ERR_READ_FILE, errno, "cannot read the attribute %s of %s", name, path.c_str());
    text.assign(buffer, length < 0 ? 0 : static_cast<size_t>(length));
    return 0;
}

int writeAttribute(int fd, const std::string &path, const char *name, const std::string &text)
{
    if (fsetxattr(fd, name, text.data(), text.size(), 0) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot write the attribute %s of %s", name, path.c_str());
    return 0;
}

int flush(const FileDescriptor &file, const std::string &path)
{
    if (fsync(file.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush %s", path.c_str());
    return 0;
}

int64_t modifiedNs(const struct stat &status)
{
    return static_cast<int64_t>(status.st_mtim.tv_sec) * 1000000000 + status.st_mtim.tv_nsec;
}

int readStored(int fd, const std::string &path, StoredVersions &stored)
{
    std::string text;
    if (int err = readAttribute(fd, path, version_attribute, text))
        return err;
    if (text.empty())
        return 0;
    stored.present = true;
    if (sscanf(text.c_str(), "%36s %36s %" SCNu64 " %" SCNd64, stored.base, stored.current, &stored.size,
               &stored.modified_ns) != 4)
        return fail(NORV_ERR_BAD_MAP_FILE, "the version of %s is not readable", path.c_str());
    return 0;
}

int writeStored(int fd, const std::string &path, const StoredVersions &stored)
{
    return writeAttribute(fd, path, version_attribute,
                          std::string(stored.base) + " " + stored.current + " " + std::to_string(stored.size) + " " +
                              std::to_string(stored.modified_ns));
}

std::string localVersion(const struct stat &status)
{
    const uint64_t modified = static_cast<uint64_t>(modifiedNs(status));
    char text[37];
    // Version 8 of the UUID format: made from data of our own.
    snprintf(text, sizeof text, "%08x-%04x-8%03x-8%03x-%012" PRIx64, static_cast<unsigned>(modified >> 32),
             static_cast<unsigned>(modified >> 16) & 0xffff, static_cast<unsigned>(modified >> 4) & 0xfff,
             static_cast<unsigned>(modified & 0xf), static_cast<uint64_t>(status.st_size) >> 9 & 0xffffffffffff);
    return text;
}

int versionsOf(int fd, const std::string &path, const struct stat &status, Versions &versions)
{
    StoredVersions stored;
    if (int err = readStored(fd, path, stored))
        return err;
    versions.base = stored.base;
    versions.current = stored.current;
    const bool synchronised = stored.present && versions.base == versions.current;
    if (synchronised &&
        (stored.size != static_cast<uint64_t>(status.st_size) || stored.modified_ns != modifiedNs(status)))
        versions.current = localVersion(status);
    return 0;
}

/// Stores that the file is what its base says.
int storeSynchronised(int fd, const std::string &path, StoredVersions &stored)
{
    // The kernel's file times are as coarse as its clock tick: a write right after this must not get the time that we
    // remember, so the file's time goes back by a second.
    timespec times[2] = {{0, UTIME_OMIT}, {}};
    clock_gettime(CLOCK_REALTIME, &times[1]);
    times[1].tv_sec -= 1;
    struct stat status;
    if (futimens(fd, times) != 0 || fstat(fd, &status) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot set the time of %s", path.c_str());

    snprintf(stored.current, sizeof stored.current, "%s", stored.base);
    stored.size = static_cast<uint64_t>(status.st_size);
    stored.modified_ns = modifiedNs(status);
    return writeStored(fd, path, stored);
}

/// `change` stores what it changes.
template <class Change>
int changeStored(const std::string &path, Change change)
{
    FileDescriptor file;
    struct stat status;
    StoredVersions stored;
    if (int err = openMapFile(path, file, status))
        return err;
    if (int err = readStored(file.get(), path, stored))
        return err;
    if (int err = change(file, stored))
        return err;
    return flush(file, path);
}

} // namespace

int readVersions(const std::string &path, Versions &versions)
{
    FileDescriptor file;
    struct stat status;
    if (int err = openMapFile(path, file, status))
        return err;
    return versionsOf(file.get(), path, status, versions);
}

int beginSynchronisation(const std::string &path, const std::string &incoming)
{
    return changeStored(path, [&](const FileDescriptor &file, StoredVersions &stored) {
        snprintf(stored.current, sizeof stored.current, "%s", incoming.c_str());
        return writeStored(file.get(), path, stored);
    });
}

int forgetBase(const std::string &path)
{
    return changeStored(path, [&](const FileDescriptor &file, StoredVersions &stored) {
        snprintf(stored.base, sizeof stored.base, "%s", NORV_ZERO_UUID);
        return writeStored(file.get(), path, stored);
    });
}

int finishSynchronisation(const std::string &path)
{
    return changeStored(path, [&](const FileDescriptor &file, StoredVersions &stored) {
        if (int err = flush(file, path))
            return err;
        snprintf(stored.base, sizeof stored.base, "%s", stored.current);
        return storeSynchronised(file.get(), path, stored);
    });
}

int copyVersions(int from, int to, bool quiet)
{
    const std::string what = "a clone";
    struct stat status;
    Versions versions;
    if (int err = lookAt(from, what, status))
        return err;
    if (int err = versionsOf(from, what, status, versions))
        return err;

    if (versions.current == NORV_ZERO_UUID) { // never synchronised
        if (fremovexattr(to, version_attribute) != 0 && errno != ENODATA)
            return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot remove the attribute %s of %s", version_attribute,
                             what.c_str());
        return 0;
    }
    StoredVersions stored;
    snprintf(stored.base, sizeof stored.base, "%s", versions.base.c_str());
    if (isSynchronised(versions) && quiet)
        return storeSynchronised(to, what, stored);
    if (int err = lookAt(to, what, status))
        return err;
    // Also of a state that is arriving: nothing arrives here.
    snprintf(stored.current, sizeof stored.current, "%s", localVersion(status).c_str());
    return writeStored(to, what, stored);
}

int readTransferCount(const std::string &path, Transfer transfer, TransferCount &count)
{
    FileDescriptor file;
    struct stat status;
    std::string text;
    if (int err = openMapFile(path, file, status))
        return err;
    if (int err = readAttribute(file.get(), path, countAttribute(transfer), text))
        return err;
    TransferCount read;
    if (!text.empty() && sscanf(text.c_str(), "%" SCNu64 " %" SCNu64, &read.done, &read.total) != 2)
        return fail(NORV_ERR_BAD_MAP_FILE, "the transfer count of %s is not readable", path.c_str());
    count = read;
    return 0;
}

int writeTransferCount(const std::string &path, Transfer transfer, const TransferCount &count)
{
    FileDescriptor file;
    struct stat status;
    if (int err = openMapFile(path, file, status))
        return err;
    return writeAttribute(file.get(), path, countAttribute(transfer),
                          std::to_string(count.done) + " " + std::to_string(count.total));
}

} // namespace norvhost

#include "host/core/OwnFile.h"

#include "host/core/LastError.h"
#include "platform/core.h"
#include "platform/error.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>

namespace norvhost {
namespace {

constexpr mode_t writable_by_others = S_IWGRP | S_IWOTH;
constexpr mode_t folder_mode = 0755;

int refuse(int errnum, const std::string &path, const char *why)
{
    fail(NORV_ERR_NO_PERMISSION, "%s %s", path.c_str(), why);
    return -errnum;
}

int cannotOpen(int errnum, const std::string &path)
{
    if (errnum == ELOOP || errnum == ENOTDIR || errnum == EISDIR || errnum == ENXIO)
        return refuse(errnum, path, "is a link or of another kind than it should be");
    failErrno(NORV_ERR_OPEN_FILE, errnum, "cannot open %s", path.c_str());
    return -errnum;
}

int openFolder(const std::string &path, FileDescriptor &folder, struct stat &status)
{
    FileDescriptor opened(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!opened || fstat(opened.get(), &status) != 0)
        return cannotOpen(errno, path);
    folder = std::move(opened);
    return 0;
}

} // namespace

int openPlace(const char *path, FilePlace &place)
{
    const std::string whole(path ? path : "");
    const size_t slash = whole.rfind('/');
    if (slash == std::string::npos || slash + 1 == whole.size())
        return refuse(EINVAL, whole, "is not the path of a file");
    place.path = whole;
    place.name = whole.substr(slash + 1);

    const std::string folder = slash ? whole.substr(0, slash) : "/";
    struct stat status;
    if (int err = openFolder(folder, place.folder, status))
        return err;
    if (status.st_uid != geteuid() && status.st_uid != 0)
        return refuse(EPERM, folder, "is another user's");
    if (status.st_mode & writable_by_others && !(status.st_mode & S_ISVTX))
        return refuse(EPERM, folder, "can be written to by other users");
    return 0;
}

int openOwnFile(const FilePlace &place, int flags, FileDescriptor &file)
{
    // Non-blocking: what lies there need not be a file. O_EXCL: a kernel that protects sticky folders refuses O_CREAT
    // of what is there already.
    const int always = O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
    FileDescriptor opened;
    for (bool made = false; !opened && !made;) {
        opened.reset(openat(place.folder.get(), place.name.c_str(), (flags & ~O_CREAT) | always));
        if (opened || errno != ENOENT || !(flags & O_CREAT))
            break;
        opened.reset(openat(place.folder.get(), place.name.c_str(), flags | O_EXCL | always, 0600));
        made = opened || errno != EEXIST; // else somebody else made it
    }
    struct stat status;
    if (!opened || fstat(opened.get(), &status) != 0)
        return cannotOpen(errno, place.path);
    if (!S_ISREG(status.st_mode))
        return refuse(EINVAL, place.path, "is no regular file");
    if (status.st_uid != geteuid())
        return refuse(EPERM, place.path, "is another user's");
    if (status.st_nlink != 1)
        return refuse(EPERM, place.path, "has another name elsewhere, or none any more");
    file = std::move(opened);
    return 0;
}

int makeOwnFolder(const char *path)
{
    std::string whole(path ? path : "");
    whole.erase(whole.find_last_not_of('/') + 1);
    if (whole.empty() || whole[0] != '/')
        return refuse(EINVAL, whole, "is not the path of a folder");
    for (size_t slash = whole.find('/', 1); slash != std::string::npos; slash = whole.find('/', slash + 1))
        mkdir(whole.substr(0, slash).c_str(), folder_mode);
    if (mkdir(whole.c_str(), folder_mode) != 0 && errno != EEXIST) {
        const int errnum = errno;
        failErrno(NORV_ERR_MAKE_DIRECTORY, errnum, "cannot make the folder %s", whole.c_str());
        return -errnum;
    }
    FileDescriptor folder;
    struct stat status;
    if (int err = openFolder(whole, folder, status))
        return err;
    if (status.st_uid != geteuid() || status.st_mode & writable_by_others)
        return refuse(EPERM, whole, "is not ours alone: others could put files into it");
    return 0;
}

} // namespace norvhost

int NORVFSMkdirP(const char *path, int, int, int, int, int)
{
    return norvhost::makeOwnFolder(path);
}

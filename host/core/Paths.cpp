#include "host/core/Paths.h"

#include "host/core/LastError.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdlib>
#include <sys/stat.h>

namespace norvhost {
namespace {

std::string environmentOr(const char *name, const char *fallback)
{
    const char *value = getenv(name);
    return value && *value ? value : fallback;
}

} // namespace

std::string stateFolder()
{
    return environmentOr("ISCSI_HOST_STATE", "/var/lib/iscsi-host");
}

std::string runFolder()
{
    return environmentOr("ISCSI_HOST_RUN", "/run/iscsi-host");
}

std::string progressFolder()
{
    return environmentOr("ISCSI_HOST_PROGRESS", "/tmp/iscsi");
}

int makeFolder(const std::string &path)
{
    for (size_t slash = path.find('/', 1); slash != std::string::npos; slash = path.find('/', slash + 1))
        mkdir(path.substr(0, slash).c_str(), 0700);
    if (mkdir(path.c_str(), 0700) == 0)
        return 0;

    const int errnum = errno;
    struct stat status;
    if (errnum == EEXIST && stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode))
        return 0;
    return failErrno(NORV_ERR_MAKE_DIRECTORY, errnum, "cannot make the folder %s", path.c_str());
}

} // namespace norvhost

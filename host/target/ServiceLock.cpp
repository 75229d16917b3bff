#include "host/target/ServiceLock.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "platform/error.h"

#include <cerrno>
#include <fcntl.h>

namespace norvhost {
namespace {

/// In the run folder: daemons and mark go together when the machine goes down.
std::string markPath()
{
    return runFolder() + "/lock/service-changing";
}

} // namespace

int ServiceLock::mark() const
{
    const std::string path = markPath();
    const FileDescriptor file(open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    return file ? 0 : failErrno(NORV_ERR_OPEN_FILE, errno, "cannot make %s", path.c_str());
}

void ServiceLock::clear() const
{
    unlink(markPath().c_str());
}

bool daemonsMarked()
{
    return access(markPath().c_str(), F_OK) == 0;
}

} // namespace norvhost

#include "host/core/BootMark.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "platform/error.h"

#include <cerrno>
#include <fstream>
#include <string>

namespace norvhost {
namespace {

std::string firstLine(const std::string &path)
{
    std::ifstream file(path);
    std::string line;
    std::getline(file, line);
    return line;
}

/// The kernel makes another one at each start. The run folder may outlive one.
std::string bootId()
{
    return firstLine("/proc/sys/kernel/random/boot_id");
}

std::string markPath()
{
    return runFolder() + "/booted";
}

} // namespace

int markBooted()
{
    if (isMarkedBooted())
        return 0;
    std::ofstream file(markPath());
    file << bootId() << '\n';
    if (!file.flush())
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot write %s", markPath().c_str());
    return 0;
}

bool isMarkedBooted()
{
    const std::string id = bootId();
    return !id.empty() && firstLine(markPath()) == id;
}

} // namespace norvhost

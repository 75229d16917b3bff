#include "etc/ProgressFile.h"

#include "platform/core.h"

#include <cstdlib>

namespace ISCSI {

const char *readProgressFile(const char *path, int base, unsigned long long &done_bytes,
                             unsigned long long &total_bytes, int &step)
{
    char value[128];
    if (NLIBCFileGetKeyValue(path, "step", value, sizeof(value)) <= 0)
        return "step";
    step = static_cast<int>(strtol(value, nullptr, 10));
    if (NLIBCFileGetKeyValue(path, "done_bytes", value, sizeof(value)) <= 0)
        return "done_bytes";
    done_bytes = strtoull(value, nullptr, base);
    if (NLIBCFileGetKeyValue(path, "total_bytes", value, sizeof(value)) <= 0)
        return "total_bytes";
    total_bytes = strtoull(value, nullptr, base);
    return nullptr;
}

} // namespace ISCSI

#include "host/core/LibIscsi.h"

#include <dlfcn.h>
#include <syslog.h>

namespace norvhost {

void *libIscsiFunction(const char *name)
{
    static void *const library = dlopen("libiscsi.so.7", RTLD_LAZY | RTLD_LOCAL);
    void *const function = library ? dlsym(library, name) : nullptr;
    if (!function)
        syslog(LOG_ERR, "libiscsi.so.7 does not give %s", name);
    return function;
}

} // namespace norvhost

#include "host/core/LastError.h"

#include "iscsihost/host.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace norvhost {
namespace {

thread_local char reason[1024];

void record(const char *format, va_list arguments)
{
    vsnprintf(reason, sizeof reason, format, arguments);
    // Names that the caller gave may hold anything; the reason stays one line.
    for (char *c = reason; *c; ++c)
        if (static_cast<unsigned char>(*c) < ' ' || *c == 0x7f)
            *c = '?';
}

} // namespace

int fail(int code, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    record(format, arguments);
    va_end(arguments);
    return code;
}

int failErrno(int code, int errnum, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    record(format, arguments);
    va_end(arguments);
    const size_t used = strlen(reason);
    snprintf(reason + used, sizeof reason - used, ": %s", strerror(errnum));

    switch (errnum) {
    case ENOSPC:
    case EDQUOT:
        return NORV_ERR_OUT_OF_SPACE;
    case EACCES:
    case EPERM:
    case EROFS:
        return NORV_ERR_NO_PERMISSION;
    case ENOMEM:
        return NORV_ERR_OUT_OF_MEMORY;
    default:
        return code;
    }
}

const char *lastError()
{
    return reason;
}

} // namespace norvhost

extern "C" const char *iscsi_host_last_error(void)
{
    return norvhost::lastError();
}

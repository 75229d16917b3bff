#include "host/core/LastError.h"

#include "iscsihost/host.h"
#include "platform/core.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace norvhost {
namespace {

thread_local char reason[1024];
thread_local int latest_code;

void record(const char *format, va_list arguments)
{
    vsnprintf(reason, sizeof reason, format, arguments);
    // Names that the caller gave may hold anything; the reason stays one line.
    for (char *c = reason; *c; ++c)
        if (static_cast<unsigned char>(*c) < ' ' || *c == 0x7f)
            *c = '?';
}

/// Where the errno value says more than the code does, that.
int codeOf(int errnum, int code)
{
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

} // namespace

int fail(int code, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    record(format, arguments);
    va_end(arguments);
    return latest_code = code;
}

int failErrno(int code, int errnum, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    record(format, arguments);
    va_end(arguments);
    const size_t used = strlen(reason);
    snprintf(reason + used, sizeof reason - used, ": %s", strerror(errnum));

    return latest_code = codeOf(errnum, code);
}

const char *lastError()
{
    return reason;
}

int lastErrorCode()
{
    return latest_code;
}

} // namespace norvhost

int NLIBCErrGet(void)
{
    return norvhost::lastErrorCode();
}

extern "C" const char *iscsi_host_last_error(void)
{
    return norvhost::lastError();
}

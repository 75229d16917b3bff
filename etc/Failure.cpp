#include "etc/Failure.h"

#include <cstdarg>
#include <cstdio>
#include <syslog.h>

namespace ISCSI {
namespace {

std::string formatText(const char *format, va_list arguments) __attribute__((format(printf, 1, 0)));

std::string formatText(const char *format, va_list arguments)
{
    va_list again;
    va_copy(again, arguments);
    const int length = vsnprintf(nullptr, 0, format, arguments);
    std::string text(length > 0 ? static_cast<size_t>(length) : 0, '\0');
    vsnprintf(text.data(), text.size() + 1, format, again);
    va_end(again);
    return text;
}

} // namespace

int failText(Site site, int code, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    const std::string text = formatText(format, arguments);
    va_end(arguments);
    syslog(LOG_ERR, "%s:%d:%s %s", site.file, site.line, site.method, text.c_str());
    return code;
}

int failShort(Site site, int code, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    const std::string text = formatText(format, arguments);
    va_end(arguments);
    syslog(LOG_ERR, "%s:%d %s", site.file, site.line, text.c_str());
    return code;
}

int failTagged(Site site, int code, const std::string &detail)
{
    syslog(LOG_ERR, "[E] iSCSIWebAPI:%s:%d:%s error code: %d (%s) [%s]", site.file, site.line, site.method, code,
           ErrorCodeToString(code), detail.c_str());
    return code;
}

int failStandard(Site site, int code, const char *sentence, const std::string &info)
{
    return failText(site, code, "%s. info: %s. error: %d (%s)", sentence, info.c_str(), code, ErrorCodeToString(code));
}

} // namespace ISCSI

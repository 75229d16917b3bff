/// Bounded copies into the character fields of SDK records.
#pragma once

#include "etc/Failure.h"

#include <cstddef>
#include <cstdio>
#include <sstream>
#include <string>

namespace ISCSI {

/// Copies the text of `value` into `destination` of `size` bytes, its NUL included, and always ends
/// it with NUL. Returns ERR_NULL_POINTER, or ERR_FAILED_TO_COPY_STRING with the truncated copy in
/// place; both are logged, and the caller logs its own line naming the field.
template <class Value>
int StringCopy(char *destination, size_t size, const Value &value)
{
    // The method is named here, for in a template here() would name its arguments too.
    if (!destination)
        return failText(here(__builtin_FILE(), __builtin_LINE(), __func__), ERR_NULL_POINTER,
                        "NULL destination pointer");
    std::ostringstream stream;
    stream << value;
    const std::string text = stream.str();
    const int length = snprintf(destination, size, "%s", text.c_str());
    if (static_cast<size_t>(length) >= size)
        return failText(here(__builtin_FILE(), __builtin_LINE(), __func__), ERR_FAILED_TO_COPY_STRING,
                        "Failed to copy string: %s", text.c_str());
    return 0;
}

/// StringCopy of a secret: the same results, but the log does not show it.
inline int SecretCopy(char *destination, size_t size, const std::string &secret)
{
    if (!destination)
        return failText(here(), ERR_NULL_POINTER, "NULL destination pointer");
    const int length = snprintf(destination, size, "%s", secret.c_str());
    if (static_cast<size_t>(length) >= size)
        return failText(here(), ERR_FAILED_TO_COPY_STRING, "Failed to copy string: %s", "***");
    return 0;
}

/// Either copy into a field of known size.
template <size_t size, class Value>
int StringCopy(char (&field)[size], const Value &value)
{
    return StringCopy(field, size, value);
}

template <size_t size>
int SecretCopy(char (&field)[size], const std::string &secret)
{
    return SecretCopy(field, size, secret);
}

} // namespace ISCSI

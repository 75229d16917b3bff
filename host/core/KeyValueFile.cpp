#include "host/core/KeyValueFile.h"

#include "host/core/FileContent.h"
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "platform/core.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <strings.h>
#include <sys/stat.h>

namespace norvhost {
namespace {

constexpr size_t largest_file = 1 << 20;

std::string_view unquoted(std::string_view value)
{
    const bool quoted =
        value.size() >= 2 && (value.front() == '"' || value.front() == '\'') && value.front() == value.back();
    return quoted ? value.substr(1, value.size() - 2) : value;
}

/// Fails with a negative errno value, as the functions of the platform's header do.
int refuse(int errnum, const char *path)
{
    failErrno(NORV_ERR_READ_FILE, errnum, "cannot read %s", path);
    return -errnum;
}

int readWhole(const char *path, std::string &text)
{
    // Non-blocking: what lies there need not be a file.
    const FileDescriptor file(open(path, O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    // Callers look into files that need not be there, also to tell what became of a failure: its reason stays.
    if (!file && errno == ENOENT)
        return -ENOENT;
    struct stat status;
    if (!file || fstat(file.get(), &status) != 0)
        return refuse(errno, path);
    if (!S_ISREG(status.st_mode))
        return refuse(S_ISDIR(status.st_mode) ? EISDIR : EINVAL, path);
    const int err = readAll(file.get(), largest_file, text);
    return err ? refuse(-err, path) : 0;
}

/// 1, 0 or negative, as NLIBCFileGetKeyValue.
int readKeyValue(const char *path, const char *key, std::string &value)
{
    if (!path || !key || !*key) {
        fail(NORV_ERR_NULL_POINTER, "no file or no key to look up");
        return -EINVAL;
    }
    std::string text;
    if (int err = readWhole(path, text))
        return err;
    const auto found = findKeyValue(text, key);
    value = found.value_or("");
    return found ? 1 : 0;
}

} // namespace

std::optional<std::string> findKeyValue(std::string_view text, std::string_view key)
{
    while (!text.empty()) {
        const std::string_view line = text.substr(0, text.find('\n'));
        text.remove_prefix(std::min(text.size(), line.size() + 1));
        const size_t equals = line.find('=');
        if (equals != std::string_view::npos && trimmed(line).front() != '#' && trimmed(line.substr(0, equals)) == key)
            return std::string(unquoted(trimmed(line.substr(equals + 1))));
    }
    return std::nullopt;
}

} // namespace norvhost

using namespace norvhost;

int NLIBCFileExist(const char *path)
{
    return path && access(path, F_OK) == 0 ? 1 : 0;
}

int NLIBCFileGetKeyValue(const char *path, const char *key, char *value, int size)
{
    if (!value || size < 1) {
        fail(NORV_ERR_NULL_POINTER, "no room for a value");
        return -EINVAL;
    }
    std::string text;
    const int found = readKeyValue(path, key, text);
    if (found <= 0)
        return found;
    if (text.size() >= static_cast<size_t>(size)) {
        fail(NORV_ERR_READ_FILE, "the value of %s in %s has %zu bytes, there is room for %d", key, path, text.size(),
             size - 1);
        return -ERANGE;
    }
    memcpy(value, text.c_str(), text.size() + 1);
    return 1;
}

int NLIBCFileCheckKeyValue(const char *path, const char *key, const char *value, int case_sensitive)
{
    if (!value) {
        fail(NORV_ERR_NULL_POINTER, "no value to compare with");
        return -EINVAL;
    }
    std::string text;
    const int found = readKeyValue(path, key, text);
    if (found <= 0)
        return found;
    return (case_sensitive ? strcmp(text.c_str(), value) : strcasecmp(text.c_str(), value)) == 0 ? 1 : 0;
}

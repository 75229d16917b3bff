#include "host/core/SectionFile.h"

#include "host/core/FileContent.h"
#include "host/core/LastError.h"
#include "host/core/OwnFile.h"
#include "host/core/StringHash.h"
#include "platform/core.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/file.h>

namespace norvhost {
namespace {

constexpr size_t largest_file = 1 << 20;
constexpr std::string_view placeholder = "%s";

bool hasControlCharacter(std::string_view text)
{
    return std::any_of(text.begin(), text.end(), [](unsigned char c) { return c < ' ' || c == 0x7f; });
}

/// The name in a header line, empty for another line.
std::string_view headerName(std::string_view line)
{
    line = trimmed(line);
    return line.size() > 2 && line.front() == '[' && line.back() == ']' ? line.substr(1, line.size() - 2)
                                                                        : std::string_view();
}

bool isSectionName(std::string_view name)
{
    return !name.empty() && !hasControlCharacter(name) && headerName("[" + std::string(name) + "]") == name;
}

} // namespace

std::vector<Section> splitSections(std::string_view text)
{
    std::vector<Section> sections;
    for (size_t begin = 0, end; begin < text.size(); begin = end) {
        end = std::min(text.find('\n', begin), text.size() - 1) + 1;
        const std::string_view name = headerName(text.substr(begin, end - begin));
        if (!name.empty())
            sections.push_back({name, text.substr(end, 0), text.substr(begin, 0)});
        if (!sections.empty()) {
            Section &section = sections.back();
            const auto upToHere = [&](std::string_view part) {
                return std::string_view(part.data(), static_cast<size_t>(text.data() + end - part.data()));
            };
            section.lines = upToHere(section.lines);
            section.whole = upToHere(section.whole);
        }
    }
    return sections;
}

bool appendKeyLine(std::string_view format, std::string_view key, std::string_view value, std::string &lines)
{
    const size_t first = format.find(placeholder);
    const size_t second = format.find(placeholder, first + placeholder.size());
    if (second == std::string_view::npos || std::count(format.begin(), format.end(), '%') != 2)
        return false;
    std::string line(format.substr(0, first));
    line.append(key).append(format.substr(first + placeholder.size(), second - first - placeholder.size()));
    line.append(value).append(format.substr(second + placeholder.size()));

    std::string_view read_key, read_value;
    if (line.find('\n') != line.size() - 1 || !readKeyLine(line, read_key, read_value) || read_key != key ||
        read_value != value || hasControlCharacter(key) || hasControlCharacter(value))
        return false;
    lines += line;
    return true;
}

bool readKeyLine(std::string_view line, std::string_view &key, std::string_view &value)
{
    const size_t equals = line.find('=');
    if (equals == std::string_view::npos || !headerName(line).empty())
        return false;
    key = trimmed(line.substr(0, equals));
    value = line.substr(equals + 1);
    while (!value.empty() && (value.back() == '\n' || value.back() == '\r'))
        value.remove_suffix(1);
    return !key.empty();
}

namespace {

/// A section file under a lock of its folder: what is read, changed and written back is not mixed with another's.
class SectionFile {
public:
    /// 0 or a negative errno value, as all below.
    int open(const char *path, bool exclusive)
    {
        if (int err = openPlace(path, place))
            return err;
        while (flock(place.folder.get(), exclusive ? LOCK_EX : LOCK_SH) != 0)
            if (errno != EINTR)
                return failed("cannot lock the folder of");
        return read();
    }

    const std::string &text() const { return content; }

    const Section *find(std::string_view name) const
    {
        const auto found = std::find_if(sections.begin(), sections.end(),
                                        [name](const Section &section) { return section.name == name; });
        return found == sections.end() ? nullptr : &*found;
    }
    const std::vector<Section> &all() const { return sections; }

    /// Puts a text in the file's place: a kill leaves the file as it was or as it is to be.
    int replace(std::string_view replacement)
    {
        if (replacement.size() > largest_file)
            return failed("cannot write more than 1 MiB to", EFBIG);
        const std::string next = "." + place.name + ".next";
        unlinkat(place.folder.get(), next.c_str(), 0); // left by a killed process
        FileDescriptor file(
            openat(place.folder.get(), next.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
        if (!file || !writeAll(file.get(), replacement) || fsync(file.get()) != 0 ||
            renameat(place.folder.get(), next.c_str(), place.folder.get(), place.name.c_str()) != 0) {
            const int err = failed("cannot write");
            unlinkat(place.folder.get(), next.c_str(), 0);
            return err;
        }
        return fsync(place.folder.get()) == 0 ? 0 : failed("cannot write the folder of");
    }

private:
    int failed(const char *step, int errnum = errno)
    {
        failErrno(NORV_ERR_WRITE_FILE, errnum, "%s %s", step, place.path.c_str());
        return -errnum;
    }

    int read()
    {
        FileDescriptor file;
        if (int err = openOwnFile(place, O_RDONLY, file))
            return err;
        if (int err = readAll(file.get(), largest_file, content))
            return failed("cannot read", -err);
        sections = splitSections(content);
        return 0;
    }

    FilePlace place;
    std::string content;
    std::vector<Section> sections; ///< in the content
};

int refuse(int errnum, const char *path, const char *why)
{
    fail(NORV_ERR_BAD_PARAMETER, "%s: %s", path ? path : "no file", why);
    return -errnum;
}

/// A section as a text.
int compose(const char *path, const char *name, const NLIBC_SZ_HASH *keys, const char *line_format, std::string &text)
{
    if (!path || !name || !keys || !line_format)
        return refuse(EINVAL, path, "no section, no keys or no format of a line");
    if (!isSectionName(name))
        return refuse(EINVAL, path, "a section cannot bear this name");
    text = "[" + std::string(name) + "]\n";
    for (const auto &[key, value] : keys->entries)
        if (!appendKeyLine(line_format, key, value, text))
            return refuse(EINVAL, path, ("the value of " + key + " cannot be written as a line").c_str());
    return 0;
}

/// The text with `part` of it replaced.
std::string with(const std::string &text, std::string_view part, std::string_view replacement)
{
    std::string changed = text;
    return changed.replace(static_cast<size_t>(part.data() - text.data()), part.size(), replacement);
}

} // namespace
} // namespace norvhost

using namespace norvhost;

int NLIBCFileTouch(const char *path)
{
    FilePlace place;
    int err = openPlace(path, place);
    if (err == -ENOENT && (err = makeOwnFolder(std::string(path, strrchr(path, '/')).c_str())) == 0)
        err = openPlace(path, place);
    if (err)
        return err;
    FileDescriptor file;
    return openOwnFile(place, O_RDWR | O_CREAT, file);
}

int NLIBCFileGetSection(const char *path, const char *section, NLIBC_SZ_HASH *keys)
{
    if (!section || !keys)
        return refuse(EINVAL, path, "no section or no hash for its keys");
    SectionFile file;
    if (int err = file.open(path, false))
        return err;
    const Section *found = file.find(section);
    if (!found)
        return 0;
    for (std::string_view rest = found->lines; !rest.empty();) {
        const std::string_view line = rest.substr(0, std::min(rest.find('\n'), rest.size() - 1) + 1);
        rest.remove_prefix(line.size());
        std::string_view key, value;
        if (readKeyLine(line, key, value))
            if (int err = NLIBCSzHashSetValue(keys, std::string(key).c_str(), std::string(value).c_str()))
                return err;
    }
    return 1;
}

int NLIBCFileAddSection(const char *path, const char *section, const NLIBC_SZ_HASH *keys, const char *line_format)
{
    std::string added;
    if (int err = compose(path, section, keys, line_format, added))
        return err;
    SectionFile file;
    if (int err = file.open(path, true))
        return err;
    if (file.find(section))
        return refuse(EEXIST, path, "the section exists");
    std::string text = file.text();
    if (!text.empty() && text.back() != '\n')
        text += '\n';
    const int err = file.replace(text + added);
    return err ? err : 1;
}

int NLIBCFileSetSection(const char *path, const char *section, const char *new_name, const NLIBC_SZ_HASH *keys,
                        const char *line_format)
{
    std::string replacement;
    if (int err = compose(path, new_name, keys, line_format, replacement))
        return err;
    if (!section)
        return refuse(EINVAL, path, "no section");
    SectionFile file;
    if (int err = file.open(path, true))
        return err;
    const Section *found = file.find(section);
    if (!found)
        return refuse(ENOENT, path, "there is no such section");
    if (found->name != new_name && file.find(new_name))
        return refuse(EEXIST, path, "the new name is another section's");
    const int err = file.replace(with(file.text(), found->whole, replacement));
    return err ? err : 1;
}

int NLIBCFileRemoveSection(const char *path, const char *section)
{
    if (!section)
        return refuse(EINVAL, path, "no section");
    SectionFile file;
    if (int err = file.open(path, true))
        return err;
    const Section *found = file.find(section);
    return found ? file.replace(with(file.text(), found->whole, "")) : 0;
}

int NLIBCFileEnumSection(const char *path, NLIBC_SZ_LIST *names)
{
    if (!names)
        return refuse(EINVAL, path, "no list for the names of sections");
    SectionFile file;
    if (int err = file.open(path, false))
        return err;
    for (const Section &section : file.all()) {
        const int count = NLIBCSzListPush(names, std::string(section.name).c_str());
        if (count < 0)
            return count;
    }
    return static_cast<int>(file.all().size());
}

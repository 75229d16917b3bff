// Section files, hashes of texts, and file locks. Section files are the model's; locks are real ones, on files without
// a path, so that a forked child inherits them as it would others.
#include "platform/core.h"
#include "tests/fake/Script.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <unistd.h>

// The line format is the library's.
#pragma GCC diagnostic ignored "-Wformat-nonliteral"

using namespace fake;

struct NLIBC_SZ_HASH {
    std::vector<std::pair<std::string, std::string>> values;
};

namespace {

constexpr int LAST_FAILURE = 0x0900;

std::string *findValue(std::vector<std::pair<std::string, std::string>> &values, const std::string &key)
{
    for (auto &[name, value] : values) {
        if (name == key)
            return &value;
    }
    return nullptr;
}

Section *findSection(const char *path, const std::string &name)
{
    const auto file = model().section_files.find(path);
    if (file == model().section_files.end())
        return nullptr;
    for (Section &section : file->second) {
        if (section.name == name)
            return &section;
    }
    return nullptr;
}

std::string keyLines(const NLIBC_SZ_HASH &hash, const char *format)
{
    std::string lines;
    for (const auto &[key, value] : hash.values) {
        char line[1200];
        snprintf(line, sizeof(line), format, key.c_str(), value.c_str());
        lines += line;
    }
    return lines;
}

/// Whether the section can be written and read back: no text of it may end its line.
bool isWritable(const std::string &section, const NLIBC_SZ_HASH &hash)
{
    const auto breaks = [](const std::string &text) { return text.find_first_of("\r\n") != std::string::npos; };
    return !section.empty() && !breaks(section) &&
           std::none_of(hash.values.begin(), hash.values.end(),
                        [&](const auto &entry) { return breaks(entry.first) || breaks(entry.second); });
}

struct LockFiles {
    std::map<std::string, int> files; ///< by path: a descriptor to open the file by
    std::set<int> taken;
};

LockFiles &lockFiles()
{
    static LockFiles files;
    return files;
}

/// A lock of the file, or -1.
int takeLock(const std::string &path)
{
    const auto [file, is_new] = lockFiles().files.try_emplace(path, -1);
    if (is_new)
        file->second = memfd_create("lock", MFD_CLOEXEC);
    const int fd = open(("/proc/self/fd/" + std::to_string(file->second)).c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0 || flock(fd, LOCK_EX | LOCK_NB) == 0)
        return fd;
    close(fd);
    return -1;
}

int lockFile(const char *path, int *fd)
{
    const int lock = takeLock(path);
    if (lock < 0)
        return 0;
    lockFiles().taken.insert(lock);
    *fd = lock;
    return 1;
}

} // namespace

std::vector<std::string> fake::lockedFiles()
{
    std::vector<std::string> locked;
    for (const auto &[path, file] : lockFiles().files) {
        const int fd = takeLock(path);
        if (fd < 0)
            locked.push_back(path);
        else
            close(fd);
    }
    return locked;
}

void fake::forgetLocks()
{
    for (const auto &[path, file] : lockFiles().files)
        close(file);
    for (int fd : lockFiles().taken)
        close(fd);
    lockFiles() = LockFiles();
}

int NLIBCErrGet()
{
    return LAST_FAILURE; // not noted: it is about the call before
}

int NORVFSMkdirP(const char *path, int flags, int parents, int uid, int gid, int mode)
{
    return called(__func__, path, flags, parents, uid, gid, mode).value_or(0);
}

int NLIBCFileTouch(const char *path)
{
    NOTE_CALL(path);
    model().section_files[path];
    return 0;
}

NLIBC_SZ_HASH *NLIBCSzHashAlloc(int capacity)
{
    return called(__func__, capacity) ? nullptr : noted(new NLIBC_SZ_HASH);
}

void NLIBCSzHashFree(NLIBC_SZ_HASH *hash)
{
    noteFreed(hash);
    delete hash;
}

int NLIBCSzHashSetValue(NLIBC_SZ_HASH *hash, const char *key, const char *value)
{
    NOTE_CALL(key, value);
    if (std::string *known = findValue(hash->values, key))
        *known = value;
    else
        hash->values.emplace_back(key, value);
    return 0;
}

const char *NLIBCSzHashGetValue(const NLIBC_SZ_HASH *hash, const char *key)
{
    if (called(__func__, key))
        return nullptr;
    const std::string *value = findValue(const_cast<NLIBC_SZ_HASH *>(hash)->values, key);
    return value ? value->c_str() : nullptr;
}

int NLIBCFileGetSection(const char *path, const char *section, NLIBC_SZ_HASH *keys)
{
    NOTE_CALL(path, section);
    if (model().section_files.count(path) == 0)
        return -1;
    const Section *known = findSection(path, section);
    if (!known)
        return 0;
    keys->values = known->keys;
    return 1;
}

int NLIBCFileAddSection(const char *path, const char *section, const NLIBC_SZ_HASH *keys, const char *line_format)
{
    NOTE_CALL(path, section, keyLines(*keys, line_format));
    if (model().section_files.count(path) == 0 || findSection(path, section) || !isWritable(section, *keys))
        return 0;
    model().section_files[path].push_back({section, keys->values});
    return 1;
}

int NLIBCFileSetSection(const char *path, const char *section, const char *new_name, const NLIBC_SZ_HASH *keys,
                        const char *line_format)
{
    NOTE_CALL(path, section, new_name, keyLines(*keys, line_format));
    Section *known = findSection(path, section);
    const bool is_taken = strcmp(section, new_name) != 0 && findSection(path, new_name);
    if (!known || is_taken || !isWritable(new_name, *keys))
        return 0;
    *known = {new_name, keys->values};
    return 1;
}

int NLIBCFileRemoveSection(const char *path, const char *section)
{
    NOTE_CALL(path, section);
    auto &sections = model().section_files[path];
    sections.erase(
        std::remove_if(sections.begin(), sections.end(), [&](const Section &known) { return known.name == section; }),
        sections.end());
    return 0;
}

int NLIBCFileEnumSection(const char *path, NLIBC_SZ_LIST *names)
{
    NOTE_CALL(path);
    for (const Section &section : model().section_files[path])
        pushText(*names, section.name);
    return names->count;
}

int NLIBCFileLockByFile(const char *path, int exclusive, int *fd)
{
    NOTE_CALL(path, exclusive);
    return lockFile(path, fd);
}

int NLIBCFileLockTimeByFile(const char *path, int exclusive, int seconds, int *fd)
{
    NOTE_CALL(path, exclusive, seconds);
    return answerOf(__func__, 1) == 1 ? lockFile(path, fd) : 0;
}

int NLIBCFileUnlockByFile(int fd)
{
    if (auto failure = called(__func__))
        return *failure;
    if (lockFiles().taken.erase(fd) == 0 || flock(fd, LOCK_UN) != 0)
        return 0;
    return close(fd) == 0 ? 1 : 0;
}

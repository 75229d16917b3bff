/// How the fake's functions take part in the journal and the script.
#pragma once

#include "platform/core.h"
#include "platform/error.h"
#include "tests/fake/Fake.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <sstream>
#include <string>

namespace fake {

/// Notes a call; the value that the script wants it to fail with, if any.
std::optional<long> noteCall(const char *name, const std::string &arguments);

/// What the call just noted answers: the script's value for it, else `otherwise`.
long answerOf(const char *name, long otherwise);

inline std::string joined()
{
    return {};
}

template <class First, class... Rest>
std::string joined(const First &first, const Rest &...rest)
{
    std::ostringstream text;
    text << first;
    ((text << ", " << rest), ...);
    return text.str();
}

/// The first thing that every function of the platform does:
///
///     if (auto failure = called(__func__, uuid))
///         return *failure;
template <class... Arguments>
std::optional<int> called(const char *name, const Arguments &...arguments)
{
    if (auto failure = noteCall(name, joined(arguments...)))
        return static_cast<int>(*failure);
    return std::nullopt;
}

/// Copies a text into a character field that is known to hold it.
template <size_t size>
void put(char (&field)[size], const std::string &text)
{
    text.copy(field, size - 1);
    field[std::min(size - 1, text.size())] = '\0';
}

template <size_t size>
std::string textOf(const char (&field)[size])
{
    return std::string(field, strnlen(field, size));
}

/// Whether a text can name an object: 1 to `longest` bytes, none of them a control character or "/".
bool isName(const std::string &text, size_t longest);

/// Answers with a record, or `missing` for null. Callers zero theirs first: what an appliance leaves
/// out of it must not be an earlier object's.
template <class Record>
int copyRecord(const Record *record, Record *out, int missing)
{
    static const Record zero{};
    if (memcmp(out, &zero, sizeof(zero)) != 0)
        return NORV_ERR_BAD_PARAMETER;
    if (!record)
        return missing;
    *out = *record;
    return 0;
}

/// A UUID that no other object has.
void makeUUID(char (&uuid)[37]);

LUN *findLUN(const char *uuid);
/// What NORViSCSILunCreate does, with its codes.
int createLUN(_tag_iscsi_lun_ &lun);

/// Whether a path exists in the model only.
inline bool isPlatforms(const std::string &path)
{
    return path.rfind("/usr/norv/", 0) == 0;
}

/// What NLIBCSzListPush does.
int pushText(NLIBC_SZ_LIST &list, const std::string &text);

/// A record of a listing, from the C allocator, that counts as unfreed until noteFreed() sees it.
void noteListed(const void *memory);
int unfreedRecords();
int unfreedLists();
int unfreedHashes();
int unfreedHandles();

/// Closes every lock file.
void forgetLocks();

} // namespace fake

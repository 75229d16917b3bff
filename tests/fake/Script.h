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

/// Notes a call with its key arguments; the code that the script wants it to fail with, if any.
template <class... Arguments>
std::optional<int> called(const char *name, const Arguments &...arguments)
{
    if (auto failure = noteCall(name, joined(arguments...)))
        return static_cast<int>(*failure);
    return std::nullopt;
}

/// The same of a function about one object, whose absence is an answer too.
template <class Object, class... Arguments>
std::optional<int> calledOn(const Object *object, const char *name, const Arguments &...arguments)
{
    if (auto failure = called(name, arguments...))
        return failure;
    return object ? std::nullopt : std::optional<int>(Object::MISSING);
}

/// The first thing that a function of the platform does: it notes its call, and returns at once if it is to fail.
#define NOTE_CALL(...)                                                                                                 \
    if (auto failure = fake::called(__func__, __VA_ARGS__))                                                            \
    return *failure

/// The same of a function about one object, which also returns when there is none.
#define NOTE_CALL_ON(object, ...)                                                                                      \
    if (auto failure = fake::calledOn(object, __func__, __VA_ARGS__))                                                  \
    return *failure

/// The value of a key, null when there is none.
template <class Map>
auto *valueOf(Map &map, const typename Map::key_type &key)
{
    const auto found = map.find(key);
    return found == map.end() ? nullptr : &found->second;
}

/// The first value whose record passes the test, null when none does.
template <class Map, class Test>
auto *firstOf(Map &map, Test test)
{
    const auto found = std::find_if(map.begin(), map.end(), [&](auto &entry) { return test(entry.second.record); });
    return found == map.end() ? nullptr : &found->second;
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

/// Answers with a record. Callers zero theirs first: what an appliance leaves out of it must not be an earlier
/// object's.
template <class Record>
int copyRecord(const Record &record, Record *out)
{
    const auto *const bytes = reinterpret_cast<const char *>(out);
    if (std::any_of(bytes, bytes + sizeof(Record), [](char byte) { return byte != 0; }))
        return NORV_ERR_BAD_PARAMETER;
    *out = record;
    return 0;
}

/// A function that answers with an object's record.
template <class Object, class Record, class... Arguments>
int answerRecord(const Object *object, Record *out, const char *name, const Arguments &...arguments)
{
    if (auto failure = calledOn(object, name, arguments...))
        return *failure;
    return copyRecord(object->record, out);
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

/// Appends to a list of texts while it has room.
void pushText(NLIBC_SZ_LIST &list, const std::string &text);

/// Something that the caller is to free: it counts as unfreed until noteFreed() sees it.
void noteAllocated(const void *memory);

template <class Thing>
Thing *noted(Thing *thing)
{
    noteAllocated(thing);
    return thing;
}

/// Closes every lock file.
void forgetLocks();

} // namespace fake

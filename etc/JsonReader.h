/// Strict reading of JSON objects: a value of the wrong type, out of range, or with a NUL inside a
/// text is bad input, never a conversion and never an exception.
#pragma once

#include <json/value.h>

#include <set>
#include <string>

namespace ISCSI {

/// Reads members of one object. An output is assigned only when its member is good, so a caller
/// reads into a copy and takes it when ok().
class JsonReader {
public:
    /// A value that is not an object has no members, and is not ok.
    explicit JsonReader(const Json::Value &object) : object(object), good(object.isObject()) {}

    template <class Value>
    JsonReader &required(const char *key, Value &out)
    {
        good = has(key) && read(object[key], out) && good;
        return *this;
    }

    template <class Value>
    JsonReader &optional(const char *key, Value &out)
    {
        if (has(key))
            good = read(object[key], out) && good;
        return *this;
    }

    /// Adds the texts of an array to a set; a member that is absent or no array adds none.
    JsonReader &addTexts(const char *key, std::set<std::string> &out);

    bool ok() const { return good; }

private:
    bool has(const char *key) const { return object.isObject() && object.isMember(key); }

    static bool read(const Json::Value &value, int &out);
    static bool read(const Json::Value &value, long &out); ///< in the range of int, whatever the ABI
    static bool read(const Json::Value &value, unsigned int &out);
    static bool read(const Json::Value &value, unsigned long long &out);
    static bool read(const Json::Value &value, bool &out);
    static bool read(const Json::Value &value, std::string &out);

    const Json::Value &object;
    bool good;
};

} // namespace ISCSI

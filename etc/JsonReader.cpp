#include "etc/JsonReader.h"

namespace ISCSI {

JsonReader &JsonReader::addTexts(const char *key, std::set<std::string> &out)
{
    if (!has(key) || !object[key].isArray())
        return *this;
    for (const auto &element : object[key]) {
        std::string text;
        if (read(element, text))
            out.insert(std::move(text));
        else
            good = false;
    }
    return *this;
}

bool JsonReader::read(const Json::Value &value, int &out)
{
    if (!value.isInt())
        return false;
    out = value.asInt();
    return true;
}

bool JsonReader::read(const Json::Value &value, long &out)
{
    if (!value.isInt())
        return false;
    out = value.asInt();
    return true;
}

bool JsonReader::read(const Json::Value &value, unsigned int &out)
{
    if (!value.isUInt())
        return false;
    out = value.asUInt();
    return true;
}

bool JsonReader::read(const Json::Value &value, unsigned long long &out)
{
    if (!value.isUInt64())
        return false;
    out = value.asUInt64();
    return true;
}

bool JsonReader::read(const Json::Value &value, bool &out)
{
    if (!value.isBool())
        return false;
    out = value.asBool();
    return true;
}

bool JsonReader::read(const Json::Value &value, std::string &out)
{
    if (!value.isString())
        return false;
    std::string text = value.asString();
    if (text.find('\0') != std::string::npos)
        return false;
    out = std::move(text);
    return true;
}

} // namespace ISCSI

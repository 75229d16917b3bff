/// JSON as text, to and from strangers.
#pragma once

#include <json/value.h>

#include <string>

namespace webapi {

/// On one line, without a line end.
std::string jsonText(const Json::Value &value);

/// Strict reading: nothing but one object or array, nested at most 16 deep, no member twice. False, with `value`
/// unspecified, for anything else. Throws nothing.
bool parseJson(const std::string &text, Json::Value &value);

} // namespace webapi

/// Values of answers as people read them.
#pragma once

#include <json/value.h>

#include <string>

namespace cli {

std::string sizeText(const Json::Value &bytes);      ///< "1.5G", or "unknown" for null
std::string exactSizeText(const Json::Value &bytes); ///< with the bytes too
std::string yesNo(const Json::Value &value);
std::string timeText(const Json::Value &seconds); ///< local time, "never" for 0

} // namespace cli

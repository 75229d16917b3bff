#include "cli/Values.h"

#include "cli/Size.h"

#include <ctime>

namespace cli {

std::string sizeText(const Json::Value &bytes)
{
    return bytes.isNull() ? "unknown" : shownSize(bytes.asUInt64());
}

std::string exactSizeText(const Json::Value &bytes)
{
    return bytes.isNull() ? "unknown" : sizeText(bytes) + " (" + bytes.asString() + " bytes)";
}

std::string yesNo(const Json::Value &value)
{
    return value.asBool() ? "yes" : "no";
}

std::string timeText(const Json::Value &seconds)
{
    const auto time = static_cast<time_t>(seconds.asInt64());
    tm local{};
    char text[64];
    if (time == 0 || !localtime_r(&time, &local))
        return "never";
    return std::string(text, strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S %Z", &local));
}

} // namespace cli

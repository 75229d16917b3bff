#include "webapi/handlers/JsonText.h"

#include <json/reader.h>
#include <json/writer.h>

#include <memory>

namespace webapi {

std::string jsonText(const Json::Value &value)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, value);
}

bool parseJson(const std::string &text, Json::Value &value)
{
    constexpr int MAX_DEPTH = 16;
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["stackLimit"] = MAX_DEPTH; // above it the reader throws
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    try {
        return reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
    } catch (const Json::Exception &) {
        return false;
    }
}

} // namespace webapi

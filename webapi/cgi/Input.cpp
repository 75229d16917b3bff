#include "webapi/cgi/Input.h"

#include "webapi/handlers/JsonText.h"
#include "webapi/handlers/Route.h"

#include <algorithm>
#include <charconv>

namespace webapi {
namespace {

constexpr size_t SHOWN = 64; ///< bytes of a name that a reason repeats

std::optional<std::string> decodeQueryText(std::string_view text)
{
    std::string spaced(text);
    std::replace(spaced.begin(), spaced.end(), '+', ' ');
    return decodePercent(spaced);
}

/// A comment between the tokens: the parser skips it in some places whatever its settings. Outside of texts JSON has no
/// slash.
bool hasComment(const std::string &json)
{
    bool in_text = false;
    for (size_t i = 0; i < json.size(); ++i) {
        if (json[i] == '"')
            in_text = !in_text;
        else if (in_text && json[i] == '\\')
            ++i;
        else if (!in_text && json[i] == '/')
            return true;
    }
    return false;
}

Json::Value typed(const Field &field, const std::string &text)
{
    if (field.type == Type::Boolean && (text == "true" || text == "false"))
        return text == "true";
    if (field.type == Type::Unsigned) {
        uint64_t number = 0;
        const char *end = text.data() + text.size();
        const auto [stop, error] = std::from_chars(text.data(), end, number);
        if (error == std::errc() && stop == end && !text.empty())
            return Json::UInt64(number);
    }
    return text;
}

} // namespace

bool readQuery(Fields fields, std::string_view query, Json::Value &input, std::string &reason)
{
    Json::Value read(Json::objectValue);
    while (!query.empty()) {
        const std::string_view pair = query.substr(0, query.find('&'));
        query.remove_prefix(std::min(pair.size() + 1, query.size()));
        if (pair.empty())
            continue;
        const size_t equals = pair.find('=');
        const auto name = decodeQueryText(pair.substr(0, equals));
        const auto value = decodeQueryText(equals == pair.npos ? "" : pair.substr(equals + 1));
        if (!name || !value) {
            reason = "the query is not percent-encoded";
            return false;
        }
        if (read.isMember(*name)) {
            reason = name->substr(0, SHOWN) + ": is given twice";
            return false;
        }
        const Field *field =
            std::find_if(fields.begin(), fields.end(), [&](const Field &f) { return f.name == *name; });
        read[*name] = field == fields.end() ? Json::Value(*value) : typed(*field, *value);
    }
    input = std::move(read);
    return true;
}

bool readBody(const std::string &body, Json::Value &input, std::string &reason)
{
    Json::Value read(Json::objectValue);
    const bool good = body.empty() || (isUtf8(body) && !hasComment(body) && parseJson(body, read) && read.isObject());
    if (!good) {
        reason = "the body must be one JSON object in UTF-8, nested at most 16 deep, without comments and without a "
                 "member twice";
        return false;
    }
    input = std::move(read);
    return true;
}

} // namespace webapi

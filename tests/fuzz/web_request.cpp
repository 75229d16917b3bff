// A request of the web API as a stranger sends it: a line "METHOD TARGET", then the body.
#include "tests/fuzz/Expect.h"
#include "webapi/cgi/Answer.h"
#include "webapi/cgi/Input.h"
#include "webapi/handlers/Route.h"

#include <algorithm>
#include <cstdint>
#include <json/reader.h>
#include <memory>
#include <string>

using namespace webapi;

namespace {

/// What the check of an input promises to handlers.
void expectAllowed(const Field &field, const Json::Value &value)
{
    switch (field.type) {
    case Type::Text:
        EXPECT_ALWAYS(value.isString());
        EXPECT_ALWAYS(value.asString().size() >= field.min && value.asString().size() <= field.max);
        EXPECT_ALWAYS(isUtf8(value.asString()) && value.asString().find('\0') == std::string::npos);
        break;
    case Type::Unsigned:
        EXPECT_ALWAYS(value.isUInt64() && value.asUInt64() >= field.min && value.asUInt64() <= field.max);
        break;
    case Type::Boolean:
        EXPECT_ALWAYS(value.isBool());
        break;
    case Type::List:
        EXPECT_ALWAYS(value.isArray() && value.size() >= field.min && value.size() <= field.max);
        for (const Json::Value &element : value)
            expectAllowed(*field.items.begin(), element);
        break;
    case Type::Object:
        EXPECT_ALWAYS(value.isObject());
        for (const Field &inner : field.items) {
            EXPECT_ALWAYS(!inner.required || value.isMember(inner.name));
            if (value.isMember(inner.name))
                expectAllowed(inner, value[inner.name]);
        }
        break;
    }
}

void readInput(Fields fields, const Json::Value &input)
{
    std::string reason;
    if (checkInput(fields, input, reason)) {
        EXPECT_ALWAYS(!reason.empty());
        return;
    }
    EXPECT_ALWAYS(input.size() <= fields.count);
    for (const Field &field : fields) {
        EXPECT_ALWAYS(!field.required || input.isMember(field.name));
        if (input.isMember(field.name))
            expectAllowed(field, input[field.name]);
    }
}

/// Header lines of ours only, and a body that is JSON.
void readAnswer(const std::string &text)
{
    const size_t end = text.find("\r\n\r\n");
    EXPECT_ALWAYS(end != std::string::npos);
    const std::string headers = text.substr(0, end);
    EXPECT_ALWAYS(std::count(headers.begin(), headers.end(), '\n') <= 5);
    EXPECT_ALWAYS(std::all_of(headers.begin(), headers.end(),
                              [](char c) { return (c >= ' ' && c < 0x7F) || c == '\r' || c == '\n'; }));
    Json::Value body;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    EXPECT_ALWAYS(reader->parse(text.data() + end + 4, text.data() + text.size(), &body, nullptr));
    EXPECT_ALWAYS(body["status"].asInt() >= 400);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    const std::string text(reinterpret_cast<const char *>(data), size);
    const size_t space = std::min(text.find(' '), text.size());
    const size_t line_end = std::min(text.find('\n', space), text.size());
    HttpRequest request;
    request.method = text.substr(0, space);
    if (space < line_end)
        request.target = text.substr(space + 1, line_end - space - 1);
    if (line_end < text.size())
        request.body = text.substr(line_end + 1);
    request.content_type = "application/json";

    const size_t query = std::min(request.target.find('?'), request.target.size());
    for (Method method : {Method::Get, Method::Post, Method::Put, Method::Patch, Method::Delete}) {
        constexpr size_t ROOT_LENGTH = 7; // "/api/v1"
        const size_t path_begin = std::min(ROOT_LENGTH, query);
        const Found found = findRoute(method, request.target.substr(path_begin, query - path_begin));
        if (!found.route)
            continue;
        Json::Value input;
        std::string reason;
        if (readQuery(found.route->fields,
                      std::string_view(request.target).substr(std::min(query + 1, request.target.size())), input,
                      reason))
            readInput(found.route->fields, input);
        if (readBody(request.body, input, reason))
            readInput(found.route->fields, input);
        // These two answer strangers, from the appliance's state.
        if (found.route->role == Role::Anyone)
            return 0;
    }
    readAnswer(cgiText(answer(request)));
    return 0;
}

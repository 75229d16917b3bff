#include "webapi/openapi/OpenApi.h"

#include "webapi/handlers/Handlers.h"
#include "webapi/handlers/Route.h"

#include <json/reader.h>

#include <functional>
#include <memory>
#include <set>
#include <sstream>

namespace webapi {
namespace {

constexpr char TEXTS[] =
#include "texts.inc"
    ;

Json::Value texts()
{
    Json::Value value;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    reader->parse(TEXTS, TEXTS + sizeof(TEXTS) - 1, &value, nullptr);
    return value;
}

std::string lowerCase(std::string text)
{
    for (char &c : text)
        c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return text;
}

std::string routeName(const Route &route)
{
    return std::string(methodName(route.method)) + " " + route.path;
}

bool hasBody(const Route &route)
{
    return route.method != Method::Get && route.method != Method::Delete;
}

/// The names in the path's braces.
std::vector<std::string> parameters(const std::string &path)
{
    std::vector<std::string> names;
    for (size_t at = path.find('{'); at != path.npos; at = path.find('{', at + 1))
        names.push_back(path.substr(at + 1, path.find('}', at) - at - 1));
    return names;
}

/// Names a program that is made from the description can give the call: "get_luns_lun".
std::string operationId(const Route &route)
{
    std::string id = lowerCase(methodName(route.method));
    std::istringstream segments(route.path);
    for (std::string segment; std::getline(segments, segment, '/');) {
        std::string word;
        for (char c : segment) {
            if (c != '{' && c != '}')
                word += std::isalnum(static_cast<unsigned char>(c)) ? c : '_';
        }
        id += word.empty() ? "" : "_" + word;
    }
    return id;
}

Json::Value reference(const std::string &schema)
{
    Json::Value value;
    value["$ref"] = "#/components/schemas/" + schema;
    return value;
}

Json::Value objectSchema(Fields fields, const Json::Value &descriptions);

Json::Value schemaOf(const Field &field, const Json::Value &descriptions)
{
    Json::Value schema;
    switch (field.type) {
    case Type::Text:
        schema["type"] = "string";
        schema["minLength"] = Json::UInt64(field.min);
        schema["maxLength"] = Json::UInt64(field.max);
        break;
    case Type::Unsigned:
        schema["type"] = "integer";
        schema["format"] = "int64";
        schema["minimum"] = Json::UInt64(field.min);
        schema["maximum"] = Json::UInt64(field.max);
        break;
    case Type::Boolean:
        schema["type"] = "boolean";
        break;
    case Type::List:
        schema["type"] = "array";
        schema["minItems"] = Json::UInt64(field.min);
        schema["maxItems"] = Json::UInt64(field.max);
        schema["items"] = schemaOf(*field.items.begin(), descriptions);
        break;
    case Type::Object:
        schema = objectSchema(field.items, descriptions);
        break;
    }
    if (field.choices) {
        std::istringstream words(field.choices);
        for (std::string word; std::getline(words, word, '|');)
            schema["enum"].append(word);
    }
    if (*field.name)
        schema["description"] = descriptions[field.name];
    return schema;
}

Json::Value objectSchema(Fields fields, const Json::Value &descriptions)
{
    Json::Value schema;
    schema["type"] = "object";
    schema["additionalProperties"] = false;
    for (const Field &field : fields) {
        schema["properties"][field.name] = schemaOf(field, descriptions);
        if (field.required)
            schema["required"].append(field.name);
    }
    return schema;
}

Json::Value parameter(const char *place, const std::string &name, bool required, Json::Value schema)
{
    Json::Value value;
    value["in"] = place;
    value["name"] = name;
    value["required"] = required;
    value["description"] = schema["description"];
    schema.removeMember("description");
    value["schema"] = std::move(schema);
    return value;
}

Json::Value response(const std::string &type, const Json::Value &schema, const std::string &description)
{
    Json::Value value;
    value["description"] = description;
    value["content"][type]["schema"] = schema;
    return value;
}

Json::Value responses(const std::string &answer)
{
    Json::Value value;
    value["default"] = response("application/problem+json", reference("Problem"), "What went wrong");
    if (answer.empty()) {
        value["204"]["description"] = "Done";
        return value;
    }
    const bool list = answer.front() == '[';
    Json::Value schema = reference(list ? answer.substr(1, answer.size() - 2) : answer);
    if (list) {
        Json::Value items = std::move(schema);
        schema = Json::objectValue;
        schema["type"] = "array";
        schema["items"] = std::move(items);
    }
    value["200"] = response("application/json", schema, "Done");
    return value;
}

const char *roleName(Role role)
{
    return role == Role::Admin ? "admin" : role == Role::Viewer ? "viewer" : "anyone";
}

Json::Value operation(const Route &route, const Json::Value &texts)
{
    const Json::Value &text = texts["routes"][routeName(route)];
    const Json::Value &descriptions = texts["fields"];
    Json::Value value;
    value["operationId"] = operationId(route);
    value["summary"] = text[0];
    value["tags"].append(std::string(route.path).substr(1, std::string(route.path).find('/', 1) - 1));
    value["x-role"] = roleName(route.role);
    if (route.role == Role::Anyone)
        value["security"] = Json::arrayValue;
    for (const std::string &name : parameters(route.path)) {
        Json::Value schema;
        schema["type"] = "string";
        schema["description"] = texts["parameters"][name];
        value["parameters"].append(parameter("path", name, true, schema));
    }
    if (hasBody(route) && route.fields.count > 0) {
        bool required = false;
        for (const Field &field : route.fields)
            required = required || field.required;
        value["requestBody"]["required"] = required;
        value["requestBody"]["content"]["application/json"]["schema"] = objectSchema(route.fields, descriptions);
    } else {
        for (const Field &field : route.fields)
            value["parameters"].append(parameter("query", field.name, field.required, schemaOf(field, descriptions)));
    }
    value["responses"] = responses(text[1].asString());
    return value;
}

/// Calls `see` for every field of every route, those inside of others too.
void eachField(Fields fields, const std::function<void(const Field &)> &see)
{
    for (const Field &field : fields) {
        see(field);
        eachField(field.items, see);
    }
}

} // namespace

Json::Value openApi()
{
    const Json::Value said = texts();
    Json::Value document;
    document["openapi"] = "3.0.3";
    document["info"] = said["info"];
    document["info"]["version"] = ISCSIWEBAPI_VERSION;
    document["servers"][0]["url"] = "/api/v1";
    document["components"]["schemas"] = said["schemas"];
    document["components"]["securitySchemes"]["session"]["type"] = "http";
    document["components"]["securitySchemes"]["session"]["scheme"] = "bearer";
    document["security"][0]["session"] = Json::arrayValue;
    for (const Route &route : routes())
        document["paths"][route.path][lowerCase(methodName(route.method))] = operation(route, said);
    return document;
}

std::vector<std::string> openApiProblems()
{
    const Json::Value said = texts();
    std::set<std::string> unused;
    for (const char *kind : {"routes", "parameters", "fields"}) {
        for (const std::string &name : said[kind].getMemberNames())
            unused.insert(std::string(kind) + ": " + name);
    }
    std::vector<std::string> problems;
    const auto needs = [&](const std::string &kind, const std::string &name) {
        unused.erase(kind + ": " + name);
        if (!said[kind].isMember(name))
            problems.push_back("texts.json lacks in " + kind + ": " + name);
    };
    for (const Route &route : routes()) {
        needs("routes", routeName(route));
        for (const std::string &name : parameters(route.path))
            needs("parameters", name);
        eachField(route.fields, [&](const Field &field) {
            if (*field.name)
                needs("fields", field.name);
        });
        std::string answer = said["routes"][routeName(route)][1].asString();
        if (!answer.empty() && answer.front() == '[')
            answer = answer.substr(1, answer.size() - 2);
        if (!answer.empty() && !said["schemas"].isMember(answer))
            problems.push_back(routeName(route) + " answers with the unknown form " + answer);
    }
    for (const std::string &name : unused)
        problems.push_back("texts.json describes what is not there, in " + name);
    return problems;
}

Result showOpenApi(const Request &)
{
    return {0, "", openApi()};
}

} // namespace webapi

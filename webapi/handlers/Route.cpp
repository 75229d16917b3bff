#include "webapi/handlers/Route.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <algorithm>
#include <cctype>
#include <iterator>
#include <new>

namespace webapi {
namespace {

int hexDigit(char c)
{
    if (c >= '0' && c <= '9')
        return c - '0';
    const int lower = std::tolower(static_cast<unsigned char>(c));
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

std::vector<std::string> split(const std::string &path)
{
    std::vector<std::string> segments(1);
    for (char c : path) {
        if (c == '/')
            segments.emplace_back();
        else
            segments.back() += c;
    }
    return segments;
}

/// Whether the path fits the pattern; fills the parameters if so.
bool match(const std::string &pattern, const std::vector<std::string> &path, std::map<std::string, std::string> &values)
{
    const std::vector<std::string> wanted = split(pattern);
    if (wanted.size() != path.size())
        return false;
    values.clear();
    for (size_t i = 0; i < wanted.size(); ++i) {
        if (wanted[i].empty() || wanted[i].front() != '{') {
            if (wanted[i] != path[i])
                return false;
            continue;
        }
        const auto value = decodePercent(path[i]);
        if (!value)
            return false;
        values[wanted[i].substr(1, wanted[i].size() - 2)] = *value;
    }
    return true;
}

} // namespace

const char *methodName(Method method)
{
    return std::find_if(std::begin(METHODS), std::end(METHODS),
                        [&](const MethodName &entry) { return entry.method == method; })
        ->name;
}

Found findRoute(Method method, const std::string &path)
{
    const std::vector<std::string> segments = split(path);
    Found found;
    for (const Route &route : routes()) {
        if (!match(route.path, segments, found.path))
            continue;
        if (route.method == method) {
            found.route = &route;
            break;
        }
        found.methods.push_back(route.method);
    }
    return found;
}

Result runRoute(const Route &route, const Request &request)
{
    try {
        Result refused;
        refused.code = checkInput(route.fields, request.input, refused.reason);
        return refused.code ? refused : route.handler(request);
    } catch (const std::bad_alloc &) {
        return {ISCSI::ERR_OUT_OF_MEMORY, "", {}};
    } catch (const std::exception &e) {
        return {ISCSI::ERR_DEFAULT_ERROR_CODE, e.what(), {}};
    }
}

Result dispatch(Method method, const std::string &path, const Json::Value &input, const std::string &account)
{
    const Found found = findRoute(method, path);
    if (!found.route)
        return {ISCSI::ERR_NO_SUCH_API, path, {}};
    return runRoute(*found.route, {found.path, input, account});
}

std::string pathSegment(const std::string &text)
{
    static const char digits[] = "0123456789ABCDEF";
    std::string segment;
    for (char c : text) {
        const auto byte = static_cast<unsigned char>(c);
        if (std::isalnum(byte) || c == '-' || c == '.' || c == '_' || c == '~') {
            segment += c;
        } else {
            segment += '%';
            segment += digits[byte >> 4];
            segment += digits[byte & 15];
        }
    }
    return segment;
}

std::optional<std::string> decodePercent(std::string_view encoded)
{
    std::string text;
    for (size_t i = 0; i < encoded.size(); ++i) {
        if (encoded[i] != '%') {
            text += encoded[i];
            continue;
        }
        const int high = i + 2 < encoded.size() ? hexDigit(encoded[i + 1]) : -1;
        const int low = high >= 0 ? hexDigit(encoded[i + 2]) : -1;
        if (low < 0 || (high == 0 && low == 0))
            return std::nullopt;
        text += static_cast<char>(high * 16 + low);
        i += 2;
    }
    return text;
}

} // namespace webapi

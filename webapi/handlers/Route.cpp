#include "webapi/handlers/Route.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <cctype>
#include <new>
#include <optional>

namespace webapi {
namespace {

int hexDigit(char c)
{
    if (c >= '0' && c <= '9')
        return c - '0';
    const int lower = std::tolower(static_cast<unsigned char>(c));
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

/// Undoes the percent-encoding; nothing for a broken one or an encoded NUL.
std::optional<std::string> decodeSegment(const std::string &segment)
{
    std::string text;
    for (size_t i = 0; i < segment.size(); ++i) {
        if (segment[i] != '%') {
            text += segment[i];
            continue;
        }
        const int high = i + 2 < segment.size() ? hexDigit(segment[i + 1]) : -1;
        const int low = high >= 0 ? hexDigit(segment[i + 2]) : -1;
        if (low < 0 || (high == 0 && low == 0))
            return std::nullopt;
        text += static_cast<char>(high * 16 + low);
        i += 2;
    }
    return text;
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

/// Whether the path fits the pattern; fills the parameters.
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
        const auto value = decodeSegment(path[i]);
        if (!value)
            return false;
        values[wanted[i].substr(1, wanted[i].size() - 2)] = *value;
    }
    return true;
}

} // namespace

Result dispatch(Method method, const std::string &path, const Json::Value &input, const std::string &account)
{
    try {
        const std::vector<std::string> segments = split(path);
        Request request;
        request.account = account;
        for (const Route &route : routes()) {
            if (route.method != method || !match(route.path, segments, request.path))
                continue;
            Result refused;
            refused.code = checkInput(route.fields, input, refused.reason);
            if (refused.code)
                return refused;
            request.input = input;
            return route.handler(request);
        }
        return {ISCSI::ERR_NO_SUCH_API, path, {}};
    } catch (const std::bad_alloc &) {
        return {ISCSI::ERR_OUT_OF_MEMORY, "", {}};
    } catch (const std::exception &e) {
        return {ISCSI::ERR_DEFAULT_ERROR_CODE, e.what(), {}};
    }
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

} // namespace webapi
